// Device profile of the X200A phone: sensor and mode tables, limit setters, board revision and the
// temperature sensor readers.
#include "vorn_device.h"

#include "device_info.h"
#include "qor_log.h"
#include "qor_text.h"
#include "sysroot.h"
#include "vorn_util.h"
#include "vorn_tuning.h"

#include <Eina.h>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <string_view>
#include <unistd.h>

namespace {

// Threshold tables are changed in place by the offsets and the tuning file.
int ap_thresholds[VORN_LEVEL_COUNT];
int batt_thresholds[VORN_LEVEL_COUNT];
int xo_thresholds[VORN_LEVEL_COUNT];
constexpr int ap_thresholds_default[VORN_LEVEL_COUNT] = {60, 65, 70, 75, 85};
constexpr int batt_thresholds_default[VORN_LEVEL_COUNT] = {55, 60, 65, 70, 80};
constexpr int xo_thresholds_default[VORN_LEVEL_COUNT] = {85, 90, 95, 100, 105};

constexpr vorn_sensor sensor(int id, const char *name, const char *path, int *table, int count, int temp,
			     vorn_sensor_read_fn read)
{
	return vorn_sensor{id, name, path, table, count, 0, temp, read, 0, 0, 0, {0, 0, 0, 0}};
}

constexpr vorn_sensor sensor_defaults[VORN_SENSOR_SLOTS] = {
	sensor(0, "ap", "/sys/class/xun/temperature/ap_therm", ap_thresholds, VORN_LEVEL_COUNT, -99,
	       vorn_ext_therm_read_temp),
	sensor(1, "batt", "/sys/class/xun/temperature/batt_therm", batt_thresholds, VORN_LEVEL_COUNT, -99,
	       vorn_ext_therm_read_temp),
	sensor(2, "xo", "/sys/class/xun/temperature/xo_therm", xo_thresholds, VORN_LEVEL_COUNT, -99,
	       vorn_ext_therm_read_temp),
	sensor(3, "cpu0", "/sys/class/thermal/thermal_zone1/temp", nullptr, -1, 0, vorn_thermal_zone_read_temp),
	sensor(-1, nullptr, nullptr, nullptr, 0, 0, nullptr),
};
vorn_sensor sensor_table[VORN_SENSOR_SLOTS];

// Uncapped everywhere: tighter records come only from a tuning file.
constexpr vorn_limit open_limit = {-1, -1, -2, -2, 100, 0, 100};

constexpr vorn_mode mode(int id, const char *name)
{
	vorn_mode m{};
	m.id = id;
	for (int i = 0; name[i] && i < VORN_STATE_NAME_SIZE - 1; i++)
		m.name[i] = name[i];
	for (auto &l : m.limit)
		l = open_limit;
	return m;
}

constexpr vorn_mode mode_defaults[VORN_MODE_COUNT] = {
	mode(0, "default"),  mode(1, "ScreenOff"),	 mode(2, "ScreenOffInCall"), mode(3, "HeavyLoad"),
	mode(4, "Camcording"), mode(5, "CameraBurstShot"), mode(6, "Browser"),	  mode(7, "Hotgame"),
};
// Applications that select a mode; their hashes are computed by the same function the look-up uses.
struct mode_app {
	int mode;
	const char *app_id;
};
constexpr mode_app mode_apps[] = {{6, "com.vandrel.browser"}};
vorn_mode mode_table[VORN_MODE_COUNT];

constexpr vorn_limit_setter limit_setter_table[VORN_LIMIT_COUNT] = {
	vorn_set_limit_cpu_freq,    vorn_set_limit_cpu_enable,	     vorn_set_limit_gpu,
	vorn_set_limit_brightness,  vorn_set_limit_chg_current, vorn_set_limit_auto_screen_tone,
	vorn_set_limit_dynamic_fps,
};

// Created by the device init; a later init replaces it.
Eina_Hash *mode_name_map;

// The vadc channel node, searched once per process (or device init).
int vadc_found;
char vadc_path[VORN_VADC_PATH_SIZE];

constexpr char CPUINFO_PATH[] = "/proc/cpuinfo";
constexpr char VADC_DEVICES[] = "/sys/devices";
constexpr int CPUINFO_READ_SIZE = 1024;

void restore_tables(void)
{
	memcpy(ap_thresholds, ap_thresholds_default, sizeof ap_thresholds);
	memcpy(batt_thresholds, batt_thresholds_default, sizeof batt_thresholds);
	memcpy(xo_thresholds, xo_thresholds_default, sizeof xo_thresholds);
	for (int i = 0; i < VORN_SENSOR_SLOTS; i++)
		sensor_table[i] = sensor_defaults[i];
	for (int i = 0; i < VORN_MODE_COUNT; i++)
		mode_table[i] = mode_defaults[i];
	for (const auto &app : mode_apps) {
		vorn_mode &m = mode_table[app.mode];
		if (m.app_count < VORN_APP_HASH_MAX)
			m.app_hash[m.app_count++] = vorn_app_hash(app.app_id);
	}
	vadc_found = 0;
	vadc_path[0] = '\0';
}

// Value of the first "Revision" line: hexadecimal from two characters after its colon.
// false when there is no "Revision" or no colon after it.
bool parse_revision(const char *text, int *rev)
{
	const char *key = strstr(text, "Revision");
	if (!key)
		return false;
	const char *colon = strchr(key, ':');
	if (!colon) {
		VORN_LOGE("revision not found");
		return false;
	}
	// Never step past the terminator when the text ends at the colon.
	const char *value = colon[1] ? colon + 2 : colon + 1;
	long v = strtol(value, nullptr, 16);
	*rev = v > INT_MAX ? INT_MAX : v < INT_MIN ? INT_MIN : static_cast<int>(v);
	return true;
}

// Reads a node's text and converts the number after marker. 0, the read's error, or -22.
int read_after_marker(const char *path, const char *marker, int *temp)
{
	char buf[VORN_NAME_SIZE] = {};
	int ret = sys_get_str(path, buf);
	if (ret != 0)
		return ret;
	const char *at = strstr(buf, marker);
	if (!at || at[strlen(marker)] == '\0')
		return -22;
	*temp = qor_leading_int(at + strlen(marker));
	return 0;
}

void find_vadc_node(const char *channel)
{
	char real[QOR_PATH_MAX];
	DIR *dir = qor_path(VADC_DEVICES, real) < 0 ? nullptr : opendir(real);
	if (!dir)
		return;
	while (const dirent *e = readdir(dir)) {
		if (!strstr(e->d_name, "qpnp-vadc-"))
			continue;
		char candidate[VORN_VADC_PATH_SIZE];
		// A path that does not fit would name another node: refuse it.
		if (QOR_FORMAT(candidate, "%s/%s/%s", VADC_DEVICES, e->d_name, channel) !=
		    strlen(VADC_DEVICES) + strlen(e->d_name) + strlen(channel) + 2) {
			VORN_LOGE("vadc path too long: %s", e->d_name);
			continue;
		}
		QOR_COPY(vadc_path, candidate);
		vadc_found = 1;
		qor_path(vadc_path, real);
		VORN_LOGI("vadc_path: %s", real);
	}
	closedir(dir);
}

} // namespace

int vorn_init_device_info(vorn_info_t *info)
{
	if (!info)
		return -22;
	VORN_LOGI("+++");
	restore_tables();
	info->board_rev = vorn_get_board_revision();
	info->sensors = sensor_table;
	info->sensor_count = VORN_SENSOR_SLOTS;
	info->limit_setters = limit_setter_table;
	info->limit_count = VORN_LIMIT_COUNT;

	if (mode_name_map)
		eina_hash_free(mode_name_map);
	mode_name_map = eina_hash_string_superfast_new(nullptr);
	for (auto &m : mode_table) {
		// The value is the record's id field: never null, so mode 0 is held like the others.
		if (!mode_name_map || !eina_hash_add(mode_name_map, m.name, &m.id))
			VORN_LOGE("Failed to add hash (%d)", m.id);
	}
	info->mode_name_map = mode_name_map;

	VORN_LOGI("Init from defined scenario");
	info->modes = mode_table;
	info->mode_count = VORN_MODE_COUNT;
	// Tuned tables first: the old-hardware, booting and charging offsets act on top of them.
	vorn_tuning_load_env(info);

	VORN_LOGI("old_rev:%d", VORN_OLD_HW_REV);
	if (info->board_rev > VORN_OLD_HW_REV)
		return 0;
	VORN_KMSG_LOG("Rev %d is OLD HW\n", info->board_rev);
	vorn_adjust_threshold(VORN_OLD_HW_OFFSET);
	return 0;
}

int vorn_get_board_revision(void)
{
	char buf[CPUINFO_READ_SIZE];
	long n = vorn_read_device_file(CPUINFO_PATH, buf, sizeof buf);
	int rev;
	if (n == -1) {
		VORN_LOGE("Failed to open cpuinfo");
	} else if (n < 0) {
		VORN_LOGE("Failed to read cpuinfo");
	} else if (parse_revision(buf, &rev)) {
		VORN_KMSG_LOG("Board Rev:%d\n", rev);
		return rev;
	}
	VORN_LOGE("Failed to init board_rev");
	return -1;
}

// Actuators are not wired to the device yet: each setter accepts its value and limits nothing.
int vorn_set_limit_cpu_freq(int)
{
	return 0;
}

int vorn_set_limit_cpu_enable(int)
{
	return 0;
}

int vorn_set_limit_gpu(int)
{
	return 0;
}

int vorn_set_limit_brightness(int)
{
	return 0;
}

int vorn_set_limit_chg_current(int)
{
	return 0;
}

int vorn_set_limit_auto_screen_tone(int)
{
	return 0;
}

int vorn_set_limit_dynamic_fps(int)
{
	return 0;
}

int vorn_ext_therm_read_temp(const char *path, int *temp)
{
	if (!path || !temp)
		return -22;
	int ret = read_after_marker(path, "temp:", temp);
	if (ret == -22)
		VORN_LOGE("Invalid temper info");
	return ret;
}

int vorn_ext_therm_read_temp_2(const char *path, int *temp)
{
	if (!path || !temp)
		return -22;
	int ret = read_after_marker(path, "temp:", temp);
	if (ret == -22)
		VORN_LOGE("Invalid temper info");
	return ret;
}

int vorn_thermal_zone_read_temp(const char *path, int *temp)
{
	if (!path || !temp)
		return -22;
	return sys_get_int(path, temp);
}

int vorn_msm_vadc_read_temp(const char *channel, int *temp)
{
	if (!channel || !temp)
		return -22;
	if (!vadc_found)
		find_vadc_node(channel);
	if (!vadc_found) {
		VORN_LOGE("Not found vadc node");
		return -2;
	}
	int ret = read_after_marker(vadc_path, "Result:", temp);
	if (ret == -22)
		VORN_LOGE("Invalid temper info");
	return ret;
}
