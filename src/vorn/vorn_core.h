// Thermal core: the thermal thread, its start-up and polling cycle, levels and on/off, status and
// gate logging, and the event handling the cycle calls.
#pragma once
#include "vorn_info.h"

constexpr char VORN_APP_ID[] = "com.vandrel.qor";
constexpr char VORN_CONTROL_KEY[] = "db/private/overheat/control";
constexpr int VORN_BOOTING_PERIOD = 180; // seconds
constexpr int VORN_CMDLINE_SIZE = 1024;
constexpr int VORN_STATUS_BODY_SIZE = 256;

// Thermal thread entry: initialises the thermal side and runs the Ecore main loop.
void *vorn_main(void *arg);

// Start-up (vorn_core.cpp).
void vorn_check_boot_mode(vorn_info_t *info);
void vorn_wakeup_alarm_init(void);
void vorn_booting_timer_init(void);
// Ends a pending booting period at once (its offset is removed); 1 when one was pending, else 0.
int vorn_booting_timer_remove(void);
// One polling cycle now, then every poll_interval seconds. 0, or -22 when the timer fails.
int vorn_thermal_mornitor_init(void);
// One polling cycle: sensors, gate line, level, cooldown, cold and flash-LED steps.
void vorn_thermal_monitor(void);
// Polling tick: one cycle and one status line; returns 1 so the timer repeats.
int vorn_thermal_monitor_cb(void *data);
// Deletes the thermal thread's Ecore timers; the loop they belong to is ending.
void vorn_thermal_stop(void);

// Levels, modes and on/off (vorn_core.cpp).
int vorn_check_level_changed(vorn_sensor *sensor);
void vorn_do_mitigation(int mode, int level);
void vorn_check_onoff(void);
void vorn_set_onoff(int flag);

// Cooldown, cold and flash-LED rules, event socket (vorn_core.cpp).
void vorn_check_cooldown_mode(void);
void vorn_check_cold_notify(vorn_sensor *sensor);
void vorn_check_limit_flash_led(vorn_sensor *sensor);
int vorn_socket_init(void);

// Status line and gate logging (vorn_status.cpp).
void vorn_print_status_log(void);
void vorn_gate_device_temp(void);
void vorn_gate_overheating(void);
// seconds: -1 a gate line at every polling cycle, 0 off, above 0 a wake-up alarm with that period.
void vorn_gate_log_set(int seconds);
int vorn_gate_log_alarm_cb(int alarm_id, void *data);
void vorn_logger_init(void);
void vorn_logger_stop(void);
