// The thermal state record and the sensor operations: reading, averaging, look-up by name and
// threshold offsets.
#include "vorn_info.h"

#include "qor_log.h"
#include "vorn_util.h"

#include <strings.h>

namespace {

constexpr int READ_FAILURE_TEMP = 30; // stands in for a reading that failed

constexpr vorn_info_t vorn_info_defaults = [] {
	vorn_info_t d{};
	d.enabled = 1;
	d.booting_offset = 10;
	d.charging_offset = 0;
	d.log_seq = 0;
	d.poll_interval = 30;
	d.log_interval = 300;
	d.gate_log = 0;
	d.emergency_hold = 0;
	d.shutdown_delay = 60;
	const char booting[] = "Booting";
	for (int i = 0; booting[i]; i++)
		d.cooldown_mode[i] = booting[i];
	d.mode = 0;
	d.level = -1;
	d.applied_limits = {-1, -1, -1, -1, -1, -1, -1};
	d.forced_level = -1;
	d.lcd_on = 1;
	d.warning_armed = 1;
	return d;
}();

vorn_info_t vorn_info = vorn_info_defaults;

// Walks the sensor table up to its end record, never past the slots it declares.
template <typename F> void for_each_sensor(F f)
{
	for (int i = 0; vorn_info.sensors && i < vorn_info.sensor_count && vorn_info.sensors[i].id != -1; i++)
		f(vorn_info.sensors[i]);
}

bool avg_window_valid(const vorn_sensor &s)
{
	return s.avg_window >= 1 && s.avg_window <= VORN_AVG_SLOTS;
}

} // namespace

vorn_info_t *vorn_get_info(void)
{
	return &vorn_info;
}

void vorn_info_reset(void)
{
	vorn_info = vorn_info_defaults;
}

vorn_sensor *vorn_sensor_at(int index)
{
	if (index < 0 || !vorn_info.sensors)
		return nullptr;
	for (int i = 0; i < vorn_info.sensor_count && vorn_info.sensors[i].id != -1; i++)
		if (i == index)
			return &vorn_info.sensors[i];
	return nullptr;
}

vorn_sensor *vorn_get_sensor(const char *name)
{
	if (!name) {
		VORN_LOGE("name is null");
		return nullptr;
	}
	vorn_sensor *found = nullptr;
	for_each_sensor([&](vorn_sensor &s) {
		if (!found && s.name && strcasecmp(s.name, name) == 0)
			found = &s;
	});
	if (found)
		VORN_LOGI("Get %s sensor", found->name);
	else
		VORN_LOGI("Sensor %s Not found", name);
	return found;
}

void vorn_read_sensors(void)
{
	for_each_sensor([](vorn_sensor &s) {
		int t = READ_FAILURE_TEMP;
		int ret = s.read ? s.read(s.path, &t) : -22;
		if (ret != 0) {
			VORN_KMSG_LOG("Failed to read %s temp (%d)\n", s.name, ret);
			t = READ_FAILURE_TEMP;
		}
		s.prev_temp = s.temp;
		s.temp = s.avg_enabled == 1 ? vorn_avg_temp(&s, t) : t;
	});
}

int vorn_avg_temp(vorn_sensor *s, int temp)
{
	// A window outside the four slots means averaging off: no modulus by 0, no slot overrun.
	if (!s || !avg_window_valid(*s))
		return temp;
	if (s->avg_next < 0 || s->avg_next >= s->avg_window)
		s->avg_next = 0;
	s->avg_buf[s->avg_next] = temp;
	s->avg_next = (s->avg_next + 1) % s->avg_window;
	long long sum = 0; // four readings of a broken node may pass the int range
	for (int i = 0; i < s->avg_window; i++) {
		if (s->avg_buf[i] == 0) {
			vorn_debug_trace("[AVG][id:%d]idx:%d is zero, temp:%d", s->id, i, temp);
			return temp;
		}
		sum += s->avg_buf[i];
	}
	int avg = static_cast<int>(sum / s->avg_window);
	vorn_debug_trace("[AVG][id:%d] [%d,%d,%d,%d], avg:%d, next_idx:%d", s->id, s->avg_buf[0], s->avg_buf[1],
			 s->avg_buf[2], s->avg_buf[3], avg, s->avg_next);
	return avg;
}

void vorn_init_data_proc(void)
{
	if (vorn_info.gate_log != 0) {
		VORN_LOGI("[DATA_PROC_INIT] skip init data by gate-logging");
		return;
	}
	for_each_sensor([](vorn_sensor &s) {
		if (s.avg_enabled != 1 || !avg_window_valid(s))
			return;
		for (int i = 0; i < s.avg_window; i++)
			s.avg_buf[i] = 0;
		s.avg_next = 0;
		vorn_debug_trace("[DATA_PROC_INIT][id:%d] data all reseted", s.id);
	});
}

void vorn_adjust_threshold(int offset)
{
	if (offset == 0)
		return;
	VORN_KMSG_LOG("Adjust threshold: %c%d\n", offset > 0 ? '+' : ' ', offset);
	for_each_sensor([offset](vorn_sensor &s) {
		if (!s.temp_table || s.temp_table_count < 1)
			return;
		for (int i = 0; i < s.temp_table_count; i++)
			s.temp_table[i] += offset;
	});
}
