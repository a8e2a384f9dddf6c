// Cooldown state machine, the held ShutDown decision, emergency holds, cold and flash-LED rules.
#include "fake_vorn_dbus.h"
#include "test-vorn-root.h"
#include "tollmgr.h"
#include "vorn_core.h"
#include "vorn_setstore.h"

#include <cstring>

namespace {

using namespace std::chrono_literals;
using Strings = std::vector<std::string>;
constexpr char KEY[] = "memory/private/overheat/vorn_noti_type";

class VornCooldown : public VornTest {
protected:
	void SetUp() override
	{
		VornTest::SetUp();
		ASSERT_EQ(tollmgr_init("test-vorn"), 0);
		vorn_get_info()->gate_log = -1;
	}
	void TearDown() override
	{
		for (int *id : {&vorn_shutdown_delay_alarm_id, &vorn_emergency_alarm_id})
			if (*id > 0)
				tollmgr_remove_alarm(*id), *id = 0;
		VornTest::TearDown();
	}
	static void state(const char *name) { strcpy(vorn_get_info()->cooldown_mode, name); }
	// One step with steady readings (no rise, so no warning).
	static void step(int ap, int batt)
	{
		for (auto [i, t] : {std::pair{0, ap}, {1, batt}})
			vorn_sensor_at(i)->temp = vorn_sensor_at(i)->prev_temp = t;
		vorn_check_cooldown_mode();
	}
	static int key()
	{
		int v = -1;
		return vorn_setstore_get_int(KEY, &v) == 0 ? v : -1;
	}
};

TEST_F(VornCooldown, TransitionTable)
{
	const std::string sig = "ChangedCooldownMode ";
	struct Row {
		const char *from;
		int ap, batt, delay, enabled;
		const char *to, *decider;
		int key;
		const char *line;
	} rows[] = {
		{"Booting", 40, 35, 60, 1, "Release", nullptr, 0, "[COOLDOWN] state: Booting -> Release\n"},
		{"LimitAction", 70, 65, 60, 1, "Release", nullptr, 0, "[COOLDOWN] state: LimitAction -> Release\n"},
		{"Release", 75, 80, 0, 1, "ShutDown", "batt", 1, "[COOLDOWN] \"batt\" state: Release -> ShutDown (t:80)\n"},
		{"Booting", 85, 99, 0, 1, "ShutDown", "ap", 1, "[COOLDOWN] \"ap\" state: Booting -> ShutDown (t:85)\n"},
		{"Release", 76, 76, 60, 1, "LimitAction", "ap", 1, "\"ap\" state: Release -> LimitAction (t:76)\n"},
		{"Release", 75, 77, 60, 1, "LimitAction", "batt", 1, "\"batt\" state: Release -> LimitAction (t:77)\n"},
		{"Release", 72, 40, 60, 1, "Release", nullptr, -1, nullptr},    // warning band: no decision
		{"LimitAction", 80, 40, 60, 1, "LimitAction", "ap", -1, nullptr}, // same state
		{"Release", 90, 40, 60, 0, "Release", nullptr, -1, nullptr},    // disabled
		{"ShutDown", 40, 35, 60, 1, "ShutDown", nullptr, -1, "[COOLDOWN] Already Shutdown requested!!\n"},
	};
	for (const Row &r : rows) {
		SCOPED_TRACE(std::string(r.from) + " " + std::to_string(r.ap) + "/" + std::to_string(r.batt));
		unlink(real("/var/lib/setstore/" + std::string(KEY)).c_str());
		fake_vorn_dbus_reset();
		fake_jotlog_clear();
		kmsg_take();
		state(r.from);
		vorn_get_info()->shutdown_delay = r.delay;
		vorn_get_info()->enabled = r.enabled;
		vorn_get_info()->cooldown_sensor = nullptr;
		step(r.ap, r.batt);
		EXPECT_STREQ(vorn_get_info()->cooldown_mode, r.to);
		const vorn_sensor *d = vorn_get_info()->cooldown_sensor;
		EXPECT_STREQ(d ? d->name : nullptr, r.decider);
		EXPECT_EQ(key(), r.key);
		const bool changed = strcmp(r.from, r.to) != 0;
		EXPECT_EQ(fake_vorn_dbus.signals, changed ? Strings{sig + r.to} : Strings{});
		EXPECT_EQ(jot("DEVICE_OVERHEATING"), changed && r.key == 1);
		std::string kmsg = kmsg_take();
		if (r.line)
			EXPECT_NE(kmsg.find(r.line), std::string::npos) << kmsg;
		else
			EXPECT_EQ(kmsg, "");
	}
}

TEST_F(VornCooldown, WarningOncePerExcursion)
{
	const std::string warn = "[COOLDOWN] state: Warning (t:";
	vorn_sensor *ap = vorn_sensor_at(0);
	auto rise = [&](int t) { ap->prev_temp = ap->temp, ap->temp = t, vorn_check_cooldown_mode(); };
	step(40, 35); // Booting -> Release: warnings only from Release on
	for (int t : {72, 73, 74, 70, 71, 60, 72})
		rise(t);
	// Re-armed only by the cool cycles at 70 and 60.
	EXPECT_EQ(jot(warn), 3);
	EXPECT_EQ(jot(warn + "72)"), 2);
	EXPECT_EQ(jot(warn + "71)"), 1);
	EXPECT_EQ(vorn_check_warning_temp(nullptr), 0);
}

TEST_F(VornCooldown, ShutDownIsHeldForTheDelayAndConfirmed)
{
	step(40, 35);
	step(86, 40);
	EXPECT_GT(vorn_shutdown_delay_alarm_id, 0);
	step(87, 40); // the alarm is kept: seconds left from its due time
	EXPECT_EQ(jot("[COOLDOWN] wait shutdown until 60s (Release -> ShutDown, t:86)"), 1);
	EXPECT_EQ(jot("[COOLDOWN] wait shutdown until "), 2);
	step(76, 40); // a fall back drops the hold and commits LimitAction
	EXPECT_EQ(jot("[COOLDOWN] remove shutdown timer"), 1);
	EXPECT_EQ(vorn_shutdown_delay_alarm_id, 0);
	EXPECT_STREQ(vorn_get_info()->cooldown_mode, "LimitAction");

	step(86, 40);
	put("/sys/class/xun/temperature/ap_therm", "temp: 60\n"); // fresh reading at expiry: cool again
	vorn_shutdown_delay_alarm_cb(vorn_shutdown_delay_alarm_id, nullptr);
	EXPECT_EQ(jot("[COOLDOWN] exit from ShutDown state"), 1);
	EXPECT_STREQ(vorn_get_info()->cooldown_mode, "LimitAction");
	EXPECT_EQ(vorn_shutdown_delay_alarm_id, 0);

	step(86, 40);
	put("/sys/class/xun/temperature/ap_therm", "temp: 88\n");
	vorn_get_info()->enabled = 0; // the expiry commits regardless
	int seq = vorn_get_info()->log_seq;
	fake_vorn_dbus_reset();
	// 60 s is 0.06 s at the test scale.
	ASSERT_TRUE(loop_until([] { return strcmp(vorn_get_info()->cooldown_mode, "ShutDown") == 0; }, 5000ms));
	EXPECT_EQ(jot("[WAKEUP] shutdown delay alarm expired (interval:60s)"), 2);
	EXPECT_EQ(jot("\"ap\" state: LimitAction -> ShutDown (t:88)"), 1);
	EXPECT_EQ(fake_vorn_dbus.signals, Strings{"ChangedCooldownMode ShutDown"});
	EXPECT_EQ(vorn_get_info()->log_seq, seq + 1);
	EXPECT_EQ(vorn_shutdown_delay_alarm_id, 0);
	vorn_get_info()->enabled = 1;
	step(40, 35); // final
	EXPECT_STREQ(vorn_get_info()->cooldown_mode, "ShutDown");
}

TEST_F(VornCooldown, ShutDownIsCommittedWhenTheDelayCannotBeArmed)
{
	vorn_get_info()->shutdown_delay = -1; // refused by the alarm service
	step(40, 35);
	step(86, 40);
	EXPECT_EQ(jot("[COOLDOWN] Failed to add shutdown delay timer: -22"), 1);
	EXPECT_EQ(vorn_shutdown_delay_alarm_id, 0);
	EXPECT_STREQ(vorn_get_info()->cooldown_mode, "ShutDown");
}

TEST_F(VornCooldown, EmergencyHoldsEscalationButNotRelease)
{
	vorn_info_t *info = vorn_get_info();
	step(40, 35);
	info->ecm = 1;
	step(76, 40);
	info->ecm = 0;
	info->emergency_call = 1;
	step(76, 40);
	ASSERT_EQ(tollmgr_add_alarm_withcb(2, 100, 0, vorn_emergency_alarm_cb, nullptr, &vorn_emergency_alarm_id), 0);
	step(86, 40);
	EXPECT_EQ(jot("[COOLDOWN] ECM... ignore by [1/0] (Release -> LimitAction, t:76)"), 1);
	EXPECT_EQ(jot("[COOLDOWN] now emergency call... ignore (Release -> LimitAction, t:76)"), 1);
	EXPECT_EQ(jot("[COOLDOWN] delayed for 100s (Release -> ShutDown, t:86)"), 1);
	EXPECT_EQ(vorn_shutdown_delay_alarm_id, 0);
	EXPECT_STREQ(info->cooldown_mode, "Release");

	state("LimitAction");
	step(40, 35);
	EXPECT_STREQ(info->cooldown_mode, "Release");

	vorn_sensor_at(0)->temp = 77; // the call ends: the held escalation goes through
	vorn_emergency_alarm_cb(vorn_emergency_alarm_id, nullptr);
	EXPECT_EQ(jot("[WAKEUP] emergency alarm expired (interval:0s)"), 1);
	EXPECT_EQ(std::tuple(info->emergency_call, vorn_emergency_alarm_id), std::tuple(0, 0));
	EXPECT_STREQ(info->cooldown_mode, "LimitAction");
}

TEST_F(VornCooldown, ColdNotifyAndFlashLedBand)
{
	vorn_sensor *ap = vorn_sensor_at(0), *batt = vorn_sensor_at(1);
	ap->temp = 5;
	for (int t : {2, -1, -3, 1, 4}) {
		ap->prev_temp = ap->temp, ap->temp = t;
		vorn_check_cold_notify(ap);
	}
	for (int t : {-4, -5, -5, 49, 50, 55, 55}) {
		batt->temp = t;
		vorn_check_limit_flash_led(batt);
		EXPECT_EQ(vorn_get_info()->flash_led_blocked, t <= -5 || t >= 50) << t;
	}
	EXPECT_EQ(fake_vorn_dbus.signals,
		  (Strings{"ChangedTemperature -10", "ChangedTemperature -30", "ChangedTemperature 10", "BlockFlashLed 1",
			   "BlockFlashLed 0", "BlockFlashLed 1"}));
	EXPECT_EQ(jot("[COLD] -1 -> -3"), 1);
	vorn_check_cold_notify(nullptr);
	vorn_check_limit_flash_led(nullptr);
	EXPECT_EQ(jot("Invalid arg"), 2);
}

} // namespace
