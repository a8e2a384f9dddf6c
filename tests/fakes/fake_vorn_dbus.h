// Stand-in for the thermal D-Bus module: set-up result chosen by the test, calls counted.
#pragma once
#include "vorn_dbus.h"

extern int fake_vorn_dbus_setup_result; // returned by vorn_dbus_setup (0 by default)
extern int fake_vorn_dbus_setup_calls;
extern int fake_vorn_dbus_close_calls;
extern int fake_vorn_dbus_retry_calls;
extern int fake_vorn_dbus_broadcasts;
void fake_vorn_dbus_reset(void);
