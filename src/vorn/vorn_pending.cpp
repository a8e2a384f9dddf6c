// TEMPORARY during parallel development: definitions not built yet. Each owner deletes the
// definitions it implements; the file goes once empty.
#include "vorn_core.h"
#include "vorn_device.h"

// --- levels (vorn_level.cpp) ---
int mode_list[VORN_MODE_LIST_SIZE];
int mode_list_count;
int vorn_check_level_changed(vorn_sensor *) { return 0; }
int vorn_change_level_force(int) { return -1; }
int vorn_check_mode_changed(int, int) { return 0; }
void vorn_do_mitigation(int, int) {}
void vorn_print_limit_info(const char *, const vorn_limit *) {}
void vorn_adjust_limit(vorn_info_t *, vorn_limit *) {}

// --- event socket and control (vorn_socket.cpp) ---
int vorn_socket_init(void) { return -19; }
int vorn_socket_recv_cb(void *, Ecore_Fd_Handler *) { return 1; }
int vorn_handle_scenario_event(const char *) { return -22; }
int vorn_handle_control_event(int, const char *) { return -22; }

// --- platform state events (vorn_event.cpp) ---
int vorn_handle_setstore_event(int, int) { return -22; }
