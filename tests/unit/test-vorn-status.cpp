// Status line and gate logging, on the real wake-up alarm service and Ecore timers.
#include "test-vorn-root.h"
#include "vorn_core.h"

#include <unistd.h>

namespace {

using VornStatus = VornTest;
using namespace std::chrono_literals;

TEST_F(VornStatus, StatusLineLayout)
{
	vorn_read_sensors();
	vorn_info_t *info = vorn_get_info();
	info->mode = 6;
	info->level = 4;
	info->charging = 1;
	info->applied_limits = {1000000, 2, -2, 80, 100, 0, 60};
	unlink(real("/sys/class/power_supply/battery/capacity").c_str()); // unreadable: -1
	vorn_print_status_log();
	// A pmqos cap of 2147483647 means no cap and shows as -1.
	EXPECT_EQ(kmsg_take(),
		  "[thermal] [0] [6/4/1/Booting] 40/35/38/45000 [1000000 2 -2 80 100 0 60 ] [-1/1400000/-1/1]\n");

	// Sixteen sensors at extreme values: body and line are cut, never overrun.
	vorn_sensor many[17] = {};
	for (int i = 0; i < 16; i++)
		many[i] = {i, "s", "", nullptr, 0, 0, -2147483647 - 1, nullptr, 0, 0, 0, {}};
	many[16].id = -1;
	info->sensors = many;
	info->sensor_count = 17;
	vorn_print_status_log();
	EXPECT_EQ(kmsg_take().size(), 254u);
	info->sensors = nullptr;
}

TEST_F(VornStatus, GateSamplingByAlarmOrAtEveryCycle)
{
	vorn_wakeup_alarm_init();
	vorn_gate_log_set(20); // 20 ms at the test scale
	ASSERT_TRUE(loop_until([] { return jot("<GATE-M>DEVICETEMP_40/35</GATE-M>") >= 3; }, 5000ms));
	EXPECT_EQ(vorn_get_info()->log_seq, 0); // sampling writes no status line
	vorn_gate_log_set(0);
	int samples = jot("[WAKEUP] gate log alarm expired");
	loop_until([] { return false; }, 200ms); // ten periods
	EXPECT_EQ(jot("[WAKEUP] gate log alarm expired"), samples);

	vorn_gate_log_set(-1); // a line at every polling cycle instead
	fake_jotlog_clear();
	ASSERT_EQ(vorn_thermal_mornitor_init(), 0); // 30 ms at the test scale
	ASSERT_TRUE(loop_until([] { return vorn_get_info()->log_seq >= 4; }, 5000ms));
	vorn_thermal_stop();
	EXPECT_EQ(jot("<GATE-M>DEVICETEMP_40/35</GATE-M>"), vorn_get_info()->log_seq);
	EXPECT_EQ(jot("[WAKEUP]"), 0);
}

} // namespace
