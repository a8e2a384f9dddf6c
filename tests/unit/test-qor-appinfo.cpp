// Application tracking: event parsing, pid bookkeeping, forwarding and lock release.
#include "qor_test_root.h"

#include "fake_jotlog.h"
#include "qor_appinfo.h"
#include "qor_main.h"

#include <gtest/gtest.h>

namespace {

class AppTracking : public ::testing::Test {
protected:
	qor_test_root root;
	int browser_pid()
	{
		qor_app a{};
		qor_app_get(0, &a);
		return a.pid;
	}
};

TEST(AppParsing, EventTypeNameAndPid)
{
	EXPECT_EQ(QOR_get_appinfo_type("appinfo_launch:x[PID]1"), QOR_APPINFO_LAUNCH);
	EXPECT_EQ(QOR_get_appinfo_type("xx appinfo_resume:[PID]1"), QOR_APPINFO_RESUME);
	// Two events on one connection: the test order of the prefixes decides.
	EXPECT_EQ(QOR_get_appinfo_type("appinfo_pause:[PID]1appinfo_terminated:[PID]1"), QOR_APPINFO_TERMINATED);
	EXPECT_EQ(QOR_get_appinfo_type("appinfo_launch"), QOR_APPINFO_NONE);

	char name[QOR_APP_NAME_SIZE];
	EXPECT_EQ(QOR_get_appname_from_str(name, "appinfo_launch:com.a[PID]5"), 0);
	EXPECT_STREQ(name, "com.a");
	EXPECT_EQ(QOR_get_appname_from_str(name, "appinfo_launch:com.a"), 0);
	EXPECT_STREQ(name, "com.a");
	EXPECT_EQ(QOR_get_appname_from_str(name, "appinfo_pause:[PID]5"), -1);
	EXPECT_STREQ(name, "");
	EXPECT_EQ(QOR_get_appname_from_str(name, "no colon[PID]5"), -1);

	int pid = 0;
	EXPECT_EQ(QOR_get_pid_from_str(&pid, "a:b[PID]812"), 0);
	EXPECT_EQ(pid, 812);
	fake_jotlog_clear();
	for (const char *bad : {"a:b[PID]0", "a:b", "a:b[PID]", "a:b[PID]-1"}) {
		pid = 7;
		EXPECT_EQ(QOR_get_pid_from_str(&pid, bad), -1) << bad;
		EXPECT_EQ(pid, 7);
	}
	EXPECT_EQ(fake_jotlog_count("[FAIL]"), 4);
}

TEST_F(AppTracking, LifeCycleOfTheBrowser)
{
	EXPECT_EQ(QOR_appinfo_Manager("appinfo_launch:com.vandrel.browser[PID]812"), 0);
	EXPECT_EQ(browser_pid(), 812);
	EXPECT_EQ(fake_jotlog_count("app_list_table[0].pid=812"), 1);
	EXPECT_EQ(QOR_appinfo_Manager("appinfo_pause:[PID]812"), 0);
	EXPECT_EQ(QOR_appinfo_Manager("appinfo_resume:com.vandrel.browser[PID]812"), 0);
	EXPECT_EQ(QOR_appinfo_Manager("appinfo_terminated:[PID]812"), 0);
	EXPECT_EQ(browser_pid(), -1);
	// Matched by pid only: after termination the pid is gone.
	EXPECT_EQ(QOR_appinfo_Manager("appinfo_pause:[PID]812"), -1);
	EXPECT_EQ(root.forwarded(), (std::vector<std::string>{
					    "appinfo_launch:com.vandrel.browser",
					    "appinfo_pause:com.vandrel.browser",
					    "appinfo_resume:com.vandrel.browser",
					    "appinfo_terminated:com.vandrel.browser",
				    }));
	// The browser asks for no CPU limits: nothing reached the nodes.
	EXPECT_EQ(test_read_file(root.pmqos("cpufreq_min")), "");
	EXPECT_EQ(test_read_file(root.pmqos("cpufreq_max")), "");
}

TEST_F(AppTracking, DroppedEventsForwardNothing)
{
	QOR_appinfo_Manager("appinfo_launch:com.vandrel.browser[PID]812");
	root.forwarded();
	const char *dropped[] = {
		"appinfo_launch:org.example.viewer[PID]5", // not listed
		"appinfo_resume:[PID]0",                   // no pid
		"appinfo_pause:[PID]77",                   // pid not registered
		"appinfo_pause:org.example.viewer[PID]812", // a named app is never replaced by the pid's
		"com.vandrel.browser[PID]812",             // no colon
		"appinfo_launch:com.vandrel.browser",      // no pid
	};
	for (const char *t : dropped)
		EXPECT_EQ(QOR_appinfo_Manager(t), -1) << t;
	EXPECT_EQ(QOR_appinfo_Manager(nullptr), -1);
	EXPECT_TRUE(root.forwarded().empty());
	EXPECT_EQ(browser_pid(), 812);
}

TEST_F(AppTracking, AListedAppWithoutAnEventPrefixForwardsAnEmptyText)
{
	EXPECT_EQ(QOR_appinfo_Manager("x:com.vandrel.browser[PID]5"), 0);
	EXPECT_EQ(root.forwarded(), std::vector<std::string>{""});
	EXPECT_EQ(fake_jotlog_count("appinfo_for_vorn = \n"), 1);
}

TEST_F(AppTracking, TerminationReleasesTheScenarioLockOfThatPid)
{
	Vexel_Resource_Manager("AppLaunchLock[PID]999");
	Vexel_Resource_Manager("HomeScreenLock[PID]999");
	root.forwarded();
	root.clear_nodes();
	// 999 is no listed application: the event itself is dropped, the lock is still released.
	EXPECT_EQ(QOR_appinfo_Manager("appinfo_terminated:[PID]999"), -1);
	qor_scenario s{};
	qor_scenario_get(QOR_get_scenario_index("AppLaunch"), &s);
	EXPECT_EQ(s.locked, 0);
	EXPECT_EQ(test_read_file(root.pmqos("cpufreq_min")), "-1 id2");
	// At most one scenario per event, the first by index.
	qor_scenario_get(QOR_get_scenario_index("HomeScreen"), &s);
	EXPECT_EQ(s.locked, 1);
	EXPECT_TRUE(root.forwarded().empty());
}

} // namespace
