// The thermal service on an emulated phone: qor-server under the socket activator with qor-devsim
// and a private bus the test restarts; busctl and dbus-monitor play the platform's clients, and
// the display-call and broadcast helpers run in this process against the same bus.
#include "test_support.h"
#include "vorn_dbus.h"

#include <cstdlib>
#include <gtest/gtest.h>
#include <unistd.h>

using namespace std::chrono_literals;

namespace {

int count_of(const std::string &text, const std::string &needle)
{
	int n = 0;
	for (size_t pos = text.find(needle); pos != std::string::npos; pos = text.find(needle, pos + 1))
		n++;
	return n;
}

TEST(Phone, ThermalServiceAnswersCallsAndComesBackAfterBusRestart)
{
	test_tmpdir dir;
	const std::string root = dir.path + "/root", bus_path = dir.path + "/bus";
	auto at = [&](const std::string &rel) { return dir.path + "/" + rel; };
	// libdbus reads the bus address once per process: the restarted bus keeps the socket path.
	setenv("DBUS_SYSTEM_BUS_ADDRESS", ("unix:path=" + bus_path).c_str(), 1);
	setenv("JOTLOG_FILE", at("test-jotlog").c_str(), 1);
	for (const char *d : {"proc", "dev/socket", "var/lib/setstore/db/private/overheat", "sys"})
		ASSERT_TRUE(test_mkdirs(root + "/" + d));
	test_write_file(root + "/proc/cmdline", "console=ttyS0\n");
	test_write_file(root + "/proc/cpuinfo", "Processor\t: ARMv7\nRevision\t: 000a\n");
	test_write_file(root + "/var/lib/setstore/db/private/overheat/control", "1\n");

	// The output is emptied first: text left by an earlier start is no sign of readiness.
	auto start_until = [&](test_process &p, const std::vector<std::string> &argv, const std::string &name, const std::string &ready) {
		return test_write_file(at(name + ".out"), "") && p.start(argv, {}, at(name + ".out"), at(name + ".err")) &&
		       test_wait_for([&] { return count_of(test_read_file(at(name + ".out")), ready) > 0; }, 10s);
	};
	test_process bus, devsim, daemon, monitor;
	auto start_bus = [&] {
		unlink(bus_path.c_str());
		return start_until(bus, {"dbus-daemon", "--config-file=" QOR_PRIVATE_BUS_CONF, "--print-address", "--nofork",
					 "--address=unix:path=" + bus_path}, "bus", "unix:");
	};
	ASSERT_TRUE(start_bus());
	ASSERT_TRUE(start_until(devsim, {test_build_dir() + "/qor-devsim", "--root", root, "--journal", root + "/journal"},
				"devsim", "qor-devsim: ready")) << test_read_file(at("devsim.err"));

	// Display calls are answered by the device daemon (qor-devsim here).
	for (const auto &[method, value] : {std::pair{"SetMaxBrightness", 70}, std::pair{"SetAutoToneForce", 1}})
		EXPECT_EQ(vorn_dbus_send_int32(VORN_CORVAD_NAME, VORN_CORVAD_DISPLAY_PATH, VORN_CORVAD_DISPLAY_INTERFACE, method, value), 0);
	EXPECT_TRUE(test_wait_for([&] {
		std::string journal = test_read_file(root + "/journal");
		return count_of(journal, " dbus SetMaxBrightness 70\n") == 1 && count_of(journal, " dbus SetAutoToneForce 1\n") == 1;
	}, 5s)) << test_read_file(root + "/journal");
	EXPECT_EQ(count_of(test_read_file(at("test-jotlog")), "SetMaxBrightness: reply:0"), 1);

	// The daemon, started by the activator on the first connection.
	std::vector<std::string> argv = {"systemd-socket-activate", "-l" + root + "/dev/socket/scenario_info",
					 "-l" + root + "/dev/socket/app_info"};
	for (const std::string &e : {"QOR_SYSROOT=" + root, "JOTLOG_FILE=" + root + "/jotlog", std::string("VORN_TIME_SCALE=0.01"),
				     std::string("ECORE_NO_SYSTEM_MODULES=1"), "DBUS_SYSTEM_BUS_ADDRESS=unix:path=" + bus_path})
		argv.push_back("-E" + e);
	argv.push_back(test_build_dir() + "/qor-server");
	ASSERT_TRUE(daemon.start(argv, {}, at("daemon.out"), at("daemon.err")));
	ASSERT_TRUE(test_wait_for([&] { return test_send_unix(root + "/dev/socket/scenario_info", ""); }, 5s));
	auto logged = [&](const std::string &text, int times) {
		return test_wait_for([&] { return count_of(test_read_file(root + "/jotlog"), text) == times; }, 10s);
	};
	ASSERT_TRUE(logged("return_cb: edbus_request_name: 1", 1)) << test_read_file(root + "/jotlog");

	auto ap_is = [&](const char *arg, const std::string &reply) {
		return test_wait_for([&] {
			test_process p;
			return p.start({"busctl", "--system", "call", VORN_DBUS_NAME, VORN_DBUS_PATH, VORN_DBUS_INTERFACE,
					"GetSensorTemp", "s", arg}, {}, at("call.out"), "/dev/null") &&
			       p.wait_exit(10s, nullptr) && test_read_file(at("call.out")) == reply;
		}, 10s);
	};
	// The emulated phone's ap sensor reads 40; names match without regard to case; replies follow
	// the node from one polling cycle to the next.
	EXPECT_TRUE(ap_is("AP", "i 40\n"));
	ASSERT_TRUE(test_write_file(root + "/sys/class/xun/temperature/ap_therm", "52\n"));
	EXPECT_TRUE(ap_is("ap", "i 52\n"));
	ASSERT_EQ(vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "BlockFlashLed", 0), 0);

	bus.stop();
	ASSERT_TRUE(logged("Err: system bus connection lost", 1));
	ASSERT_TRUE(start_bus());
	EXPECT_TRUE(ap_is("ap", "i 52\n")) << test_read_file(root + "/jotlog");
	EXPECT_TRUE(daemon.running());
	EXPECT_TRUE(logged("add new obj for org.vexel.qor.vorn", 2) && logged("return_cb: edbus_request_name: 1", 2));

	// This process' broadcast connection died with the old bus: the signals go out on a fresh one.
	ASSERT_TRUE(start_until(monitor, {"dbus-monitor", "--system", "type='signal'"}, "monitor", "member=NameLost"));
	EXPECT_EQ(vorn_dbus_broadcast_int32(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedTemperature", -125), 0);
	EXPECT_EQ(vorn_dbus_broadcast_string(VORN_DBUS_PATH, VORN_DBUS_INTERFACE, "ChangedCooldownMode", "ShutDown"), 0);
	const std::string head = "path=/Org/Vexel/Qor/Vorn; interface=org.vexel.qor.vorn; member=";
	EXPECT_TRUE(test_wait_for([&] {
		std::string seen = test_read_file(at("monitor.out"));
		return count_of(seen, head + "ChangedTemperature\n   int32 -125\n") == 1 &&
		       count_of(seen, head + "ChangedCooldownMode\n   string \"ShutDown\"\n") == 1;
	}, 5s)) << test_read_file(at("monitor.out"));
	vorn_dbus_close();
}

} // namespace
