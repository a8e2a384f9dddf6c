// Thermal core: boot-mode detection, on/off switch, the booting period and the start-up order.
#include "fake_vorn_dbus.h"
#include "test-vorn-root.h"
#include "vorn_core.h"

#include <unistd.h>

namespace {

using VornCore = VornTest;
using namespace std::chrono_literals;

int ap_threshold() { return vorn_sensor_at(0)->temp_table[0]; }

TEST_F(VornCore, BootModeFactoryBuildAndTheControlKey)
{
	for (auto [cmdline, charging] : {std::pair{"console=ttyS0 bootmode=charging\n", 1}, {"quiet", 0},
					 {"CHARGING", 0}}) {
		put("/proc/cmdline", cmdline);
		vorn_get_info()->poweroff_charging = 0;
		vorn_check_boot_mode(vorn_get_info());
		EXPECT_EQ(vorn_get_info()->poweroff_charging, charging) << cmdline;
		EXPECT_EQ(kmsg_take(), charging ? "[thermal] Poweroff charging mode\n" : "[thermal] Normal booting mode\n");
	}
	put("/var/lib/setstore/db/private/overheat/control", "1\n");
	put("/etc/bldcfg/factory", "");
	vorn_check_boot_mode(vorn_get_info());
	EXPECT_EQ(jot("> [thermal] Disable VORN (fac:1)\n"), 1);
	EXPECT_EQ(vorn_get_info()->enabled, 1); // only the key's change callback updates it
	for (int expected : {0, 1, 1}) {
		vorn_check_onoff();
		EXPECT_EQ(vorn_get_info()->enabled, expected);
		put("/var/lib/setstore/db/private/overheat/control", "7\n");
	}
	EXPECT_EQ(jot("VORN onoff set:"), 2); // logged on a change only
}

TEST_F(VornCore, BootingOffsetIsRemovedOnce)
{
	vorn_booting_timer_init();
	vorn_booting_timer_init(); // already running: no second offset
	EXPECT_EQ(ap_threshold(), 70);
	ASSERT_EQ(vorn_thermal_mornitor_init(), 0);
	// 180 s is 0.18 s at the test scale.
	ASSERT_TRUE(loop_until([] { return jot("booting_timer expired!") > 0; }, 5000ms));
	EXPECT_EQ(ap_threshold(), 60);
	EXPECT_EQ(vorn_booting_timer_remove(), 0); // gone already

	vorn_booting_timer_init();
	EXPECT_EQ(vorn_booting_timer_remove(), 1); // ended early by the removal command
	loop_until([] { return false; }, 400ms);
	EXPECT_EQ(jot("booting_timer expired!"), 1);
	EXPECT_EQ(jot("> [thermal] Adjust threshold:  -10\n"), 2);
	EXPECT_EQ(ap_threshold(), 60);
}

TEST_F(VornCore, StartUpOrderAndALoopThatRunsWithoutTheBus)
{
	put("/proc/cmdline", "bootmode=charging");
	fake_vorn_dbus.setup_result = -19;
	vorn_info_reset();
	ASSERT_NE(ecore_timer_add(0.05, [](void *) { return ecore_main_loop_quit(), ECORE_CALLBACK_CANCEL; }, nullptr),
		  nullptr);
	EXPECT_EQ(vorn_main(nullptr), nullptr);
	std::vector<std::string> kernel;
	for (const auto &l : fake_jotlog_lines())
		if (auto at = l.text.find("> [thermal] "); at != std::string::npos)
			kernel.push_back(l.text.substr(at + 12));
	const std::vector<std::string> expected = {
		"+++ VORN START +++\n", "Board Rev:10\n", "Poweroff charging mode\n",
		"booting_timer: adjust threshold for 180 sec\n", "Adjust threshold: +10\n",
		"[COOLDOWN] state: Booting -> Release\n", "[COLD] -99 -> 40\n", "+++ VORN LOOP ENTER +++\n",
		"--- VORN LOOP END ---\n", "--- VORN EXIT (0) ---\n",
	};
	EXPECT_EQ(kernel, expected);
	EXPECT_EQ(std::tuple(fake_vorn_dbus.setup_calls, fake_vorn_dbus.retry_calls, fake_vorn_dbus.close_calls),
		  std::tuple(1, 1, 1));
	EXPECT_GE(vorn_get_info()->log_seq, 1); // the first cycle ran before the bus set-up
}

} // namespace
