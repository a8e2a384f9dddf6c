// The thermal side's D-Bus module on a private dbus-daemon: argument checks before the bus, the
// four methods answered on this thread's Ecore loop, the name request, display-call failures.
#include "fake_jotlog.h"
#include "test_support.h"
#include "vorn_dbus.h"
#include "vorn_info.h"

#include <Ecore.h>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <dbus/dbus.h>
#include <gtest/gtest.h>
#include <memory>
#include <sys/wait.h>
#include <unistd.h>

using namespace std::chrono_literals;

// The thermal record the handlers read; the thermal core itself is not linked.
namespace {
vorn_sensor test_ap, test_batt;
vorn_info_t test_info;
} // namespace

vorn_info_t *vorn_get_info(void)
{
	return &test_info;
}

vorn_sensor *vorn_get_sensor(const char *name)
{
	return name && strcmp(name, "ap") == 0 ? &test_ap : nullptr;
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
		signal(SIGCHLD, SIG_DFL); // the tests reap their own children, not Ecore
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

bool name_reply(int code)
{
	return loop_until([&] { return fake_jotlog_count("return_cb: edbus_request_name: " + std::to_string(code)) == 1; });
}

using connection = std::unique_ptr<DBusConnection, decltype([](DBusConnection *c) {
	dbus_connection_close(c);
	dbus_connection_unref(c);
})>;

class VornDbus : public ::testing::Test {
protected:
	test_process bus; // stopped after the client has closed
	connection client;

	void SetUp() override
	{
		test_ap = test_batt = vorn_sensor{};
		test_ap.name = "ap", test_ap.temp = 47;
		test_batt.name = "batt", test_batt.temp = 31;
		test_info = vorn_info_t{};
		test_info.level = 3;
		test_info.flash_led_blocked = 1;
		fake_jotlog_clear();
	}
	void start_bus()
	{
		unlink((env->dir.path + "/bus").c_str());
		ASSERT_TRUE(bus.start({"dbus-daemon", "--config-file=" QOR_PRIVATE_BUS_CONF, "--nofork", "--address=" + env->address},
				      {}, "", env->dir.path + "/bus.err"));
		ASSERT_TRUE(test_wait_for([&] {
			client.reset(dbus_connection_open_private(env->address.c_str(), nullptr));
			return client != nullptr;
		}, 5s));
		ASSERT_TRUE(dbus_bus_register(client.get(), nullptr));
	}
	void TearDown() override { vorn_dbus_close(); }

	// busctl call on the thermal object while this thread runs the loop: the reply, or "failed".
	std::string call(const std::vector<std::string> &args)
	{
		std::vector<std::string> argv = {"busctl", "--system", "call", VORN_DBUS_NAME, VORN_DBUS_PATH, VORN_DBUS_INTERFACE};
		argv.insert(argv.end(), args.begin(), args.end());
		test_process p;
		int status = -1;
		p.start(argv, {}, env->dir.path + "/call.out", "/dev/null");
		loop_until([&] { return p.wait_exit(0ms, &status); }, 10s);
		return WIFEXITED(status) && WEXITSTATUS(status) == 0 ? test_read_file(env->dir.path + "/call.out") : "failed";
	}
};

TEST_F(VornDbus, BadArgumentsAndAMissingBusFailWithoutAborting)
{
	// No bus: a call that got as far as the bus would fail with -19 and "Err: dbus_bus_get".
	const char *P = VORN_DBUS_PATH, *I = VORN_DBUS_INTERFACE, *M = "ChangedVorn";
	const char *bad[][3] = {{nullptr, I, M}, {P, nullptr, M}, {P, I, nullptr}, {"", I, M}, {P, "", M},
				{P, I, ""}, {"Org/Vexel", I, M}, {P, "noperiod", M}, {P, I, "Changed.Vorn"}};
	for (const auto &b : bad) {
		EXPECT_EQ(vorn_dbus_broadcast_int32(b[0], b[1], b[2], 1), -22);
		EXPECT_EQ(vorn_dbus_broadcast_string(b[0], b[1], b[2], "Release"), -22);
	}
	// libdbus would abort the process on text that is not UTF-8.
	EXPECT_EQ(vorn_dbus_broadcast_string(P, I, "ChangedCooldownMode", "bad\xff"), -22);
	EXPECT_EQ(vorn_dbus_broadcast_string(P, I, "ChangedCooldownMode", nullptr), -22);
	EXPECT_EQ(fake_jotlog_count("Err: dbus_bus_get"), 0);

	const char *D = VORN_CORVAD_NAME, *DP = VORN_CORVAD_DISPLAY_PATH, *DI = VORN_CORVAD_DISPLAY_INTERFACE;
	EXPECT_EQ(vorn_dbus_broadcast_int32(P, I, M, 1), -19);
	EXPECT_EQ(vorn_dbus_send_int32(D, DP, DI, "SetMaxBrightness", 50), -74);
	EXPECT_EQ(vorn_dbus_setup(), -19);
	vorn_dbus_close();

	// The same process gets through once the bus is there; nobody owns the display service.
	start_bus();
	EXPECT_EQ(vorn_dbus_send_int32(D, DP, DI, "SetMaxBrightness", 70), -74);
	EXPECT_EQ(fake_jotlog_count("Failed to dbus_send_with_reply: [org.freedesktop.DBus.Error.ServiceUnknown:"), 1);
	// Names libdbus would abort on are refused instead.
	EXPECT_EQ(vorn_dbus_send_int32(D, "no/slash", DI, "SetMaxBrightness", 1), -1);
	EXPECT_EQ(vorn_dbus_send_int32(D, DP, nullptr, "SetMaxBrightness", 1), -1);
	EXPECT_EQ(vorn_dbus_send_int32(nullptr, DP, DI, "Set.Max", 1), -1);
	EXPECT_EQ(vorn_dbus_setup(), 0);
}

TEST_F(VornDbus, ServiceAnswersTheFourMethodsFromTheRecordAtCallTime)
{
	start_bus();
	ASSERT_EQ(vorn_dbus_setup(), 0);
	ASSERT_TRUE(name_reply(1));
	const std::vector<std::string> rows[] = {
		{"GetVornLevel", "i 3\n"}, {"GetFlashLedBlocked", "i 1\n"}, {"GetSensorTemp", "s", "ap", "i 47\n"},
		{"GetSensorTemp", "s", "nope", "i -99\n"}, {"GetCooldownTemp", "i -99\n"},
		// Eldbus refuses a call without the name before the handler runs; the service goes on.
		{"GetSensorTemp", "failed"}, {"GetSensorTemp", "s", "ap", "i 47\n"},
	};
	for (const auto &r : rows)
		EXPECT_EQ(call({r.begin(), r.end() - 1}), r.back()) << r[0];
	test_info.cooldown_sensor = &test_batt;
	test_info.level = 0;
	EXPECT_EQ(call({"GetCooldownTemp"}), "i 31\n");
	EXPECT_EQ(call({"GetVornLevel"}), "i 0\n");
}

TEST_F(VornDbus, NameRequestIsCancelledByCloseAndQueuedBehindAnotherOwner)
{
	start_bus();
	ASSERT_EQ(vorn_dbus_setup(), 0);
	vorn_dbus_close(); // before the answer
	EXPECT_EQ(fake_jotlog_count("Err: edbus_request_name: No msg: ["), 1);
	EXPECT_EQ(fake_jotlog_count("return_cb: edbus_request_name"), 0);
	EXPECT_FALSE(dbus_bus_name_has_owner(client.get(), VORN_DBUS_NAME, nullptr));

	ASSERT_EQ(dbus_bus_request_name(client.get(), VORN_DBUS_NAME, 0, nullptr), DBUS_REQUEST_NAME_REPLY_PRIMARY_OWNER);
	ASSERT_EQ(vorn_dbus_setup(), 0);
	EXPECT_TRUE(name_reply(2));
	// Once the other owner leaves, the queued request makes the service the owner.
	ASSERT_EQ(dbus_bus_release_name(client.get(), VORN_DBUS_NAME, nullptr), DBUS_RELEASE_NAME_REPLY_RELEASED);
	EXPECT_EQ(call({"GetVornLevel"}), "i 3\n");
}

TEST_F(VornDbus, SignalsComeFromTheOwnerOfTheName)
{
	start_bus();
	dbus_bus_add_match(client.get(), "type='signal',sender='org.vexel.qor',member='ChangedVorn'", nullptr);
	ASSERT_EQ(vorn_dbus_setup(), 0);
	ASSERT_TRUE(name_reply(1));
	// A listener that matches on the service's name receives the signal.
	EXPECT_EQ(vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedVorn", 4), 0);
	int received = 0;
	EXPECT_TRUE(loop_until([&] {
		dbus_connection_read_write(client.get(), 0);
		while (DBusMessage *m = dbus_connection_pop_message(client.get())) {
			received += dbus_message_is_signal(m, VORN_DBUS_INTERFACE, "ChangedVorn");
			dbus_message_unref(m);
		}
		return received == 1;
	}));
	EXPECT_EQ(fake_jotlog_count("Broadcast [ChangedVorn][4]"), 1);
}

} // namespace
