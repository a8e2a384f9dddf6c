// The thermal service on an emulated phone: qor-server under the socket activator with qor-devsim
// and a private bus the test can restart; busctl and dbus-monitor play the platform's clients.
#include "test_support.h"
#include "vorn_dbus.h"

#include <cstdlib>
#include <filesystem>
#include <gtest/gtest.h>
#include <unistd.h>

using namespace std::chrono_literals;

namespace {

// libdbus reads the bus address once per process (the in-process broadcasts and calls below), so
// every test keeps its bus at the same socket path.
struct phone_env : ::testing::Environment {
	test_tmpdir dir;
	void SetUp() override
	{
		setenv("DBUS_SYSTEM_BUS_ADDRESS", ("unix:path=" + dir.path + "/bus").c_str(), 1);
		setenv("JOTLOG_FILE", (dir.path + "/test-jotlog").c_str(), 1);
	}
};
phone_env *env = static_cast<phone_env *>(::testing::AddGlobalTestEnvironment(new phone_env));

std::string at(const std::string &rel)
{
	return env->dir.path + "/" + rel;
}

// busctl call on the thermal object; its output and error text.
std::string vorn_call(const std::vector<std::string> &args, int *status = nullptr)
{
	std::vector<std::string> argv = {"busctl", "--system", "call", VORN_DBUS_NAME, VORN_DBUS_PATH, VORN_DBUS_INTERFACE};
	argv.insert(argv.end(), args.begin(), args.end());
	test_process p;
	int st = -1;
	if (!p.start(argv, {}, at("cmd.out"), at("cmd.err")) || !p.wait_exit(10s, &st))
		p.stop();
	if (status)
		*status = st;
	return test_read_file(at("cmd.out")) + test_read_file(at("cmd.err"));
}

int count_of(const std::string &text, const std::string &needle)
{
	int n = 0;
	for (size_t pos = text.find(needle); pos != std::string::npos; pos = text.find(needle, pos + 1))
		n++;
	return n;
}

// The number logged right after key ("" when key is absent).
std::string logged_number(const std::string &log, const std::string &key)
{
	size_t pos = log.find(key);
	if (pos == std::string::npos)
		return "";
	pos += key.size();
	return log.substr(pos, log.find_first_not_of("-0123456789", pos) - pos);
}

std::string signal_text(const char *member, const std::string &arg)
{
	return std::string("path=/Org/Vexel/Qor/Vorn; interface=org.vexel.qor.vorn; member=") + member + "\n   " + arg + "\n";
}

// Private bus and qor-devsim (emulated kernel and display service); the daemon when a test asks.
class Phone : public ::testing::Test {
protected:
	std::string root = at("root");
	test_process bus, devsim, daemon, monitor;

	std::string jotlog() { return test_read_file(root + "/jotlog"); }

	// Output files are emptied first: text left by the previous test is no sign of readiness.
	bool start_until(test_process &p, const std::vector<std::string> &argv, const std::string &name,
			 const std::string &ready)
	{
		test_write_file(at(name + ".out"), "");
		return p.start(argv, {}, at(name + ".out"), at(name + ".err")) &&
		       test_wait_for([&] { return test_read_file(at(name + ".out")).find(ready) != std::string::npos; }, 10s);
	}
	bool start_bus()
	{
		unlink(at("bus").c_str());
		return start_until(bus, {"dbus-daemon", "--config-file=" QOR_PRIVATE_BUS_CONF, "--print-address", "--nofork",
					 "--address=unix:path=" + at("bus")},
				   "bus", "unix:");
	}
	bool start_monitor()
	{
		monitor.stop();
		return start_until(monitor, {"dbus-monitor", "--system", "type='signal'"}, "monitor", "member=NameLost");
	}

	void SetUp() override
	{
		std::filesystem::remove_all(root);
		for (const char *d : {"proc", "dev/socket", "var/lib/setstore/db/private/overheat", "sys"})
			ASSERT_TRUE(test_mkdirs(root + "/" + d));
		test_write_file(root + "/proc/cmdline", "console=ttyS0\n");
		test_write_file(root + "/proc/cpuinfo", "Processor\t: ARMv7\nRevision\t: 000a\n");
		test_write_file(root + "/var/lib/setstore/db/private/overheat/control", "1\n");
		ASSERT_TRUE(start_bus());
		ASSERT_TRUE(start_until(devsim, {test_build_dir() + "/qor-devsim", "--root", root, "--journal", root + "/journal"},
					"devsim", "qor-devsim: ready"))
			<< test_read_file(at("devsim.err"));
	}

	void start_daemon()
	{
		std::vector<std::string> argv = {"systemd-socket-activate"};
		for (const std::string &e : std::vector<std::string>{
			     "QOR_SYSROOT=" + root, "JOTLOG_FILE=" + root + "/jotlog", "VORN_TIME_SCALE=0.01",
			     "ECORE_NO_SYSTEM_MODULES=1", std::string("DBUS_SYSTEM_BUS_ADDRESS=") + getenv("DBUS_SYSTEM_BUS_ADDRESS")})
			argv.push_back("-E" + e);
		argv.push_back("-l" + root + "/dev/socket/scenario_info");
		argv.push_back("-l" + root + "/dev/socket/app_info");
		argv.push_back(test_build_dir() + "/qor-server");
		ASSERT_TRUE(daemon.start(argv, {}, at("daemon.out"), at("daemon.err")));
		// The activator starts the daemon on the first connection.
		ASSERT_TRUE(test_wait_for([&] { return test_send_unix(root + "/dev/socket/scenario_info", ""); }, 5s));
		ASSERT_TRUE(test_wait_for([&] { return count_of(jotlog(), "return_cb: edbus_request_name: 1") == 1; }, 10s))
			<< jotlog();
	}

	void TearDown() override
	{
		vorn_dbus_close();
		monitor.stop();
		daemon.stop();
		devsim.stop();
		bus.stop();
	}
};

TEST_F(Phone, DaemonAnswersTheFourMethods)
{
	start_daemon();
	// The emulated phone's sensors read ap 40, batt 35, xo 38; names match without regard to case.
	EXPECT_EQ(vorn_call({"GetSensorTemp", "s", "ap"}), "i 40\n");
	EXPECT_EQ(vorn_call({"GetSensorTemp", "s", "AP"}), "i 40\n");
	EXPECT_EQ(vorn_call({"GetSensorTemp", "s", "batt"}), "i 35\n");
	EXPECT_EQ(vorn_call({"GetSensorTemp", "s", "nope"}), "i -99\n");
	EXPECT_EQ(count_of(jotlog(), "Invalid sensor name: nope"), 1);
	EXPECT_EQ(vorn_call({"GetFlashLedBlocked"}), "i 0\n");

	// Level and cooldown sensor belong to the thermal core: the reply is what it holds and logs.
	std::string level = vorn_call({"GetVornLevel"});
	std::string logged = logged_number(jotlog(), "request vorn level:");
	ASSERT_NE(logged, "") << jotlog();
	EXPECT_EQ(level, "i " + logged + "\n");
	size_t before = jotlog().size();
	std::string cooldown = vorn_call({"GetCooldownTemp"});
	std::string log = jotlog().substr(before);
	if (log.find("[DBUS] Request ") != std::string::npos)
		EXPECT_EQ(cooldown, "i " + logged_number(log, " temp:") + "\n") << log;
	else
		EXPECT_TRUE(cooldown == "i -99\n" && count_of(log, "[DBUS] device did not enter cooldown mode") == 1)
			<< cooldown << log;

	// Eldbus refuses a call without the name; the daemon keeps serving.
	int status = 0;
	vorn_call({"GetSensorTemp"}, &status);
	EXPECT_NE(status, 0);
	EXPECT_EQ(vorn_call({"GetSensorTemp", "s", "xo"}), "i 38\n");

	// Replies follow the node from one polling cycle to the next.
	ASSERT_TRUE(test_write_file(root + "/sys/class/xun/temperature/ap_therm", "52\n"));
	EXPECT_TRUE(test_wait_for([&] { return vorn_call({"GetSensorTemp", "s", "ap"}) == "i 52\n"; }, 5s));
}

TEST_F(Phone, DaemonAndBroadcastsComeBackAfterBusRestart)
{
	start_daemon();
	ASSERT_EQ(vorn_call({"GetSensorTemp", "s", "ap"}), "i 40\n");
	ASSERT_EQ(vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "BlockFlashLed", 0), 0);
	bus.stop();
	ASSERT_TRUE(test_wait_for([&] { return count_of(jotlog(), "Err: system bus connection lost") >= 1; }, 5s));
	ASSERT_TRUE(start_bus());

	EXPECT_TRUE(test_wait_for([&] { return vorn_call({"GetSensorTemp", "s", "ap"}) == "i 40\n"; }, 10s)) << jotlog();
	EXPECT_TRUE(daemon.running());
	EXPECT_EQ(count_of(jotlog(), "add new obj for org.vexel.qor.vorn"), 2);
	EXPECT_EQ(count_of(jotlog(), "return_cb: edbus_request_name: 1"), 2);

	// The broadcasts' connection died with the old bus: the next signal goes out on a fresh one.
	ASSERT_TRUE(start_monitor());
	EXPECT_EQ(vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "SetDynamicFps", 60), 0);
	EXPECT_TRUE(test_wait_for([&] { return count_of(test_read_file(at("monitor.out")), signal_text("SetDynamicFps", "int32 60")) == 1; }, 5s));
}

TEST_F(Phone, BroadcastsSeenByBusMonitor)
{
	ASSERT_TRUE(start_monitor());
	EXPECT_EQ(vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedVorn", 2), 0);
	EXPECT_EQ(vorn_dbus_broadcast_string(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "", "ShutDown"), -22);
	EXPECT_EQ(vorn_dbus_broadcast_string(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedCooldownMode", "ShutDown"), 0);
	EXPECT_EQ(vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedTemperature", -125), 0);

	std::string seen;
	EXPECT_TRUE(test_wait_for([&] {
		seen = test_read_file(at("monitor.out"));
		return count_of(seen, signal_text("ChangedVorn", "int32 2")) == 1 &&
		       count_of(seen, signal_text("ChangedCooldownMode", "string \"ShutDown\"")) == 1 &&
		       count_of(seen, signal_text("ChangedTemperature", "int32 -125")) == 1;
	}, 5s)) << seen;
	// Nothing else was sent by a client: the refused broadcast never reached the bus.
	EXPECT_EQ(count_of(seen, " sender=:"), 3) << seen;
}

TEST_F(Phone, DisplayCallsAnsweredByTheDeviceDaemon)
{
	for (const auto &[method, value] : {std::pair{"SetMaxBrightness", 70}, std::pair{"SetAutoToneForce", 1}})
		EXPECT_EQ(vorn_dbus_send_int32(VORN_CORVAD_NAME, VORN_CORVAD_DISPLAY_PATH, VORN_CORVAD_DISPLAY_INTERFACE,
					       method, value),
			  0);
	EXPECT_TRUE(test_wait_for([&] {
		std::string journal = test_read_file(root + "/journal");
		return count_of(journal, " dbus SetMaxBrightness 70\n") == 1 && count_of(journal, " dbus SetAutoToneForce 1\n") == 1;
	}, 5s)) << test_read_file(root + "/journal");
	EXPECT_EQ(count_of(test_read_file(at("test-jotlog")), "SetMaxBrightness: reply:0"), 1);
}

} // namespace
