// Thermal records: the thermal state record, sensors, limit and mode records.
#pragma once
#include <cstdint>

constexpr int VORN_NAME_SIZE = 256;     // names and messages on the thermal side
constexpr int VORN_STATE_NAME_SIZE = 32; // mode and cooldown state names
constexpr int VORN_LEVEL_COUNT = 5;
constexpr int VORN_APP_HASH_MAX = 32;
constexpr int VORN_AVG_SLOTS = 4;

struct vorn_sensor;
typedef int (*vorn_sensor_read_fn)(const char *path, int *temp);

struct vorn_sensor {
	int id; // -1 ends the table
	const char *name;
	const char *path;
	int *temp_table;
	int temp_table_count;
	int prev_temp;
	int temp;
	vorn_sensor_read_fn read;
	int avg_enabled;
	int avg_next;
	int avg_window;
	int avg_buf[VORN_AVG_SLOTS];
};

struct vorn_limit {
	int cpu_freq;
	int cpu_enable;
	int gpu;
	int brightness;
	int chg_current;
	int auto_screen_tone;
	int dynamic_fps;
};
constexpr int VORN_LIMIT_COUNT = 7;

struct vorn_mode {
	int id;
	char name[VORN_STATE_NAME_SIZE];
	vorn_limit limit[VORN_LEVEL_COUNT];
	uint32_t app_hash[VORN_APP_HASH_MAX];
	int app_count;
};

typedef int (*vorn_limit_setter)(int value);
typedef struct _Eina_Hash Eina_Hash;

struct vorn_info_t {
	vorn_sensor *sensors;
	int sensor_count;
	vorn_mode *modes;
	int mode_count;
	const vorn_limit_setter *limit_setters;
	int limit_count;
	Eina_Hash *mode_name_map;
	int enabled;
	int booting_offset;
	int charging_offset;
	int log_seq;
	int poll_interval;
	int log_interval;
	int gate_log;
	int emergency_hold;
	int shutdown_delay;
	int board_rev;
	int poweroff_charging;
	vorn_sensor *cooldown_sensor;
	char cooldown_mode[VORN_STATE_NAME_SIZE];
	int mode;
	int level;
	vorn_limit applied_limits;
	int forced_level;
	int flash_led_blocked;
	int lcd_on;
	int charging;
	int in_call;
	int camcording;
	int emergency_call;
	int ecm;
	int ecm_call;
	int warning_armed;
};

// The one thermal state record, owned by the thermal thread (defined in vorn_sensor.cpp).
vorn_info_t *vorn_get_info(void);
// Restores the record's defaults (start-up, and a clean slate for tests).
void vorn_info_reset(void);

// Sensors (vorn_sensor.cpp).
vorn_sensor *vorn_get_sensor(const char *name);
// Sensor at a table position (0 "ap", 1 "batt", ...), null past the end of the table.
vorn_sensor *vorn_sensor_at(int index);
void vorn_read_sensors(void);
int vorn_avg_temp(vorn_sensor *sensor, int temp);
void vorn_init_data_proc(void);
void vorn_adjust_threshold(int offset);
