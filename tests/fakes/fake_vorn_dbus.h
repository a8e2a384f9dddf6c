// Stand-in for the thermal D-Bus module: set-up result chosen by the test, calls counted.
#pragma once
#include "vorn_dbus.h"

#include <string>
#include <vector>

struct fake_vorn_dbus_state {
	int setup_result; // returned by vorn_dbus_setup
	int setup_calls, retry_calls, close_calls, broadcasts;
	std::vector<std::string> signals; // "member value" of every broadcast
};
extern fake_vorn_dbus_state fake_vorn_dbus;
inline void fake_vorn_dbus_reset(void) { fake_vorn_dbus = {}; }
