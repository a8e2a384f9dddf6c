// Thermal core: the thermal thread's start-up in its fixed order, boot-mode detection, the booting
// period, the polling cycle, and the thermal on/off switch.
#include "vorn_core.h"

#include "bldcfg.h"
#include "qor_log.h"
#include "sysroot.h"
#include "timescale.h"
#include "tollmgr.h"
#include "vorn_dbus.h"
#include "vorn_device.h"
#include "vorn_setstore.h"
#include "vorn_util.h"

#include <Ecore.h>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <glib-object.h>
#include <pthread.h>
#include <unistd.h>

namespace {

constexpr char CMDLINE_PATH[] = "/proc/cmdline";

Ecore_Timer *polling_timer;
Ecore_Timer *booting_timer;
// Termination signal that ended the loop (Ecore catches them for the whole process), 0 if none.
int exit_signal;

// Ecore periods run scaled by VORN_TIME_SCALE; every logged value stays nominal.
double scaled(int seconds)
{
	return seconds * qor_time_scale();
}

Eina_Bool polling_tick(void *data)
{
	return vorn_thermal_monitor_cb(data) ? ECORE_CALLBACK_RENEW : ECORE_CALLBACK_CANCEL;
}

Eina_Bool vorn_booting_timer_cb(void *)
{
	VORN_KMSG_LOG("booting_timer expired!\n");
	booting_timer = nullptr;
	vorn_adjust_threshold(-vorn_get_info()->booting_offset);
	vorn_thermal_monitor_cb(nullptr);
	// The next regular tick comes a full period after this one.
	if (polling_timer)
		ecore_timer_reset(polling_timer);
	return ECORE_CALLBACK_CANCEL;
}

Eina_Bool on_exit_signal(void *, int type, void *event)
{
	if (type == ECORE_EVENT_SIGNAL_EXIT) {
		const auto *e = static_cast<const Ecore_Event_Signal_Exit *>(event);
		exit_signal = e->terminate ? SIGTERM : e->quit ? SIGQUIT : SIGINT;
	} else if (type == ECORE_EVENT_SIGNAL_USER) {
		exit_signal = static_cast<const Ecore_Event_Signal_User *>(event)->number == 2 ? SIGUSR2 : SIGUSR1;
	} else if (type == ECORE_EVENT_SIGNAL_HUP) {
		exit_signal = SIGHUP;
	} else {
		exit_signal = SIGPWR;
	}
	ecore_main_loop_quit();
	return ECORE_CALLBACK_DONE;
}

} // namespace

void vorn_thermal_stop(void)
{
	if (booting_timer)
		ecore_timer_del(booting_timer);
	booting_timer = nullptr;
	if (polling_timer)
		ecore_timer_del(polling_timer);
	polling_timer = nullptr;
	vorn_logger_stop();
}

void *vorn_main(void *)
{
	vorn_info_t *info = vorn_get_info();
	VORN_KMSG_LOG("+++ VORN START +++\n");
	// Ecore must not open bus connections of its own.
	ecore_app_no_system_modules();
	ecore_init();
	// main blocks the signals Ecore catches in every other thread: they are taken here only.
	sigset_t none;
	sigemptyset(&none);
	pthread_sigmask(SIG_SETMASK, &none, nullptr);

	int ret = vorn_init_device_info(info);
	if (ret != 0) {
		VORN_LOGE("Failed to init device info: %d", ret);
	} else {
		vorn_check_onoff();
		vorn_check_boot_mode(info);
		vorn_wakeup_alarm_init();
		vorn_booting_timer_init();
		if (vorn_thermal_mornitor_init() == 0) {
			// Thermal protection does not wait for the bus: without it the service runs
			// unseen and the set-up is tried again later.
			if (vorn_dbus_setup() != 0)
				vorn_dbus_setup_retry();
			vorn_setstore_init(info);
			vorn_socket_init();
			// Every signal whose default action ends the process still ends it, after the loop.
			Ecore_Event_Handler *on_exit[] = {
				ecore_event_handler_add(ECORE_EVENT_SIGNAL_EXIT, on_exit_signal, nullptr),
				ecore_event_handler_add(ECORE_EVENT_SIGNAL_HUP, on_exit_signal, nullptr),
				ecore_event_handler_add(ECORE_EVENT_SIGNAL_USER, on_exit_signal, nullptr),
				ecore_event_handler_add(ECORE_EVENT_SIGNAL_POWER, on_exit_signal, nullptr),
			};
			VORN_KMSG_LOG("+++ VORN LOOP ENTER +++\n");
			ecore_main_loop_begin();
			VORN_KMSG_LOG("--- VORN LOOP END ---\n");
			for (Ecore_Event_Handler *h : on_exit)
				if (h)
					ecore_event_handler_del(h);
			vorn_dbus_close();
		}
	}
	vorn_thermal_stop();
	ecore_shutdown();
	VORN_KMSG_LOG("--- VORN EXIT (%d) ---\n", ret);
	// The signal was meant for the process: the request threads never end by themselves.
	if (exit_signal) {
		signal(exit_signal, SIG_DFL);
		kill(getpid(), exit_signal);
	}
	return nullptr;
}

void vorn_check_boot_mode(vorn_info_t *info)
{
	int factory = bldcfg_is_factory_binary();
	if (factory)
		VORN_KMSG_LOG("factory mode\n");

	bool charging = false;
	char cmdline[VORN_CMDLINE_SIZE];
	long n = vorn_read_device_file(CMDLINE_PATH, cmdline, sizeof cmdline);
	if (n == -1) {
		VORN_KMSG_LOG("Failed to open cmdline\n");
	} else if (n < 0) {
		VORN_KMSG_LOG("Failed to read cmdline\n");
	} else {
		charging = strstr(cmdline, "charging") != nullptr;
		VORN_KMSG_LOG("%s mode\n", charging ? "Poweroff charging" : "Normal booting");
	}

	if (factory) {
		VORN_KMSG_LOG("Disable VORN (fac:%d)\n", factory);
		vorn_set_onoff(0);
	}
	if (charging && info)
		info->poweroff_charging = 1;
}

void vorn_wakeup_alarm_init(void)
{
	VORN_LOGI("+++");
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
	g_type_init();
#pragma GCC diagnostic pop
	int ret = tollmgr_init(VORN_APP_ID);
	if (ret != 0)
		VORN_LOGE("Failed to init tollmgr: %d", ret);
}

void vorn_booting_timer_init(void)
{
	if (booting_timer) // one period at a time, so its offset is removed exactly once
		return;
	VORN_KMSG_LOG("booting_timer: adjust threshold for %d sec\n", VORN_BOOTING_PERIOD);
	vorn_adjust_threshold(vorn_get_info()->booting_offset);
	booting_timer = ecore_timer_add(scaled(VORN_BOOTING_PERIOD), vorn_booting_timer_cb, nullptr);
	if (!booting_timer)
		VORN_LOGE("Err: Failed to add booting_timer timer");
}

int vorn_booting_timer_remove(void)
{
	if (!booting_timer)
		return 0;
	ecore_timer_del(booting_timer);
	booting_timer = nullptr;
	vorn_adjust_threshold(-vorn_get_info()->booting_offset);
	return 1;
}

int vorn_thermal_mornitor_init(void)
{
	vorn_thermal_monitor_cb(nullptr);
	polling_timer = ecore_timer_add(scaled(vorn_get_info()->poll_interval), polling_tick, nullptr);
	if (!polling_timer) {
		VORN_LOGE("Err: Failed to add temp polling timer");
		return -22;
	}
	return 0;
}

int vorn_thermal_monitor_cb(void *)
{
	vorn_thermal_monitor();
	vorn_print_status_log();
	return 1;
}

void vorn_thermal_monitor(void)
{
	vorn_info_t *info = vorn_get_info();
	vorn_read_sensors();
	if (info->gate_log == -1)
		vorn_gate_device_temp();
	if (!info->enabled)
		return;
	if (vorn_check_level_changed(vorn_sensor_at(0))) {
		vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedVorn", info->level);
		vorn_do_mitigation(info->mode, info->level);
	}
	vorn_check_cooldown_mode();
	vorn_check_cold_notify(vorn_sensor_at(0));
	vorn_check_limit_flash_led(vorn_sensor_at(1));
}

void vorn_check_onoff(void)
{
	vorn_info_t *info = vorn_get_info();
	int value;
	int ret = vorn_setstore_get_int(VORN_CONTROL_KEY, &value);
	if (ret != 0) {
		VORN_LOGE("Failed to read overheat control: %d", ret);
		return;
	}
	VORN_LOGI("setstore overheat control: %d", value);
	int enabled = value != 0;
	if (enabled != info->enabled) {
		VORN_KMSG_LOG("VORN onoff set:%d\n", enabled);
		info->enabled = enabled;
	}
}

void vorn_set_onoff(int flag)
{
	int ret = vorn_setstore_set_int(VORN_CONTROL_KEY, flag ? 1 : 0);
	if (ret != 0)
		VORN_LOGE("Failed to set overheat control: %d", ret);
}
