// Device layer of the thermal side: the phone model's profile (sensors, modes, limit setters),
// the mode look-ups and the temperature sensor readers.
#pragma once
#include "vorn_info.h"

#include <cstdint>

constexpr int VORN_MODE_COUNT = 8;
constexpr int VORN_SENSOR_SLOTS = 5; // four sensors and the end record
constexpr int VORN_VADC_PATH_SIZE = 260;
constexpr int VORN_OLD_HW_REV = -1;    // revisions up to this one are old hardware
constexpr int VORN_OLD_HW_OFFSET = 10; // degrees added to every threshold on old hardware

// Installs the built-in tables into info (restoring their build-time values), builds the
// mode-name map and applies the old-hardware offset. 0, or -22 for a null info.
int vorn_init_device_info(vorn_info_t *info);
// Board revision from "/proc/cpuinfo" (0 or more), -1 when it cannot be read.
int vorn_get_board_revision(void);
// Mode id for a mode name; 0 for names beginning with "default", -1 unknown, -22 null argument.
int vorn_get_mode_by_name(Eina_Hash *map, const char *name);
// Id of the first mode listing the application, -1 when none does, -22 null argument.
int vorn_get_mode_by_app_name(vorn_info_t *info, const char *app_id);
// Hash of an application id, terminating NUL included.
uint32_t vorn_app_hash(const char *app_id);

// Device hook on a new limit record before it is compared with the applied one.
void vorn_adjust_limit(vorn_info_t *info, vorn_limit *limit);

// Limit setters, in limit-record order.
int vorn_set_limit_cpu_freq(int value);
int vorn_set_limit_cpu_enable(int value);
int vorn_set_limit_gpu(int value);
int vorn_set_limit_brightness(int value);
int vorn_set_limit_chg_current(int value);
int vorn_set_limit_auto_screen_tone(int value);
int vorn_set_limit_dynamic_fps(int value);

// Sensor readers: 0 and the temperature, or a negative code (the temperature is then untouched,
// except by the thermal-zone reader, whose read stores -1).
int vorn_ext_therm_read_temp(const char *path, int *temp);
int vorn_ext_therm_read_temp_2(const char *path, int *temp);
int vorn_thermal_zone_read_temp(const char *path, int *temp);
// channel: name of a node in the first-found "qpnp-vadc-" device directory under "/sys/devices".
int vorn_msm_vadc_read_temp(const char *channel, int *temp);
