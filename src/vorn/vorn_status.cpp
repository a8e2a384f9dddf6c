// Status line and gate logging: one kernel-log status line per tick, gate lines while gate
// logging is on, the gate-log wake-up alarm and the periodic wakeup-source logger.
#include "vorn_core.h"

#include "device_info.h"
#include "qor_log.h"
#include "qor_text.h"
#include "timescale.h"
#include "tollmgr.h"
#include "vorn_util.h"

#include <Ecore.h>
#include <climits>

namespace {

constexpr char PMQOS_CPUFREQ_MAX[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max";
constexpr char CPU0_SCALING_MAX[] = "/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq";
constexpr char BATTERY_CAPACITY[] = "/sys/class/power_supply/battery/capacity";
constexpr int GATE_ALARM_TYPE = 2;
constexpr int GATE_ALARM_FIRST = 1; // seconds to the first sample

int gate_alarm_id; // 0: none armed
Ecore_Timer *logger_timer;

int sensor_temp(int index)
{
	vorn_sensor *s = vorn_sensor_at(index);
	return s ? s->temp : 0;
}

Eina_Bool vorn_logger_cb(void *)
{
	vorn_log_wakeup_sources();
	return ECORE_CALLBACK_RENEW;
}

} // namespace

void vorn_print_status_log(void)
{
	vorn_info_t *info = vorn_get_info();
	char body[VORN_STATUS_BODY_SIZE] = {};
	size_t len = 0;
	auto append = [&](auto... args) { len += qor_format(body + len, sizeof body - len, args...); };

	// Readings separated by "/", the last one followed by a blank; none with an empty table.
	for (int i = 0; vorn_sensor *s = vorn_sensor_at(i); i++)
		append("%d/", s->temp);
	if (len > 0 && body[len - 1] == '/')
		body[len - 1] = ' ';
	const vorn_limit &l = info->applied_limits;
	append("[%d %d %d %d %d %d %d ]", l.cpu_freq, l.cpu_enable, l.gpu, l.brightness, l.chg_current,
	       l.auto_screen_tone, l.dynamic_fps);
	int cpufreq_max, scaling_max, capacity;
	sys_get_int(PMQOS_CPUFREQ_MAX, &cpufreq_max);
	sys_get_int(CPU0_SCALING_MAX, &scaling_max);
	sys_get_int(BATTERY_CAPACITY, &capacity);
	if (cpufreq_max == INT_MAX) // no cap standing
		cpufreq_max = -1;
	append(" [%d/%d/%d/%d]", cpufreq_max, scaling_max, capacity, info->charging);

	VORN_KMSG_LOG_DEBUG("[%d] [%d/%d/%d/%s] %s\n", info->log_seq, info->mode, info->level, info->enabled,
			    info->cooldown_mode, body);
	info->log_seq++;
}

void vorn_gate_device_temp(void)
{
	if (vorn_get_info()->gate_log == 0)
		return;
	VORN_GATE_LOG("DEVICETEMP_%d/%d", sensor_temp(0), sensor_temp(1));
}

void vorn_gate_overheating(void)
{
	if (vorn_get_info()->gate_log == 0)
		return;
	VORN_GATE_LOG("DEVICE_OVERHEATING");
}

void vorn_gate_log_set(int seconds)
{
	vorn_info_t *info = vorn_get_info();
	if (seconds == -1)
		VORN_KMSG_LOG("[GATE] Print log when thermal monitoring\n");
	if (seconds <= 0) {
		VORN_LOGI("[GATE] Stop logging: %d", seconds);
		if (gate_alarm_id)
			tollmgr_remove_alarm(gate_alarm_id);
		gate_alarm_id = 0;
		info->gate_log = seconds;
		return;
	}
	if (seconds == info->gate_log) {
		VORN_LOGI("[GATE] alarm already set: %d", seconds);
		return;
	}
	VORN_KMSG_LOG("[GATE] Start logging every %d sec\n", seconds);
	if (gate_alarm_id)
		tollmgr_remove_alarm(gate_alarm_id);
	gate_alarm_id = 0;
	tollmgr_add_alarm_withcb(GATE_ALARM_TYPE, GATE_ALARM_FIRST, seconds, vorn_gate_log_alarm_cb, nullptr,
				 &gate_alarm_id);
	info->gate_log = seconds;
}

int vorn_gate_log_alarm_cb(int, void *)
{
	VORN_KMSG_LOG("[WAKEUP] gate log alarm expired (interval:%ds)\n", vorn_get_info()->gate_log);
	vorn_read_sensors();
	vorn_gate_device_temp();
	return 0;
}

void vorn_logger_init(void)
{
	if (logger_timer) // one logger per loop
		return;
	logger_timer = ecore_timer_add(vorn_get_info()->log_interval * qor_time_scale(), vorn_logger_cb, nullptr);
	if (!logger_timer)
		VORN_LOGE("Err: Failed to add logging timer");
}

void vorn_logger_stop(void)
{
	if (logger_timer)
		ecore_timer_del(logger_timer);
	logger_timer = nullptr;
}
