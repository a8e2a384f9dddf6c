// The lock engine entered from three threads at once, as the scenario, application and thermal
// threads do. Run under ThreadSanitizer; the end state must also be consistent.
#include "qor_test_root.h"

#include "qor_appinfo.h"
#include "qor_main.h"

#include <atomic>
#include <gtest/gtest.h>
#include <thread>

namespace {

TEST(LockEngineRace, ThreeThreadsLeaveAConsistentTable)
{
	qor_test_root root;
	constexpr int rounds = 300;
	QOR_set_scenario_value("GalleryScroll", 6, 2);
	QOR_set_scenario_value("ContactScroll", 7, 3);

	// The thermal side's reader: forwarded events are drained while the threads run.
	std::atomic<bool> done{false};
	std::thread reader([&] {
		while (!done)
			root.forwarded();
	});
	std::thread scenario([&] {
		for (int i = 0; i < rounds; i++) {
			Vexel_Resource_Manager("GalleryScrollLock[PID]700");
			Vexel_Resource_Manager("AppLaunchLock[PID]701");
			Vexel_Resource_Manager("GalleryScrollUnlock");
			Vexel_Resource_Manager("ContactScrollLock[PID]702");
			Vexel_Resource_Manager("ContactScrollUnlock");
		}
	});
	std::thread app_info([&] {
		char text[64];
		for (int i = 0; i < rounds; i++) {
			snprintf(text, sizeof text, "appinfo_launch:com.vandrel.browser[PID]%d", 800 + i);
			QOR_appinfo_Manager(text);
			snprintf(text, sizeof text, "appinfo_terminated:[PID]%d", 800 + i);
			QOR_appinfo_Manager(text);
			// Releases AppLaunch whenever the scenario thread last locked it for pid 701.
			QOR_appinfo_Manager("appinfo_terminated:[PID]701");
		}
	});
	std::thread thermal([&] {
		for (int i = 0; i < rounds; i++) {
			QOR_set_scenario_value("VORN", 1, 1000000 + i);
			QOR_set_scenario_value("VORN", 7, i % 7);
			Vexel_Resource_Manager("VORNLock");
		}
	});
	scenario.join();
	app_info.join();
	thermal.join();
	done = true;
	reader.join();

	// Everything the scenario thread locked it also unlocked, except AppLaunch which only the
	// terminated-pid rule may have released.
	qor_scenario s{};
	qor_scenario_get(QOR_get_scenario_index("GalleryScroll"), &s);
	EXPECT_EQ(s.locked, 0);
	qor_scenario_get(QOR_get_scenario_index("ContactScroll"), &s);
	EXPECT_EQ(s.locked, 0);
	qor_scenario_get(QOR_get_scenario_index("VORN"), &s);
	EXPECT_EQ(s.locked, 1);
	EXPECT_EQ(s.cpufreq_max, 1000000 + rounds - 1);
	qor_app a{};
	qor_app_get(0, &a);
	EXPECT_EQ(a.pid, -1);

	// The GPU nodes hold what the last recomputation decided for the final table: only VORN is
	// locked with a GPU level, (rounds - 1) % 7 = 5.
	int level = (rounds - 1) % 7;
	Vexel_Resource_Manager("VORNLock");
	std::string min_node = test_read_file(root.node("/sys/power/gpufreq_min_limit"));
	std::string max_node = test_read_file(root.node("/sys/power/gpufreq_max_limit"));
	EXPECT_EQ(std::stoi(min_node), 6); // no locked row asks for a minimum level
	EXPECT_EQ(std::stoi(max_node), level);
	root.forwarded();
}

} // namespace
