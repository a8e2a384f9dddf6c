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

// On/off (vorn_core.cpp).
void vorn_check_onoff(void);
void vorn_set_onoff(int flag);

// Levels, the mode stack and mitigation (vorn_level.cpp).
constexpr int VORN_MODE_LIST_SIZE = 30;
extern int mode_list[VORN_MODE_LIST_SIZE];
extern int mode_list_count;
int vorn_check_level_changed(vorn_sensor *sensor);
int vorn_change_level_force(int level);
int vorn_check_mode_changed(int mode, int enter);
void vorn_do_mitigation(int mode, int level);
void vorn_print_limit_info(const char *tag, const vorn_limit *limit);

// Cooldown state machine, cold and flash-LED rules (vorn_cooldown.cpp).
// Pending tollmgr alarms of the cooldown and emergency-call handling, 0 when none.
extern int vorn_shutdown_delay_alarm_id;
extern int vorn_emergency_alarm_id;
const char *vorn_get_cooldown_mode(vorn_sensor **sensor);
int vorn_check_warning_temp(vorn_sensor *sensor);
int vorn_check_cooldown_mode_available(const char *name);
void vorn_check_cooldown_mode(void);
int vorn_shutdown_delay_alarm_cb(int alarm_id, void *data);
int vorn_emergency_alarm_cb(int alarm_id, void *data);
void vorn_check_cold_notify(vorn_sensor *sensor);
void vorn_check_limit_flash_led(vorn_sensor *sensor);
int vorn_is_flash_led_temp(int temp);

// Thermal event socket and control commands (vorn_socket.cpp).
typedef struct _Ecore_Fd_Handler Ecore_Fd_Handler;
int vorn_socket_init(void);
int vorn_socket_recv_cb(void *data, Ecore_Fd_Handler *handler);
int vorn_handle_scenario_event(const char *text);
int vorn_handle_control_event(int command, const char *arg);

// Platform state events (vorn_event.cpp).
int vorn_handle_setstore_event(int event, int value);

// Status line and gate logging (vorn_status.cpp).
void vorn_print_status_log(void);
void vorn_gate_device_temp(void);
void vorn_gate_overheating(void);
// seconds: -1 a gate line at every polling cycle, 0 off, above 0 a wake-up alarm with that period.
void vorn_gate_log_set(int seconds);
int vorn_gate_log_alarm_cb(int alarm_id, void *data);
void vorn_logger_init(void);
void vorn_logger_stop(void);
