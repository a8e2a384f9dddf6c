// Stand-in for the thermal D-Bus module: no bus, every broadcast and call counted as sent.
#include "fake_vorn_dbus.h"

fake_vorn_dbus_state fake_vorn_dbus;

int vorn_dbus_setup(void) { return fake_vorn_dbus.setup_calls++, fake_vorn_dbus.setup_result; }
void vorn_dbus_setup_retry(void) { fake_vorn_dbus.retry_calls++; }
void vorn_dbus_close(void) { fake_vorn_dbus.close_calls++; }
int vorn_dbus_broadcast_int32(const char *, const char *, const char *member, int value)
{
	fake_vorn_dbus.signals.push_back(std::string(member) + " " + std::to_string(value));
	return fake_vorn_dbus.broadcasts++, 0;
}
int vorn_dbus_broadcast_string(const char *, const char *, const char *member, const char *value)
{
	fake_vorn_dbus.signals.push_back(std::string(member) + " " + value);
	return fake_vorn_dbus.broadcasts++, 0;
}
int vorn_dbus_send_int32(const char *, const char *, const char *, const char *, int) { return 0; }
