// Scenario table and lock engine against a temporary root.
#include "qor_test_root.h"

#include "fake_jotlog.h"
#include "qor_appinfo.h"
#include "qor_main.h"
#include "vorn/vorn_client.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

namespace {

// Node writes in the order the engine made them, as logged by QOR_set_id_sysfs and sys_set_int.
std::vector<std::string> node_writes(const std::string &root)
{
	std::vector<std::string> writes;
	for (const auto &l : fake_jotlog_lines()) {
		if (l.text.find("QOR_set_id_sysfs(") == std::string::npos &&
		    l.text.find("sys_set_int(") == std::string::npos)
			continue;
		std::string w = l.text.substr(l.text.find(" > ") + 3);
		if (w.rfind(root, 0) == 0)
			w = w.substr(root.size());
		w = w.substr(w.rfind('/') + 1);
		writes.push_back(w);
	}
	return writes;
}

class LockEngine : public ::testing::Test {
protected:
	qor_test_root root;
	qor_scenario row(const char *name)
	{
		qor_scenario s{};
		qor_scenario_get(QOR_get_scenario_index(name), &s);
		return s;
	}
};

TEST_F(LockEngine, LookupsAndTheVornRow)
{
	EXPECT_EQ(QOR_get_scenario_index("AppLaunch"), 2);
	EXPECT_EQ(QOR_get_scenario_index("ReservedMode"), 22);
	EXPECT_EQ(QOR_get_scenario_index("applaunch"), -1);
	EXPECT_EQ(QOR_get_scenario_index("AppLaunchX"), -1);
	EXPECT_EQ(QOR_set_scenario_value("Nope", 1, 5), -1);
	// which 5 and unknown selectors change nothing.
	qor_scenario before = row("HomeScreen");
	EXPECT_EQ(QOR_set_scenario_value("HomeScreen", 5, 777), 0);
	EXPECT_EQ(QOR_set_scenario_value("HomeScreen", 99, 777), 0);
	qor_scenario after = row("HomeScreen");
	EXPECT_EQ(memcmp(&before, &after, sizeof before), 0);
	// The thermal row's identity clashes with no scenario and no application.
	int vorn = QOR_get_scenario_index("VORN");
	ASSERT_GE(vorn, 0);
	EXPECT_EQ(qor_scenario_lock_id(vorn), QOR_get_scenario_count() + QOR_get_app_count());
}

TEST_F(LockEngine, LockWritesNodesInOrderWithIdentityAndForwards)
{
	EXPECT_EQ(Vexel_Resource_Manager("AppLaunchLock[PID]1234"), 0);
	EXPECT_EQ(node_writes(root.dir.path), (std::vector<std::string>{"cpu_online_min 2 id2", "cpufreq_min 1200000 id2"}));
	EXPECT_EQ(test_read_file(root.pmqos("cpu_online_min")), "2 id2");
	EXPECT_EQ(test_read_file(root.pmqos("cpufreq_min")), "1200000 id2");
	EXPECT_EQ(test_read_file(root.pmqos("cpufreq_max")), "");
	qor_scenario s = row("AppLaunch");
	EXPECT_EQ(s.locked, 1);
	EXPECT_EQ(s.pid, 1234);
	EXPECT_EQ(root.forwarded(), std::vector<std::string>{"AppLaunchLock"});
	EXPECT_EQ(fake_jotlog_count("> AppLaunchLock[PID]1234"), 1);

	root.clear_nodes();
	fake_jotlog_clear();
	EXPECT_EQ(Vexel_Resource_Manager("AppLaunchUnlock"), 0);
	EXPECT_EQ(node_writes(root.dir.path), (std::vector<std::string>{"cpu_online_min -1 id2", "cpufreq_min -1 id2"}));
	s = row("AppLaunch");
	EXPECT_EQ(s.locked, 0);
	EXPECT_EQ(s.pid, 1234);
	EXPECT_EQ(root.forwarded(), std::vector<std::string>{"AppLaunchUnlock"});
}

TEST_F(LockEngine, OneFlagPerScenarioAndTheLastRealPid)
{
	Vexel_Resource_Manager("BrowserScrollLock[PID]10");
	Vexel_Resource_Manager("BrowserScrollLock[PID]11");
	Vexel_Resource_Manager("BrowserScrollLock[PID]0");
	Vexel_Resource_Manager("BrowserScrollLock[PID]abc");
	EXPECT_EQ(row("BrowserScroll").pid, 11);
	Vexel_Resource_Manager("BrowserScrollUnlock[PID]12");
	EXPECT_EQ(row("BrowserScroll").locked, 0); // one unlock releases every lock
	EXPECT_EQ(row("BrowserScroll").pid, 12);
}

TEST_F(LockEngine, UnknownAndMalformedRequestsAreForwardedAndReportedAsFailures)
{
	struct {
		const char *request;
		const char *forwarded;
		bool logged;
	} cases[] = {
		{"GpuWakeupLock", "GpuWakeupLock", false},
		{"Hello[PID]5", "Hello", true},
		{"Lock", "Lock", true},           // empty name
		{"NoSuchUnlock", "NoSuchUnlock", true},
		{"", "", true},
	};
	for (const auto &c : cases) {
		fake_jotlog_clear();
		SCOPED_TRACE(c.request);
		EXPECT_EQ(Vexel_Resource_Manager(c.request), -1);
		EXPECT_EQ(root.forwarded(), std::vector<std::string>{c.forwarded});
		EXPECT_EQ(fake_jotlog_count("Vexel_Resource_Manager fail"), 1);
		EXPECT_EQ(fake_jotlog_count(std::string("> ") + c.request) > 0, c.logged);
	}
	EXPECT_TRUE(node_writes(root.dir.path).empty());
}

TEST_F(LockEngine, VornRequestsApplyUnderTheirOwnIdentityAndAreNeverForwarded)
{
	int id = qor_scenario_lock_id(QOR_get_scenario_index("VORN"));
	// All limits untouched at start: the lock writes nothing.
	EXPECT_EQ(Vexel_Resource_Manager("VORNLock"), 0);
	EXPECT_TRUE(node_writes(root.dir.path).empty());
	QOR_set_scenario_value("VORN", 1, 900000);
	QOR_set_scenario_value("VORN", 3, 2);
	EXPECT_EQ(Vexel_Resource_Manager("VORNLock"), 0);
	std::string sid = " id" + std::to_string(id);
	EXPECT_EQ(node_writes(root.dir.path), (std::vector<std::string>{"cpu_online_max 2" + sid, "cpufreq_max 900000" + sid}));
	// -1 releases the thermal cap.
	QOR_set_scenario_value("VORN", 1, -1);
	fake_jotlog_clear();
	Vexel_Resource_Manager("VORNLock");
	EXPECT_EQ(node_writes(root.dir.path)[1], "cpufreq_max -1" + sid);
	EXPECT_TRUE(root.forwarded().empty());
}

TEST_F(LockEngine, UltraPowerSavingCapsTheGpuBeforeTheLookup)
{
	Vexel_Resource_Manager("UltraPowerSavingLock");
	EXPECT_EQ(node_writes(root.dir.path), (std::vector<std::string>{"gpufreq_max_limit 256000", "cpufreq_max 1000000 id6"}));
	fake_jotlog_clear();
	Vexel_Resource_Manager("UltraPowerSavingUnlock");
	EXPECT_EQ(node_writes(root.dir.path), (std::vector<std::string>{"gpufreq_max_limit -1", "cpufreq_max -1 id6"}));
}

TEST_F(LockEngine, GpuLevelsCombineAcrossLockedRowsAndWriteOnlyChanges)
{
	QOR_set_scenario_value("HomeScreen", 6, 3); // min level 3
	QOR_set_scenario_value("ImageViewer", 6, 1);
	QOR_set_scenario_value("ImageViewer", 7, 2); // max level 2
	Vexel_Resource_Manager("HomeScreenLock");
	EXPECT_EQ(test_read_file(root.node("/sys/power/gpufreq_min_limit")), "3");
	EXPECT_EQ(test_read_file(root.node("/sys/power/gpufreq_max_limit")), ""); // 0 was already there

	root.clear_nodes();
	Vexel_Resource_Manager("ImageViewerLock");
	// min = max(min(3,1), 2) = 2; max = 2
	EXPECT_EQ(test_read_file(root.node("/sys/power/gpufreq_min_limit")), "2");
	EXPECT_EQ(test_read_file(root.node("/sys/power/gpufreq_max_limit")), "2");

	root.clear_nodes();
	Vexel_Resource_Manager("ImageViewerUnlock");
	EXPECT_EQ(test_read_file(root.node("/sys/power/gpufreq_min_limit")), "3");
	EXPECT_EQ(test_read_file(root.node("/sys/power/gpufreq_max_limit")), "0");

	root.clear_nodes();
	Vexel_Resource_Manager("HomeScreenUnlock");
	EXPECT_EQ(test_read_file(root.node("/sys/power/gpufreq_min_limit")), "6");
	EXPECT_EQ(test_read_file(root.node("/sys/power/gpufreq_max_limit")), "");
}

TEST_F(LockEngine, AMissingNodeStopsTheLockAtTheFirstFailure)
{
	unlink(root.pmqos("cpu_online_min").c_str());
	EXPECT_EQ(QOR_set_Lock(QOR_get_scenario_index("AppLaunch")), -1);
	EXPECT_EQ(row("AppLaunch").locked, 1);
	EXPECT_EQ(test_read_file(root.pmqos("cpufreq_min")), ""); // later node not written
	EXPECT_EQ(fake_jotlog_count("sys_write_buf: file:"), 1);
	EXPECT_EQ(fake_jotlog_count("No such file or directory."), 1);
	EXPECT_EQ(fake_jotlog_count("fail err=-1"), 2);
	// Nothing was created in place of the node.
	EXPECT_EQ(access(root.pmqos("cpu_online_min").c_str(), F_OK), -1);
	EXPECT_EQ(QOR_set_Lock(-1), -1);
	EXPECT_EQ(QOR_set_Unlock(QOR_SCENARIO_ROWS), -1);
}


TEST(EventClient, ResultsAndTheBoundedWaitOnAFullBacklog)
{
	EXPECT_EQ(vorn_send_event(nullptr), -22);
	{
		test_tmpdir dir;
		setenv("QOR_SYSROOT", dir.path.c_str(), 1);
		EXPECT_EQ(vorn_send_event("x"), -5); // nothing listening
	}
	qor_test_root root;
	EXPECT_EQ(vorn_send_event(""), 0);
	EXPECT_EQ(vorn_send_event("HeavyLoadLock"), 0);
	EXPECT_EQ(root.forwarded(), (std::vector<std::string>{"", "HeavyLoadLock"}));

	// A reader that never accepts: once its backlog is full, sends fail instead of hanging.
	listen(root.vorn_fd, 0);
	int ret = 0;
	for (int i = 0; i < 8 && ret == 0; i++)
		ret = vorn_send_event("x");
	EXPECT_EQ(ret, -5);
	root.forwarded();
}

} // namespace
