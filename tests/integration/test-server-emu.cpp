// Scenario locks on the emulated phone: requests of several identities stand side by side in the
// PM-QoS nodes and the effective values read back as the kernel combines them.
#include "test_support.h"

#include <csignal>
#include <cstring>
#include <gtest/gtest.h>

using namespace std::chrono_literals;

namespace {

class ServerOnPhone : public ::testing::Test {
protected:
	test_emu emu;
	void SetUp() override { ASSERT_TRUE(emu.start()) << test_read_file(emu.root() + "/emu.err"); }
	void TearDown() override { EXPECT_EQ(emu.stop(), 0); }

	std::string node(const std::string &n)
	{
		return emu.root() + "/sys/devices/system/cpu/cpufreq/pmqos/" + n;
	}
	// Effective value of a node, as the emulated kernel reports it.
	std::string effective(const std::string &n) { return test_read_file(node(n)); }
	bool send(const std::string &text)
	{
		return test_send_unix(emu.root() + "/dev/socket/scenario_info", text);
	}
	bool becomes(const std::string &path, const std::string &value)
	{
		return test_wait_for([&] { return test_read_file(path) == value; }, 5s);
	}
};

TEST_F(ServerOnPhone, IdentitiesStandSideBySideAndReleaseOnlyTheirOwn)
{
	ASSERT_TRUE(send("HomeScreen[START][PID]10")); // cpufreq_min 1000000 id8, cpu_online_min 2
	ASSERT_TRUE(becomes(node("cpufreq_min"), "1000000\n"));
	ASSERT_TRUE(send("AppLaunch[START][PID]11")); // cpufreq_min 1200000 id2
	EXPECT_TRUE(becomes(node("cpufreq_min"), "1200000\n"));
	EXPECT_EQ(effective("cpu_online_min"), "2\n");
	ASSERT_TRUE(send("AppLaunch[END][PID]11"));
	EXPECT_TRUE(becomes(node("cpufreq_min"), "1000000\n")); // id8 still stands
	EXPECT_EQ(effective("cpu_online_min"), "2\n");
	ASSERT_TRUE(send("HomeScreen[END][PID]10"));
	EXPECT_TRUE(becomes(node("cpufreq_min"), "0\n"));
	EXPECT_TRUE(becomes(node("cpu_online_min"), "1\n"));

	// The journal has each write under its own identity, in order.
	std::string j = emu.journal();
	size_t a = j.find("/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min 1000000 id8");
	size_t b = j.find("/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min 1200000 id2");
	size_t c = j.find("/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min -1 id2");
	size_t d = j.find("/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min -1 id8");
	ASSERT_NE(d, std::string::npos) << j;
	EXPECT_TRUE(a < b && b < c && c < d);
}

TEST_F(ServerOnPhone, CeilingsReachTheCpuAndTheGpu)
{
	ASSERT_TRUE(send("PowerSaving[START][PID]20"));
	EXPECT_TRUE(becomes(node("cpufreq_max"), "1000000\n"));
	EXPECT_TRUE(becomes(emu.root() + "/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq", "1000000\n"));
	ASSERT_TRUE(send("UltraPowerSaving[START][PID]20"));
	EXPECT_TRUE(becomes(emu.root() + "/sys/power/gpufreq_max_limit", "256000\n"));
	ASSERT_TRUE(send("PowerSaving[END][PID]20"));
	EXPECT_TRUE(test_wait_for([&] { return emu.journal().find("cpufreq_max -1 id5") != std::string::npos; }, 5s));
	EXPECT_EQ(effective("cpufreq_max"), "1000000\n"); // UltraPowerSaving's id6 still caps
	ASSERT_TRUE(send("UltraPowerSaving[END][PID]20"));
	EXPECT_TRUE(becomes(node("cpufreq_max"), "2147483647\n"));
	EXPECT_TRUE(becomes(emu.root() + "/sys/power/gpufreq_max_limit", "-1\n"));
}

// Ecore's handlers run on the thermal thread only (a TSan build also runs this): each signal
// ends the thermal loop and then the process, SIGHUP and SIGUSR1 included.
TEST(ServerSignals, EndTheThermalLoopAndTheProcess)
{
	for (int sig : {SIGTERM, SIGHUP, SIGUSR1}) {
		SCOPED_TRACE(strsignal(sig));
		test_emu emu;
		ASSERT_TRUE(emu.start()) << test_read_file(emu.root() + "/emu.err");
		ASSERT_TRUE(test_wait_for([&] { return emu.jotlog().find("+++ VORN LOOP ENTER +++") != std::string::npos; },
					  30s));
		std::string pid = test_read_file(emu.root() + "/qor-server.pid");
		pid.erase(pid.find_last_not_of('\n') + 1);
		ASSERT_EQ(kill(std::stoi(pid), sig), 0);
		std::string ended = "qor-server (" + pid + ") has ended";
		EXPECT_TRUE(test_wait_for(
			[&] { return test_read_file(emu.root() + "/emu.err").find(ended) != std::string::npos; }, 30s));
		EXPECT_NE(emu.jotlog().find("--- VORN EXIT (0) ---"), std::string::npos) << emu.jotlog();
		std::string out = test_read_file(emu.root() + "/qor-server.log");
		EXPECT_EQ(out.find("ThreadSanitizer"), std::string::npos) << out;
		EXPECT_EQ(emu.stop(), 0);
	}
}

} // namespace
