// The thermal side's D-Bus module on a private dbus-daemon: argument checks before the bus, the
// four methods answered on this thread's Ecore loop, the name request, display-call failures.
#include "fake_jotlog.h"
#include "test_support.h"
#include "vorn_dbus.h"
#include "vorn_info.h"

#include <Ecore.h>
#include <cstdlib>
#include <dbus/dbus.h>
#include <gtest/gtest.h>
#include <strings.h>
#include <unistd.h>

using namespace std::chrono_literals;

// The thermal record the handlers read; the thermal core itself is not linked.
namespace {
vorn_sensor test_sensors[3];
vorn_info_t test_info;
} // namespace

vorn_info_t *vorn_get_info(void)
{
	return &test_info;
}

vorn_sensor *vorn_get_sensor(const char *name)
{
	for (vorn_sensor *s = test_info.sensors; name && s->id != -1; s++)
		if (strcasecmp(s->name, name) == 0)
			return s;
	return nullptr;
}

namespace {

// libdbus reads the bus address once per process: every test uses the same socket path, and
// "no bus" means no daemon behind it.
struct bus_env : ::testing::Environment {
	test_tmpdir dir;
	std::string address = "unix:path=" + dir.path + "/bus";
	void SetUp() override
	{
		setenv("DBUS_SYSTEM_BUS_ADDRESS", address.c_str(), 1);
		ecore_app_no_system_modules();
		ecore_init();
	}
	void TearDown() override { ecore_shutdown(); }
};
bus_env *env = static_cast<bus_env *>(::testing::AddGlobalTestEnvironment(new bus_env));

// Waits while this thread's Ecore loop runs, so that the service can answer.
bool loop_until(const std::function<bool()> &cond, std::chrono::milliseconds timeout = 5s)
{
	return test_wait_for([&] {
		ecore_main_loop_iterate_may_block(0);
		return cond();
	}, timeout);
}

class VornDbus : public ::testing::Test {
protected:
	test_process bus;
	DBusConnection *client = nullptr;

	void SetUp() override
	{
		test_info = vorn_info_t{};
		test_sensors[0] = vorn_sensor{0, "ap", "/ap", nullptr, 0, 40, 47, nullptr, 0, 0, 0, {}};
		test_sensors[1] = vorn_sensor{1, "batt", "/batt", nullptr, 0, 30, 31, nullptr, 0, 0, 0, {}};
		test_sensors[2] = vorn_sensor{-1, nullptr, nullptr, nullptr, 0, 0, 0, nullptr, 0, 0, 0, {}};
		test_info.sensors = test_sensors;
		test_info.level = 3;
		test_info.flash_led_blocked = 1;
		fake_jotlog_clear();
	}
	void start_bus()
	{
		std::string out = env->dir.path + "/bus.addr";
		unlink((env->dir.path + "/bus").c_str());
		test_write_file(out, "");
		ASSERT_TRUE(bus.start({"dbus-daemon", "--config-file=" QOR_PRIVATE_BUS_CONF, "--print-address",
				       "--nofork", "--address=" + env->address},
				      {}, out, env->dir.path + "/bus.err"));
		ASSERT_TRUE(test_wait_for([&] { return test_read_file(out).find("unix:") != std::string::npos; }, 5s));
		client = dbus_connection_open_private(env->address.c_str(), nullptr);
		ASSERT_TRUE(client && dbus_bus_register(client, nullptr));
	}
	void TearDown() override
	{
		vorn_dbus_close();
		if (client) {
			dbus_connection_close(client);
			dbus_connection_unref(client);
		}
		bus.stop();
	}

	// Calls a method of the thermal service (with a string argument unless name is null) and
	// returns "i N" for an int32 reply or the error's name.
	std::string call(const char *member, const char *name = nullptr)
	{
		DBusMessage *m = dbus_message_new_method_call(VORN_DBUS_NAME, VORN_DBUS_PATH, VORN_DBUS_INTERFACE, member);
		if (name)
			dbus_message_append_args(m, DBUS_TYPE_STRING, &name, DBUS_TYPE_INVALID);
		DBusPendingCall *p = nullptr;
		dbus_connection_send_with_reply(client, m, &p, 5000);
		dbus_message_unref(m);
		bool done = p && loop_until([&] {
			dbus_connection_read_write_dispatch(client, 0);
			return dbus_pending_call_get_completed(p);
		}, 6s);
		DBusMessage *reply = done ? dbus_pending_call_steal_reply(p) : nullptr;
		if (p)
			dbus_pending_call_unref(p);
		if (!reply)
			return "no reply";
		dbus_int32_t v;
		std::string text = dbus_message_get_type(reply) == DBUS_MESSAGE_TYPE_ERROR ? dbus_message_get_error_name(reply)
				   : dbus_message_get_args(reply, nullptr, DBUS_TYPE_INT32, &v, DBUS_TYPE_INVALID)
					   ? "i " + std::to_string(v)
					   : "not int32";
		dbus_message_unref(reply);
		return text;
	}
};

TEST_F(VornDbus, BadNamesAreRefusedBeforeTheBusIsReached)
{
	// No bus: a call that got as far as the bus would fail with -19 and "Err: dbus_bus_get".
	const char *P = VORN_DBUS_PATH, *I = VORN_DBUS_INTERFACE, *M = "ChangedVorn";
	const char *bad[][3] = {
		{nullptr, I, M}, {P, nullptr, M}, {P, I, nullptr}, {"", I, M},           {P, "", M},
		{P, I, ""},      {"Org/Vexel", I, M}, {P, "noperiod", M}, {P, I, "Changed.Vorn"},
	};
	for (const auto &b : bad) {
		EXPECT_EQ(vorn_dbus_broadcast_int32(b[0], b[1], b[2], 1), -22);
		EXPECT_EQ(vorn_dbus_broadcast_string(b[0], b[1], b[2], "Release"), -22);
	}
	// libdbus would abort the process on text that is not UTF-8.
	EXPECT_EQ(vorn_dbus_broadcast_string(P, I, "ChangedCooldownMode", "bad\xff"), -22);
	EXPECT_EQ(vorn_dbus_broadcast_string(P, I, "ChangedCooldownMode", nullptr), -22);
	EXPECT_EQ(fake_jotlog_count("Err: Invalid argument"), 20);
	EXPECT_EQ(fake_jotlog_count("Err: dbus_bus_get"), 0);

	EXPECT_EQ(vorn_dbus_broadcast_int32(P, I, M, 1), -19);
	EXPECT_EQ(vorn_dbus_send_int32(VORN_CORVAD_NAME, VORN_CORVAD_DISPLAY_PATH, VORN_CORVAD_DISPLAY_INTERFACE,
				       "SetMaxBrightness", 50),
		  -74);
	EXPECT_EQ(vorn_dbus_setup(), -19);
	EXPECT_EQ(fake_jotlog_count("Err: dbus_bus_get"), 3);
	vorn_dbus_close();
	vorn_dbus_close();
	// The same process sets up once the bus is there.
	start_bus();
	EXPECT_EQ(vorn_dbus_setup(), 0);
}

TEST_F(VornDbus, ServiceAnswersTheFourMethods)
{
	start_bus();
	ASSERT_EQ(vorn_dbus_setup(), 0);
	EXPECT_EQ(fake_jotlog_count("dbus init"), 1);
	EXPECT_EQ(fake_jotlog_count("add new obj for org.vexel.qor.vorn"), 1);
	EXPECT_TRUE(loop_until([] { return fake_jotlog_count("return_cb: edbus_request_name: 1") == 1; }));

	EXPECT_EQ(call("GetVornLevel"), "i 3");
	EXPECT_EQ(fake_jotlog_count("request vorn level:3"), 1);
	EXPECT_EQ(call("GetFlashLedBlocked"), "i 1");
	EXPECT_EQ(fake_jotlog_count("[DBUS] Request flash_led_blocked:1"), 1);
	EXPECT_EQ(call("GetSensorTemp", "ap"), "i 47");
	EXPECT_EQ(fake_jotlog_count("[DBUS] Request ap temp:47"), 1);
	EXPECT_EQ(call("GetSensorTemp", "nope"), "i -99");
	EXPECT_EQ(fake_jotlog_count("Invalid sensor name: nope"), 1);
	EXPECT_EQ(call("GetCooldownTemp"), "i -99");
	EXPECT_EQ(fake_jotlog_count("[DBUS] device did not enter cooldown mode"), 1);

	// Values are read at call time.
	test_info.cooldown_sensor = &test_sensors[1];
	test_info.level = 0;
	EXPECT_EQ(call("GetCooldownTemp"), "i 31");
	EXPECT_EQ(fake_jotlog_count("[DBUS] Request batt temp:31"), 1);
	EXPECT_EQ(call("GetVornLevel"), "i 0");

	// Eldbus refuses a call without the name before the handler runs; the service goes on.
	EXPECT_EQ(call("GetSensorTemp"), DBUS_ERROR_INVALID_SIGNATURE);
	EXPECT_EQ(call("GetSensorTemp", "AP"), "i 47");
}

TEST_F(VornDbus, NameHeldByAnotherOwnerIsQueued)
{
	start_bus();
	ASSERT_EQ(dbus_bus_request_name(client, VORN_DBUS_NAME, 0, nullptr), DBUS_REQUEST_NAME_REPLY_PRIMARY_OWNER);
	ASSERT_EQ(vorn_dbus_setup(), 0);
	EXPECT_TRUE(loop_until([] { return fake_jotlog_count("return_cb: edbus_request_name: 2") == 1; }));
	// Once the other owner leaves, the queued request makes the service the owner.
	ASSERT_EQ(dbus_bus_release_name(client, VORN_DBUS_NAME, nullptr), DBUS_RELEASE_NAME_REPLY_RELEASED);
	EXPECT_EQ(call("GetVornLevel"), "i 3");
}

TEST_F(VornDbus, CloseBeforeTheAnswerCancelsTheNameRequest)
{
	start_bus();
	ASSERT_EQ(vorn_dbus_setup(), 0);
	vorn_dbus_close();
	EXPECT_EQ(fake_jotlog_count("Err: edbus_request_name: No msg: ["), 1);
	EXPECT_EQ(fake_jotlog_count("return_cb: edbus_request_name"), 0);
	EXPECT_FALSE(dbus_bus_name_has_owner(client, VORN_DBUS_NAME, nullptr));
}

TEST_F(VornDbus, DisplayCallFailures)
{
	start_bus();
	// Nobody owns the display service's name.
	EXPECT_EQ(vorn_dbus_send_int32(VORN_CORVAD_NAME, VORN_CORVAD_DISPLAY_PATH, VORN_CORVAD_DISPLAY_INTERFACE,
				       "SetMaxBrightness", 70),
		  -74);
	EXPECT_EQ(fake_jotlog_count("Failed to dbus_send_with_reply: [org.freedesktop.DBus.Error.ServiceUnknown:"), 1);
	// Names libdbus would abort on are refused instead.
	EXPECT_EQ(vorn_dbus_send_int32(VORN_CORVAD_NAME, "no/slash", VORN_CORVAD_DISPLAY_INTERFACE, "SetMaxBrightness", 1), -1);
	EXPECT_EQ(vorn_dbus_send_int32(VORN_CORVAD_NAME, VORN_CORVAD_DISPLAY_PATH, nullptr, "SetMaxBrightness", 1), -1);
	EXPECT_EQ(vorn_dbus_send_int32(nullptr, VORN_CORVAD_DISPLAY_PATH, VORN_CORVAD_DISPLAY_INTERFACE, "Set.Max", 1), -1);
	EXPECT_EQ(fake_jotlog_count("Failed to create dbus new method call"), 3);
}

} // namespace

namespace {

DBusHandlerResult collect_signal(DBusConnection *, DBusMessage *m, void *data)
{
	if (dbus_message_get_type(m) == DBUS_MESSAGE_TYPE_SIGNAL && dbus_message_has_member(m, "ChangedVorn"))
		static_cast<std::vector<std::string> *>(data)->push_back(dbus_message_get_sender(m));
	return DBUS_HANDLER_RESULT_NOT_YET_HANDLED;
}

TEST_F(VornDbus, SignalsComeFromTheOwnerOfTheName)
{
	start_bus();
	std::vector<std::string> senders;
	dbus_bus_add_match(client, "type='signal',sender='org.vexel.qor',member='ChangedVorn'", nullptr);
	dbus_connection_add_filter(client, collect_signal, &senders, nullptr);
	ASSERT_EQ(vorn_dbus_setup(), 0);
	ASSERT_TRUE(loop_until([] { return fake_jotlog_count("return_cb: edbus_request_name: 1") == 1; }));
	// A listener that matches on the service's name receives the signal.
	EXPECT_EQ(vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedVorn", 4), 0);
	EXPECT_TRUE(loop_until([&] {
		dbus_connection_read_write_dispatch(client, 0);
		return senders.size() == 1;
	}));
	EXPECT_EQ(fake_jotlog_count("Broadcast [ChangedVorn][4]"), 1);
	dbus_connection_remove_filter(client, collect_signal, &senders);
}

} // namespace
