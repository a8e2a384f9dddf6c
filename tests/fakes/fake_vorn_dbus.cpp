// Stand-in for the thermal D-Bus module: no bus, every broadcast and call counted as sent.
#include "fake_vorn_dbus.h"

int fake_vorn_dbus_setup_result;
int fake_vorn_dbus_setup_calls;
int fake_vorn_dbus_close_calls;
int fake_vorn_dbus_retry_calls;
int fake_vorn_dbus_broadcasts;

int vorn_dbus_setup(void)
{
	fake_vorn_dbus_setup_calls++;
	return fake_vorn_dbus_setup_result;
}

void vorn_dbus_setup_retry(void)
{
	fake_vorn_dbus_retry_calls++;
}

void vorn_dbus_close(void)
{
	fake_vorn_dbus_close_calls++;
}

int vorn_dbus_broadcast_int32(const char *, const char *, const char *, int)
{
	return fake_vorn_dbus_broadcasts++, 0;
}

int vorn_dbus_broadcast_string(const char *, const char *, const char *, const char *)
{
	return fake_vorn_dbus_broadcasts++, 0;
}

int vorn_dbus_send_int32(const char *, const char *, const char *, const char *, int)
{
	return 0;
}

void fake_vorn_dbus_reset(void)
{
	fake_vorn_dbus_setup_result = fake_vorn_dbus_setup_calls = fake_vorn_dbus_close_calls = 0;
	fake_vorn_dbus_retry_calls = 0;
	fake_vorn_dbus_broadcasts = 0;
}
