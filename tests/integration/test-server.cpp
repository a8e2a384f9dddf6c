// qor-server under the real socket activator on a temporary root: socket identification,
// requests reaching the PM-QoS nodes, application events, forwarding, slow and parallel clients.
#include "test_support.h"

#include <cstring>
#include <fstream>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

using namespace std::chrono_literals;

namespace {

const char *pmqos_nodes[] = {"cpufreq_min", "cpufreq_max", "cpu_online_min", "cpu_online_max",
			     "bus_mif_freq_min", "cpu_freq_up_threshold"};

int count_of(const std::string &text, const std::string &needle)
{
	int n = 0;
	for (size_t at = text.find(needle); at != std::string::npos; at = text.find(needle, at + 1))
		n++;
	return n;
}

class Server : public ::testing::Test {
protected:
	test_tmpdir dir;
	test_process daemon;
	int vorn_fd = -1;

	std::string root() { return dir.path; }
	std::string scenario_sock() { return root() + "/dev/socket/scenario_info"; }
	std::string app_sock() { return root() + "/dev/socket/app_info"; }
	std::string pmqos(const std::string &n) { return root() + "/sys/devices/system/cpu/cpufreq/pmqos/" + n; }
	std::string log() { return test_read_file(root() + "/jotlog"); }

	void SetUp() override
	{
		test_mkdirs(root() + "/sys/devices/system/cpu/cpufreq/pmqos");
		test_mkdirs(root() + "/sys/power");
		test_mkdirs(root() + "/dev/socket");
		for (const char *n : pmqos_nodes)
			test_write_file(pmqos(n), "");
		test_write_file(root() + "/sys/power/gpufreq_min_limit", "");
		test_write_file(root() + "/sys/power/gpufreq_max_limit", "");
		// The test plays the thermal side's event socket.
		vorn_fd = test_listen_unix(root() + "/dev/socket/vorn");
		ASSERT_GE(vorn_fd, 0);
	}
	void TearDown() override
	{
		daemon.stop();
		close(vorn_fd);
	}

	std::vector<std::string> env()
	{
		return {"QOR_SYSROOT=" + root(), "JOTLOG_FILE=" + root() + "/jotlog", "ECORE_NO_SYSTEM_MODULES=1",
			"DBUS_SYSTEM_BUS_ADDRESS=unix:path=" + root() + "/no-bus"};
	}

	// Starts the daemon behind the activator on the given socket paths and wakes it with one
	// empty connection to the first of them.
	void start_activated(const std::vector<std::string> &paths)
	{
		std::vector<std::string> argv = {"systemd-socket-activate"};
		for (const char *e : {"QOR_SYSROOT", "JOTLOG_FILE", "ECORE_NO_SYSTEM_MODULES", "DBUS_SYSTEM_BUS_ADDRESS"})
			argv.push_back(std::string("-E") + e);
		for (const auto &p : paths)
			argv.push_back("-l" + p);
		argv.push_back(test_build_dir() + "/qor-server");
		ASSERT_TRUE(daemon.start(argv, env(), root() + "/stdout", root() + "/stderr"));
		ASSERT_TRUE(test_wait_for([&] { return access(paths[0].c_str(), F_OK) == 0; }, 5s));
		ASSERT_TRUE(test_wait_for([&] { return test_send_unix(paths[0], ""); }, 5s));
		ASSERT_TRUE(test_wait_for([&] { return !log().empty(); }, 5s)) << test_read_file(root() + "/stderr");
	}

	bool wait_log(const std::string &needle, int count = 1)
	{
		return test_wait_for([&] { return count_of(log(), needle) >= count; }, 5s);
	}

	// Texts the daemon forwarded to the thermal socket, one per connection, within the timeout.
	std::vector<std::string> forwarded(size_t want) { return test_accept_texts(vorn_fd, want, 5s); }

	int exit_status()
	{
		int st = 0;
		if (!daemon.wait_exit(5s, &st))
			return -1000;
		return WIFEXITED(st) ? WEXITSTATUS(st) : -2000;
	}
};

TEST_F(Server, BothSocketsInEitherOrderAreIdentified)
{
	for (bool swapped : {false, true}) {
		SCOPED_TRACE(swapped ? "app first" : "scenario first");
		if (swapped)
			start_activated({app_sock(), scenario_sock()});
		else
			start_activated({scenario_sock(), app_sock()});
		ASSERT_TRUE(test_send_unix(scenario_sock(), "AppLaunch[START][PID]1234"));
		ASSERT_TRUE(test_wait_for([&] { return test_read_file(pmqos("cpufreq_min")) == "1200000 id2"; }, 5s));
		EXPECT_EQ(test_read_file(pmqos("cpu_online_min")), "2 id2");
		ASSERT_TRUE(test_send_unix(app_sock(), "appinfo_launch:com.vandrel.browser[PID]812"));
		EXPECT_TRUE(wait_log("app_list_table[0].pid=812"));
		EXPECT_TRUE(daemon.running());
		daemon.stop();
		forwarded(2);
		unlink((root() + "/jotlog").c_str());
		for (const char *n : pmqos_nodes)
			test_write_file(pmqos(n), "");
	}
}

TEST_F(Server, WrongSetsOfSocketsFailAtStepOne)
{
	struct {
		std::vector<std::string> paths;
		const char *message;
	} cases[] = {
		{{scenario_sock(), scenario_sock()}, "Too many scenario info sockets passed."},
		{{app_sock(), scenario_sock(), app_sock()}, "Too many app info sockets passed."},
		{{scenario_sock(), app_sock(), root() + "/dev/socket/other"}, "Unknown socket passed."},
	};
	for (const auto &c : cases) {
		SCOPED_TRACE(c.message);
		start_activated(c.paths);
		EXPECT_EQ(exit_status(), 255);
		std::string l = log();
		EXPECT_EQ(count_of(l, c.message), 1) << l;
		EXPECT_EQ(count_of(l, "main(") , 1);
		EXPECT_EQ(count_of(l, "> running_step=1 ret=-22"), 1) << l;
		unlink((root() + "/jotlog").c_str());
	}
}

TEST_F(Server, BrokenActivationEnvironmentFailsAtStepOne)
{
	std::string cmd = "LISTEN_PID=$$ LISTEN_FDS=abc exec " + test_build_dir() + "/qor-server";
	ASSERT_TRUE(daemon.start({"sh", "-c", cmd}, env()));
	EXPECT_EQ(exit_status(), 255);
	EXPECT_EQ(count_of(log(), "> Failed to read listening file descriptors from environment: Invalid argument"), 1)
		<< log();
	EXPECT_EQ(count_of(log(), "running_step=1 ret=-22"), 1);
}

TEST_F(Server, MissingSocketsParkTheirThreadWithoutSpinning)
{
	// No socket at all: both request threads have nothing to accept on.
	ASSERT_TRUE(daemon.start({test_build_dir() + "/qor-server"}, env()));
	ASSERT_TRUE(wait_log("accept failed", 2));
	std::this_thread::sleep_for(1s);
	ASSERT_TRUE(daemon.running());
	std::string l = log();
	EXPECT_EQ(count_of(l, "QOR_scenario_thread") , 1);
	EXPECT_EQ(count_of(l, "QOR_app_info_thread"), 1);
	// A spinning thread would burn most of the second; a parked one uses next to nothing.
	std::ifstream stat("/proc/" + std::to_string(daemon.pid) + "/stat");
	std::string field;
	long ticks = 0;
	for (int i = 1; i <= 15 && stat >> field; i++)
		if (i == 14 || i == 15)
			ticks += std::stol(field);
	EXPECT_LT(ticks, 30);
}

TEST_F(Server, ScenarioAndApplicationTrafficEndToEnd)
{
	start_activated({scenario_sock(), app_sock()});
	forwarded(0);
	ASSERT_TRUE(test_send_unix(scenario_sock(), "AppLaunch[START][PID]999"));
	ASSERT_TRUE(wait_log("[RECEIVE]AppLaunch[START][PID]999"));
	ASSERT_TRUE(test_send_unix(scenario_sock(), "GpuWakeupLock"));
	ASSERT_TRUE(test_send_unix(app_sock(), "appinfo_launch:com.vandrel.browser[PID]812"));
	ASSERT_TRUE(test_send_unix(app_sock(), "appinfo_pause:[PID]812"));
	ASSERT_TRUE(test_send_unix(app_sock(), "appinfo_resume:[PID]812"));
	ASSERT_TRUE(test_send_unix(app_sock(), "appinfo_terminated:[PID]812"));
	// A terminated process releases the scenario it held.
	ASSERT_TRUE(test_send_unix(app_sock(), "appinfo_terminated:[PID]999"));
	auto texts = forwarded(6);
	// The two request threads run independently: compare each one's order on its own.
	std::vector<std::string> scen, app;
	for (const auto &t : texts)
		(t.rfind("appinfo_", 0) == 0 ? app : scen).push_back(t);
	EXPECT_EQ(scen, (std::vector<std::string>{"AppLaunchLock", "GpuWakeupLock"}));
	EXPECT_EQ(app, (std::vector<std::string>{"appinfo_launch:com.vandrel.browser", "appinfo_pause:com.vandrel.browser",
						 "appinfo_resume:com.vandrel.browser",
						 "appinfo_terminated:com.vandrel.browser"}));
	EXPECT_TRUE(test_wait_for([&] { return test_read_file(pmqos("cpufreq_min")).rfind("-1 id2", 0) == 0; }, 5s));
	EXPECT_EQ(count_of(log(), "[RECEIVE]GpuWakeup"), 0);

}

TEST_F(Server, SilentAndOversizedClientsDoNotHoldUpOthers)
{
	start_activated({scenario_sock(), app_sock()});
	// A burst of clients that connect and never write: the request behind them waits for a
	// short bound per client, not for a full time-out each (that took about 8 s).
	std::vector<int> silent;
	sockaddr_un addr{};
	addr.sun_family = AF_UNIX;
	strncpy(addr.sun_path, scenario_sock().c_str(), sizeof addr.sun_path - 1);
	for (int i = 0; i < 8; i++) {
		silent.push_back(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
		ASSERT_EQ(connect(silent.back(), reinterpret_cast<sockaddr *>(&addr), sizeof addr), 0);
	}
	ASSERT_TRUE(test_send_unix(scenario_sock(), "HomeScreen[START][PID]3"));
	EXPECT_TRUE(test_wait_for([&] { return test_read_file(pmqos("cpufreq_min")) == "1000000 id8"; }, 4s));
	EXPECT_TRUE(wait_log("QOR_scenario_thread(") && count_of(log(), "recv failed") >= 9);
	for (int fd : silent)
		close(fd);

	std::string big = "IMEInput[START][PID]42" + std::string(100, 'z');
	ASSERT_TRUE(test_send_unix(scenario_sock(), big));
	EXPECT_TRUE(wait_log("[RECEIVE]" + big.substr(0, 63) + "\n"));
	EXPECT_TRUE(test_wait_for([&] { return test_read_file(pmqos("cpu_online_min")).rfind("2 id21", 0) == 0; }, 5s));
}

TEST_F(Server, SixteenConcurrentClientsAreAllServed)
{
	start_activated({scenario_sock(), app_sock()});
	std::vector<std::thread> clients;
	for (int i = 0; i < 16; i++)
		clients.emplace_back([&, i] {
			std::string msg = "MusicScroll[START][PID]" + std::to_string(1000 + i);
			for (int tries = 0; tries < 50 && !test_send_unix(scenario_sock(), msg); tries++)
				std::this_thread::sleep_for(10ms);
		});
	for (auto &t : clients)
		t.join();
	EXPECT_TRUE(wait_log("[RECEIVE]MusicScroll[START][PID]", 16));
	for (int i = 0; i < 16; i++)
		EXPECT_EQ(count_of(log(), "[RECEIVE]MusicScroll[START][PID]" + std::to_string(1000 + i) + "\n"), 1);
	EXPECT_EQ(forwarded(16).size(), 16u);
}

} // namespace
