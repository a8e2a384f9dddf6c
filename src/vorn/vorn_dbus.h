// D-Bus service of the thermal side: bus name, query methods, signals and display-service calls.
#pragma once

typedef struct _Eldbus_Message Eldbus_Message;
typedef struct _Eldbus_Pending Eldbus_Pending;
typedef struct _Eldbus_Service_Interface Eldbus_Service_Interface;

// The thermal service on the system bus.
#define VORN_DBUS_NAME "org.vexel.qor"
#define VORN_DBUS_PATH "/Org/Vexel/Qor/Vorn"
#define VORN_DBUS_INTERFACE "org.vexel.qor.vorn"

// Display service of the device daemon (corvad).
#define VORN_CORVAD_NAME "org.vexel.system.corvad"
#define VORN_CORVAD_DISPLAY_PATH "/Org/Vexel/System/Corvad/Display"
#define VORN_CORVAD_DISPLAY_INTERFACE "org.vexel.system.corvad.display"

// Longest wait for a display-service reply.
constexpr int VORN_DBUS_REPLY_TIMEOUT_MS = 120000;
// Reply of the temperature methods when there is no value.
constexpr int VORN_DBUS_NO_VALUE = -99;

// Requests the name and registers the object with its four methods on the thermal thread's loop.
// 0; -19 system bus unreachable; -22 D-Bus layer or registration failed.
// When the bus connection drops later, set-up is re-run by a timer until the bus is back.
int vorn_dbus_setup(void);
// Drops the name, the object and both bus connections; shuts the D-Bus layer down.
void vorn_dbus_close(void);
// Runs the set-up again later, backing off while the bus stays away (after a failed set-up or a
// lost connection); does nothing while a retry is pending.
void vorn_dbus_setup_retry(void);

// One-argument signal. 0 queued; -22 path, interface or member missing or malformed (or a
// string value that is missing or not UTF-8); -19 no bus; -1 signal not created; -70 not queued.
int vorn_dbus_broadcast_int32(const char *path, const char *iface, const char *member, int value);
int vorn_dbus_broadcast_string(const char *path, const char *iface, const char *member, const char *value);
// Blocking call with one int32 argument, waiting for an int32 reply (logged, not returned).
// 0 reply read; -74 no bus, no reply or a reply that is not int32; -1 call not created.
int vorn_dbus_send_int32(const char *dest, const char *path, const char *iface, const char *method, int value);

// Method handlers of "org.vexel.qor.vorn"; each returns its reply, never a D-Bus error.
Eldbus_Message *vorn_dbus_get_vorn_level_cb(const Eldbus_Service_Interface *iface, const Eldbus_Message *msg);
Eldbus_Message *vorn_dbus_get_sensor_temp_cb(const Eldbus_Service_Interface *iface, const Eldbus_Message *msg);
Eldbus_Message *vorn_dbus_get_cooldown_temp_cb(const Eldbus_Service_Interface *iface, const Eldbus_Message *msg);
Eldbus_Message *vorn_dbus_get_flash_led_blocked_cb(const Eldbus_Service_Interface *iface, const Eldbus_Message *msg);
// Completion of the name request; data is the request's label text.
void method_return_cb(void *data, const Eldbus_Message *msg, Eldbus_Pending *pending);
