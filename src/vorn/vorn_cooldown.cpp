// Cooldown state machine ("Release", "LimitAction", "ShutDown") over the "ap" and "batt" sensors,
// the once-per-excursion warning, the held ShutDown decision, and the cold and flash-LED rules.
#include "vorn_core.h"

#include "qor_log.h"
#include "tollmgr.h"
#include "vorn_dbus.h"
#include "vorn_setstore.h"
#include "vorn_util.h"

#include <cstring>
#include <ctime>
#include <strings.h>

int vorn_shutdown_delay_alarm_id;
int vorn_emergency_alarm_id;

namespace {

constexpr char RELEASE[] = "Release";
constexpr char LIMIT_ACTION[] = "LimitAction";
constexpr char SHUTDOWN[] = "ShutDown";
constexpr char NOTI_TYPE_KEY[] = "memory/private/overheat/vorn_noti_type";
constexpr int COOLDOWN_SENSORS = 2; // "ap", then "batt"
constexpr int T_WARN = 2, T_LIMIT = 3, T_SHUTDOWN = 4;
constexpr int FLASH_LED_COLD = -4; // blocked below this
constexpr int FLASH_LED_HOT = 49;  // blocked above this

bool is_release(const char *name)
{
	return strncasecmp(name, RELEASE, sizeof RELEASE - 1) == 0;
}

bool is_shutdown(const char *name)
{
	return strncasecmp(name, SHUTDOWN, sizeof SHUTDOWN - 1) == 0;
}

int reading(const vorn_sensor *s)
{
	return s ? s->temp : 0;
}

// Seconds until the alarm's next expiry, 0 when tollmgr does not know it.
int seconds_left(int alarm_id)
{
	time_t due = 0;
	if (tollmgr_get_next_duetime(alarm_id, &due) != 0)
		return 0;
	return static_cast<int>(due - time(nullptr));
}

void remove_shutdown_delay_alarm(void)
{
	tollmgr_remove_alarm(vorn_shutdown_delay_alarm_id);
	vorn_shutdown_delay_alarm_id = 0;
}

void set_cooldown_mode(vorn_info_t *info, const char *name)
{
	vorn_dbus_broadcast_string(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedCooldownMode", name);
	memset(info->cooldown_mode, 0, sizeof info->cooldown_mode);
	strncpy(info->cooldown_mode, name, sizeof info->cooldown_mode - 1);
}

// The confirmed ShutDown decision: final for the life of the process.
void commit_shutdown(vorn_info_t *info)
{
	if (const vorn_sensor *s = info->cooldown_sensor)
		VORN_KMSG_LOG_WARN("[COOLDOWN] \"%s\" state: %s -> %s (t:%d)\n", s->name ? s->name : "", info->cooldown_mode,
				   SHUTDOWN, s->temp);
	vorn_cooldown_action(SHUTDOWN, info->log_seq);
	vorn_print_status_log();
	vorn_gate_overheating();
	vorn_setstore_set_int(NOTI_TYPE_KEY, 1);
	set_cooldown_mode(info, SHUTDOWN);
}

} // namespace

const char *vorn_get_cooldown_mode(vorn_sensor **sensor)
{
	vorn_info_t *info = vorn_get_info();
	const char *result = nullptr;
	vorn_sensor *decider = nullptr;
	int cool = 0, candidates = 0;
	for (int i = 0; i < COOLDOWN_SENSORS; i++) {
		vorn_sensor *s = vorn_sensor_at(i);
		if (!s || !s->temp_table || s->temp_table_count <= T_SHUTDOWN)
			continue;
		candidates++;
		const int t = s->temp;
		const int *T = s->temp_table;
		if (t >= T[T_SHUTDOWN]) {
			result = SHUTDOWN;
			decider = s;
			break;
		}
		if (t >= T[T_LIMIT]) {
			result = LIMIT_ACTION;
			if (!decider || decider->temp < t)
				decider = s;
		} else if (t > T[T_WARN]) {
			if (info->warning_armed && vorn_check_warning_temp(s) == 1) {
				VORN_KMSG_LOG_WARN("[COOLDOWN] state: Warning (t:%d)\n", t);
				vorn_cooldown_action("WarningAction", info->log_seq);
				info->warning_armed = 0;
			}
		} else {
			cool++;
		}
	}
	// A table without both sensors gives no decision rather than a Release nobody measured.
	if (candidates == COOLDOWN_SENSORS && cool == COOLDOWN_SENSORS) {
		result = RELEASE;
		info->warning_armed = 1;
	}
	if (!result || result == RELEASE)
		decider = nullptr;
	if (sensor)
		*sensor = decider;
	return result;
}

int vorn_check_warning_temp(vorn_sensor *sensor)
{
	if (!sensor || !sensor->temp_table || sensor->temp_table_count <= T_WARN) {
		VORN_LOGE("Invalid args");
		return 0;
	}
	return sensor->temp - sensor->prev_temp >= 1 && strcasecmp(vorn_get_info()->cooldown_mode, RELEASE) == 0 &&
	       sensor->temp >= sensor->temp_table[T_WARN];
}

int vorn_check_cooldown_mode_available(const char *name)
{
	vorn_info_t *info = vorn_get_info();
	if (!name || !info->cooldown_sensor) {
		VORN_LOGE("No cooldown mode info");
		return 1;
	}
	const int t = info->cooldown_sensor->temp;
	if (info->emergency_call == 0) {
		if (info->ecm == 0 && info->ecm_call == 0)
			return 1;
		VORN_KMSG_LOG_WARN("[COOLDOWN] ECM... ignore by [%d/%d] (%s -> %s, t:%d)\n", info->ecm, info->ecm_call,
				   info->cooldown_mode, name, t);
		return 0;
	}
	if (vorn_emergency_alarm_id > 0) {
		VORN_KMSG_LOG_WARN("[COOLDOWN] delayed for %ds (%s -> %s, t:%d)\n", seconds_left(vorn_emergency_alarm_id),
				   info->cooldown_mode, name, t);
		return 0;
	}
	VORN_KMSG_LOG_WARN("[COOLDOWN] now emergency call... ignore (%s -> %s, t:%d)\n", info->cooldown_mode, name, t);
	return 0;
}

void vorn_check_cooldown_mode(void)
{
	vorn_info_t *info = vorn_get_info();
	if (!info->enabled)
		return;
	if (strcasecmp(info->cooldown_mode, SHUTDOWN) == 0) {
		VORN_KMSG_LOG("[COOLDOWN] Already Shutdown requested!!\n");
		return;
	}
	const char *next = vorn_get_cooldown_mode(&info->cooldown_sensor);
	if (!next)
		return;
	if (!is_release(next) && vorn_check_cooldown_mode_available(next) == 0)
		return;
	if (info->shutdown_delay != 0) {
		if (is_shutdown(next)) {
			int left;
			if (vorn_shutdown_delay_alarm_id <= 0) {
				int ret = tollmgr_add_alarm_withcb(2, info->shutdown_delay, 0, vorn_shutdown_delay_alarm_cb,
								   nullptr, &vorn_shutdown_delay_alarm_id);
				if (ret != 0) {
					// Without the alarm the hold would never end: this reading confirms it now.
					VORN_KMSG_LOG_WARN("[COOLDOWN] Failed to add shutdown delay timer: %d\n", ret);
					vorn_shutdown_delay_alarm_id = 0;
					commit_shutdown(info);
					return;
				}
				left = info->shutdown_delay;
			} else {
				left = seconds_left(vorn_shutdown_delay_alarm_id);
			}
			VORN_KMSG_LOG_WARN("[COOLDOWN] wait shutdown until %ds (%s -> %s, t:%d)\n", left,
					   info->cooldown_mode, next, reading(info->cooldown_sensor));
			return;
		}
		if (vorn_shutdown_delay_alarm_id > 0) {
			VORN_KMSG_LOG_WARN("[COOLDOWN] remove shutdown timer\n");
			remove_shutdown_delay_alarm();
		}
	}
	if (strcasecmp(next, info->cooldown_mode) == 0)
		return;
	if (is_release(next)) {
		VORN_KMSG_LOG("[COOLDOWN] state: %s -> %s\n", info->cooldown_mode, next);
		vorn_setstore_set_int(NOTI_TYPE_KEY, 0);
	} else {
		const vorn_sensor *s = info->cooldown_sensor;
		VORN_KMSG_LOG_WARN("[COOLDOWN] \"%s\" state: %s -> %s (t:%d)\n", s && s->name ? s->name : "",
				   info->cooldown_mode, next, reading(s));
		vorn_cooldown_action(next, info->log_seq);
		vorn_gate_overheating();
		vorn_setstore_set_int(NOTI_TYPE_KEY, 1);
	}
	set_cooldown_mode(info, next);
}

int vorn_shutdown_delay_alarm_cb(int, void *)
{
	vorn_info_t *info = vorn_get_info();
	VORN_KMSG_LOG_WARN("[WAKEUP] shutdown delay alarm expired (interval:%ds)\n", info->shutdown_delay);
	vorn_read_sensors();
	const char *next = vorn_get_cooldown_mode(&info->cooldown_sensor);
	if (!next || !is_shutdown(next)) {
		VORN_KMSG_LOG("[COOLDOWN] exit from ShutDown state\n");
	} else {
		commit_shutdown(info);
	}
	remove_shutdown_delay_alarm();
	return 0;
}

int vorn_emergency_alarm_cb(int, void *)
{
	vorn_info_t *info = vorn_get_info();
	VORN_KMSG_LOG_WARN("[WAKEUP] emergency alarm expired (interval:%ds)\n", info->emergency_hold);
	info->emergency_call = 0;
	vorn_check_cooldown_mode();
	vorn_print_status_log();
	if (vorn_emergency_alarm_id > 0) {
		tollmgr_remove_alarm(vorn_emergency_alarm_id);
		vorn_emergency_alarm_id = 0;
	}
	return 0;
}

void vorn_check_cold_notify(vorn_sensor *sensor)
{
	if (!sensor) {
		VORN_LOGE("Invalid arg");
		return;
	}
	if (sensor->temp >= 0 && sensor->prev_temp >= 0)
		return;
	VORN_KMSG_LOG("[COLD] %d -> %d\n", sensor->prev_temp, sensor->temp);
	vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedTemperature", sensor->temp * 10);
}

int vorn_is_flash_led_temp(int temp)
{
	return temp < FLASH_LED_COLD || temp > FLASH_LED_HOT;
}

void vorn_check_limit_flash_led(vorn_sensor *sensor)
{
	if (!sensor) {
		VORN_LOGE("Invalid arg");
		return;
	}
	vorn_info_t *info = vorn_get_info();
	const int block = vorn_is_flash_led_temp(sensor->temp);
	if (block == info->flash_led_blocked)
		return;
	info->flash_led_blocked = block;
	vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "BlockFlashLed", block);
}
