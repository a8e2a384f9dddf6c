// The thermal service on the system bus: name, methods and (while it is up) signals through Eldbus
// on the thermal loop; display-service calls and early signals through a libdbus connection.
#include "vorn_dbus.h"

#include "qor_log.h"
#include "vorn_info.h"

#include <Ecore.h>
#include <Eldbus.h>
#include <algorithm>
#include <dbus/dbus.h>

namespace {

// First and longest pause between attempts to come back after the bus went away.
constexpr double VORN_DBUS_RETRY_FIRST = 1.0;
constexpr double VORN_DBUS_RETRY_MAX = 30.0;

const char VORN_DBUS_REQUEST_LABEL[] = "edbus_request_name";

// Service handles; all touched on the thermal thread only.
Eldbus_Connection *s_conn;
Eldbus_Pending *s_name_pending;
Eldbus_Service_Interface *s_iface;
bool s_eldbus_up;
Ecore_Timer *s_retry_timer;
double s_retry_delay;
// Connection for signals and display calls; private so that a dead one can be replaced.
DBusConnection *s_bus;

const Eldbus_Arg_Info vorn_dbus_arg_name[] = {{"s", "name"}, {nullptr, nullptr}};
const Eldbus_Arg_Info vorn_dbus_arg_value[] = {{"i", "value"}, {nullptr, nullptr}};

const Eldbus_Method vorn_dbus_methods[] = {
	{"GetVornLevel", nullptr, vorn_dbus_arg_value, vorn_dbus_get_vorn_level_cb, 0},
	{"GetSensorTemp", vorn_dbus_arg_name, vorn_dbus_arg_value, vorn_dbus_get_sensor_temp_cb, 0},
	{"GetCooldownTemp", nullptr, vorn_dbus_arg_value, vorn_dbus_get_cooldown_temp_cb, 0},
	{"GetFlashLedBlocked", nullptr, vorn_dbus_arg_value, vorn_dbus_get_flash_led_blocked_cb, 0},
	{nullptr, nullptr, nullptr, nullptr, 0},
};

const Eldbus_Service_Interface_Desc vorn_dbus_desc = {
	VORN_DBUS_INTERFACE, vorn_dbus_methods, nullptr, nullptr, nullptr, nullptr,
};

const char *text_or_empty(const char *s)
{
	return s ? s : "";
}

void bus_drop(void)
{
	if (!s_bus)
		return;
	dbus_connection_close(s_bus);
	dbus_connection_unref(s_bus);
	s_bus = nullptr;
}

// libdbus learns that the bus is gone only when it reads or writes, so every use first lets it
// read what is pending (a hang-up included); messages sent to this connection are dropped.
DBusConnection *bus_get(void)
{
	if (s_bus) {
		dbus_connection_read_write(s_bus, 0);
		while (dbus_connection_dispatch(s_bus) == DBUS_DISPATCH_DATA_REMAINS) {
		}
		if (dbus_connection_get_is_connected(s_bus))
			return s_bus;
		VORN_LOGE("Err: system bus connection lost, reconnecting");
		bus_drop();
	}
	DBusError err;
	dbus_error_init(&err);
	s_bus = dbus_bus_get_private(DBUS_BUS_SYSTEM, &err);
	dbus_error_free(&err);
	if (!s_bus) {
		VORN_LOGE("Err: dbus_bus_get");
		return nullptr;
	}
	dbus_connection_set_exit_on_disconnect(s_bus, FALSE);
	return s_bus;
}

bool args_ok(const Eldbus_Arg_Info *args)
{
	for (; args && args->signature; args++)
		if (!dbus_signature_validate_single(args->signature, nullptr))
			return false;
	return true;
}

// Eldbus adds object, interface and methods in one call, and skips a method row it cannot take
// without failing; checking first makes a bad table fail set-up with the step's own message.
bool service_ok(void)
{
	bool ok = true;
	if (!dbus_validate_path(VORN_DBUS_PATH, nullptr)) {
		VORN_LOGE("Err: Failed to add edbus obj");
		ok = false;
	}
	if (!dbus_validate_interface(vorn_dbus_desc.interface, nullptr)) {
		VORN_LOGE("Err: Failed to add edbus interface");
		ok = false;
	}
	if (!ok)
		return false;
	for (const Eldbus_Method *m = vorn_dbus_methods; m->member; m++) {
		if (!dbus_validate_member(m->member, nullptr) || !m->cb || !args_ok(m->in) || !args_ok(m->out)) {
			VORN_LOGE("Err: Failed to add method %s!", m->member);
			return false;
		}
	}
	return true;
}

Eina_Bool retry_cb(void *);

void disconnected_cb(void *, Eldbus_Connection *, void *)
{
	VORN_LOGE("Err: system bus connection lost");
	vorn_dbus_setup_retry();
}

// Releases the Eldbus side: pending name request, object, connection, the layer itself.
void service_down(void)
{
	if (s_name_pending)
		eldbus_pending_cancel(s_name_pending); // method_return_cb runs and forgets it
	s_name_pending = nullptr;
	if (s_iface) {
		eldbus_service_object_unregister(s_iface);
		s_iface = nullptr;
	}
	if (s_conn) {
		eldbus_connection_event_callback_del(s_conn, ELDBUS_CONNECTION_EVENT_DISCONNECTED, disconnected_cb, nullptr);
		eldbus_connection_unref(s_conn);
		s_conn = nullptr;
	}
	if (s_eldbus_up) {
		eldbus_shutdown();
		s_eldbus_up = false;
	}
}

// Runs after the bus went away: a fresh set-up each time, backing off while the bus stays away.
Eina_Bool retry_cb(void *)
{
	service_down();
	if (vorn_dbus_setup() == 0) {
		s_retry_timer = nullptr;
		return ECORE_CALLBACK_CANCEL;
	}
	s_retry_delay = std::min(s_retry_delay * 2, VORN_DBUS_RETRY_MAX);
	ecore_timer_interval_set(s_retry_timer, s_retry_delay);
	return ECORE_CALLBACK_RENEW;
}

Eldbus_Message *reply_int32(const Eldbus_Message *msg, int value)
{
	Eldbus_Message *reply = eldbus_message_method_return_new(msg);
	if (reply)
		eldbus_message_arguments_append(reply, "i", value);
	return reply;
}

// Shared steps of the two broadcasts up to queueing; 0 when queued.
int signal_send(const char *path, const char *iface, const char *member, int type, const void *value)
{
	bool valid = path && iface && member && dbus_validate_path(path, nullptr) &&
		     dbus_validate_interface(iface, nullptr) && dbus_validate_member(member, nullptr);
	if (valid && type == DBUS_TYPE_STRING) {
		// libdbus aborts the process on text that is not UTF-8.
		const char *text = *static_cast<const char *const *>(value);
		valid = text && dbus_validate_utf8(text, nullptr);
	}
	if (!valid) {
		VORN_LOGE("Err: Invalid argument");
		return -22;
	}
	// While the service is up its own connection sends, so that signals come from the owner of
	// the name (listeners match on it); the libdbus connection covers the time before set-up.
	if (s_conn) {
		Eldbus_Message *sig = eldbus_message_signal_new(path, iface, member);
		if (!sig) {
			VORN_LOGE("fail to allocate new %s.%s signal", iface, member);
			return -1;
		}
		bool appended = type == DBUS_TYPE_STRING
					? eldbus_message_arguments_append(sig, "s", *static_cast<const char *const *>(value))
					: eldbus_message_arguments_append(sig, "i", *static_cast<const dbus_int32_t *>(value));
		if (!appended) {
			eldbus_message_unref(sig);
			return -70;
		}
		eldbus_connection_send(s_conn, sig, nullptr, nullptr, -1); // takes the message
		return 0;
	}
	DBusConnection *bus = bus_get();
	if (!bus)
		return -19;
	DBusMessage *sig = dbus_message_new_signal(path, iface, member);
	if (!sig) {
		VORN_LOGE("fail to allocate new %s.%s signal", iface, member);
		return -1;
	}
	bool queued = dbus_message_append_args(sig, type, value, DBUS_TYPE_INVALID) &&
		      dbus_connection_send(bus, sig, nullptr);
	dbus_message_unref(sig);
	// A write that met a closed socket has disconnected the connection: the signal is lost.
	return queued && dbus_connection_get_is_connected(bus) ? 0 : -70;
}

} // namespace

int vorn_dbus_setup(void)
{
	if (s_conn)
		return 0;
	VORN_LOGI("dbus init");
	if (eldbus_init() <= 0) {
		VORN_LOGE("Err: Failed to init e_dbus\n");
		return -22;
	}
	s_eldbus_up = true;
	// The system bus as libdbus finds it; signals and display calls use this connection too.
	if (!bus_get()) {
		service_down();
		return -19;
	}
	// Eldbus opens its own connection and hooks it into the Ecore loop in one step.
	s_conn = eldbus_connection_get(ELDBUS_CONNECTION_TYPE_SYSTEM);
	if (!s_conn) {
		VORN_LOGE("Err: edbus_connection_setup");
		service_down();
		return -22;
	}
	eldbus_connection_event_callback_add(s_conn, ELDBUS_CONNECTION_EVENT_DISCONNECTED, disconnected_cb, nullptr);
	s_name_pending = eldbus_name_request(s_conn, VORN_DBUS_NAME, ELDBUS_NAME_REQUEST_FLAG_REPLACE_EXISTING,
					     method_return_cb, VORN_DBUS_REQUEST_LABEL);
	if (!s_name_pending) {
		VORN_LOGE("Err: Failed to request edbus name");
		service_down();
		return -22;
	}
	if (!service_ok()) {
		service_down();
		return -22;
	}
	s_iface = eldbus_service_interface_register(s_conn, VORN_DBUS_PATH, &vorn_dbus_desc);
	if (!s_iface) {
		VORN_LOGE("Err: Failed to add edbus obj");
		service_down();
		return -22;
	}
	VORN_LOGI("add new obj for %s", VORN_DBUS_INTERFACE);
	return 0;
}

void vorn_dbus_setup_retry(void)
{
	if (s_retry_timer)
		return;
	s_retry_delay = VORN_DBUS_RETRY_FIRST;
	s_retry_timer = ecore_timer_add(s_retry_delay, retry_cb, nullptr);
}

void vorn_dbus_close(void)
{
	if (s_retry_timer) {
		ecore_timer_del(s_retry_timer);
		s_retry_timer = nullptr;
	}
	service_down();
	bus_drop();
}

void method_return_cb(void *data, const Eldbus_Message *msg, Eldbus_Pending *pending)
{
	const char *label = data ? static_cast<const char *>(data) : "Unknown";
	if (pending == s_name_pending)
		s_name_pending = nullptr;
	const char *name = nullptr, *text = nullptr;
	unsigned int code;
	if (msg && !eldbus_message_error_get(msg, &name, &text) && eldbus_message_arguments_get(msg, "u", &code)) {
		VORN_LOGI("return_cb: %s: %d", label, static_cast<int>(code));
		return;
	}
	VORN_LOGE("Err: %s: No msg: [%s:%s]", label, text_or_empty(name), text_or_empty(text));
}

Eldbus_Message *vorn_dbus_get_vorn_level_cb(const Eldbus_Service_Interface *, const Eldbus_Message *msg)
{
	int level = vorn_get_info()->level;
	VORN_LOGI("request vorn level:%d", level);
	return reply_int32(msg, level);
}

Eldbus_Message *vorn_dbus_get_sensor_temp_cb(const Eldbus_Service_Interface *, const Eldbus_Message *msg)
{
	const char *name = nullptr;
	if (!eldbus_message_arguments_get(msg, "s", &name)) {
		VORN_LOGE("Failed to get args");
		return reply_int32(msg, VORN_DBUS_NO_VALUE);
	}
	const vorn_sensor *sensor = vorn_get_sensor(name);
	if (!sensor) {
		VORN_LOGE("Invalid sensor name: %s", name);
		return reply_int32(msg, VORN_DBUS_NO_VALUE);
	}
	VORN_LOGI("[DBUS] Request %s temp:%d", sensor->name, sensor->temp);
	return reply_int32(msg, sensor->temp);
}

Eldbus_Message *vorn_dbus_get_cooldown_temp_cb(const Eldbus_Service_Interface *, const Eldbus_Message *msg)
{
	const vorn_sensor *sensor = vorn_get_info()->cooldown_sensor;
	if (!sensor) {
		VORN_LOGE("[DBUS] device did not enter cooldown mode");
		return reply_int32(msg, VORN_DBUS_NO_VALUE);
	}
	VORN_LOGI("[DBUS] Request %s temp:%d", sensor->name, sensor->temp);
	return reply_int32(msg, sensor->temp);
}

Eldbus_Message *vorn_dbus_get_flash_led_blocked_cb(const Eldbus_Service_Interface *, const Eldbus_Message *msg)
{
	int blocked = vorn_get_info()->flash_led_blocked;
	VORN_LOGI("[DBUS] Request flash_led_blocked:%d", blocked);
	return reply_int32(msg, blocked);
}

int vorn_dbus_broadcast_int32(const char *path, const char *iface, const char *member, int value)
{
	dbus_int32_t v = value;
	int ret = signal_send(path, iface, member, DBUS_TYPE_INT32, &v);
	if (ret == 0)
		VORN_LOGI("Broadcast [%s][%d]", member, value);
	else if (ret == -70)
		VORN_LOGE("Err: Failed to broadcast [%s][%d]", member, value);
	return ret;
}

int vorn_dbus_broadcast_string(const char *path, const char *iface, const char *member, const char *value)
{
	int ret = signal_send(path, iface, member, DBUS_TYPE_STRING, &value);
	if (ret == 0)
		VORN_LOGI("Broadcast [%s][%s]", member, value);
	else if (ret == -70)
		VORN_LOGE("Err: Failed to broadcast [%s][%s]", member, value);
	return ret;
}

int vorn_dbus_send_int32(const char *dest, const char *path, const char *iface, const char *method, int value)
{
	DBusConnection *bus = bus_get();
	if (!bus)
		return -74;
	// libdbus aborts the process on malformed names instead of failing the call.
	bool valid = dest && path && iface && method && dbus_validate_bus_name(dest, nullptr) &&
		     dbus_validate_path(path, nullptr) && dbus_validate_interface(iface, nullptr) &&
		     dbus_validate_member(method, nullptr);
	DBusMessage *call = valid ? dbus_message_new_method_call(dest, path, iface, method) : nullptr;
	if (!call) {
		VORN_LOGE("Failed to create dbus new method call");
		return -1;
	}
	DBusError err;
	dbus_error_init(&err);
	dbus_int32_t arg = value;
	DBusMessage *reply = nullptr;
	if (dbus_message_append_args(call, DBUS_TYPE_INT32, &arg, DBUS_TYPE_INVALID))
		reply = dbus_connection_send_with_reply_and_block(bus, call, VORN_DBUS_REPLY_TIMEOUT_MS, &err);
	dbus_message_unref(call);

	int ret = -74;
	if (!reply) {
		VORN_LOGE("Failed to dbus_send_with_reply: [%s:%s]", text_or_empty(err.name), text_or_empty(err.message));
	} else {
		dbus_int32_t got;
		if (dbus_message_get_args(reply, &err, DBUS_TYPE_INT32, &got, DBUS_TYPE_INVALID)) {
			VORN_LOGI("%s: reply:%d", method, got);
			ret = 0;
		} else {
			VORN_LOGE("Failed to get reply: [%s:%s]", text_or_empty(err.name), text_or_empty(err.message));
		}
		dbus_message_unref(reply);
	}
	dbus_error_free(&err);
	return ret;
}
