// The thermal thread of the real daemon on the emulated phone: start-up, one booting period, the
// status cycle and the stop on SIGTERM, read from the kernel log.
#include "test_support.h"

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <gtest/gtest.h>
#include <sstream>

using namespace std::chrono_literals;

namespace {

// Kernel-log records in order, without their final line end.
std::vector<std::string> kmsg(const test_emu &emu)
{
	std::vector<std::string> records;
	std::istringstream journal(emu.journal());
	for (std::string line; std::getline(journal, line);)
		if (auto at = line.find(" /dev/kmsg "); at != std::string::npos && line.size() >= at + 13)
			records.push_back(line.substr(at + 11, line.size() - at - 13));
	return records;
}

int count(const test_emu &emu, const std::string &record)
{
	auto r = kmsg(emu);
	return static_cast<int>(std::count(r.begin(), r.end(), record));
}

// The daemon at VORN_TIME_SCALE 0.01: polling every 0.3 s, a booting period of 1.8 s.
TEST(VornOnPhone, OneBootingPeriodThenSigtermEndsTheLoopAndTheProcess)
{
	test_emu emu;
	ASSERT_TRUE(emu.start(0.01)) << test_read_file(emu.root() + "/emu.err");
	ASSERT_TRUE(test_wait_for([&] { return count(emu, "[thermal] booting_timer expired!") == 1; }, 20s));
	auto records = kmsg(emu);
	EXPECT_EQ(std::find(records.begin(), records.end(), "[thermal] +++ VORN LOOP ENTER +++") - records.begin(), 8);
	EXPECT_EQ(records[5], "[thermal] [COOLDOWN] state: Booting -> Release");
	EXPECT_EQ(records[7].rfind("[thermal] [0] [0/-1/1/Release] 40/35/38/45000 [", 0), 0u) << records[7];
	EXPECT_EQ(count(emu, "[thermal] Adjust threshold: +10"), 1);
	EXPECT_EQ(count(emu, "[thermal] Adjust threshold:  -10"), 1);

	pid_t daemon = static_cast<pid_t>(std::stol(test_read_file(emu.root() + "/qor-server.pid")));
	ASSERT_EQ(kill(daemon, SIGTERM), 0);
	ASSERT_TRUE(test_wait_for([daemon] { // gone, or a zombie the launcher has still to reap
		std::string stat = test_read_file("/proc/" + std::to_string(daemon) + "/stat");
		return stat.empty() || stat.substr(stat.rfind(") ") + 2, 1) == "Z";
	}, 5000ms));
	records = kmsg(emu);
	ASSERT_GE(records.size(), 2u);
	EXPECT_EQ(records[records.size() - 2], "[thermal] --- VORN LOOP END ---");
	EXPECT_EQ(records.back(), "[thermal] --- VORN EXIT (0) ---");
	emu.stop();
}

// Status-line sequence numbers and temperature fields, in order.
std::vector<std::pair<int, std::string>> status_lines(const test_emu &emu)
{
	std::vector<std::pair<int, std::string>> lines;
	for (const auto &r : kmsg(emu)) {
		int seq;
		char temps[64];
		if (sscanf(r.c_str(), "[thermal] [%d] [%*[^]]] %63s [", &seq, temps) == 2)
			lines.emplace_back(seq, temps);
	}
	return lines;
}

TEST(VornOnPhone, FactoryChargingBootWithAFailingSensor)
{
	test_emu emu;
	const std::string &root = emu.dir.path;
	ASSERT_TRUE(test_mkdirs(root + "/etc/bldcfg") && test_write_file(root + "/etc/bldcfg/factory", ""));
	ASSERT_TRUE(test_mkdirs(root + "/proc") && test_write_file(root + "/proc/cmdline", "quiet bootmode=charging\n"));
	ASSERT_TRUE(emu.start(0.01)) << test_read_file(root + "/emu.err");
	EXPECT_TRUE(test_wait_for([&] { return count(emu, "[thermal] Disable VORN (fac:1)") == 1; }, 10s));
	EXPECT_EQ(count(emu, "[thermal] factory mode"), 1);
	EXPECT_EQ(count(emu, "[thermal] Poweroff charging mode"), 1);
	EXPECT_EQ(test_read_file(root + "/var/lib/setstore/db/private/overheat/control").substr(0, 1), "0");

	// The battery sensor's reads fail from now on: the cycle carries on with 30 degrees.
	ASSERT_TRUE(test_write_file(root + "/sys/class/xun/temperature/batt_therm", "fail"));
	EXPECT_TRUE(test_wait_for([&] {
		auto lines = status_lines(emu);
		return !lines.empty() && lines.back().second == "40/30/38/45000";
	}, 10s));
	auto lines = status_lines(emu);
	for (size_t i = 0; i < lines.size(); i++)
		EXPECT_EQ(lines[i].first, static_cast<int>(i)); // one more per line, from 0
	EXPECT_EQ(emu.stop(), 0);
}

// A full excursion at scale 0.01: the 60 s shutdown delay lasts 0.6 s.
TEST(VornOnPhone, ExcursionToAHeldThenCommittedShutDown)
{
	test_emu emu;
	const std::string root = emu.dir.path, ap = root + "/sys/class/xun/temperature/ap_therm";
	const std::string key = root + "/var/lib/setstore/memory/private/overheat/vorn_noti_type";
	auto seen = [&](const std::string &record) {
		return test_wait_for([&] { return count(emu, "[thermal] " + record) >= 1; }, 20s);
	};
	ASSERT_TRUE(emu.start(0.01)) << test_read_file(root + "/emu.err");
	ASSERT_TRUE(seen("booting_timer expired!")); // base thresholds from here on
	ASSERT_TRUE(seen("[COOLDOWN] state: Booting -> Release"));
	EXPECT_EQ(test_read_file(key).substr(0, 1), "0");
	test_process monitor;
	const std::string monitored = root + "/monitor.out";
	ASSERT_TRUE(monitor.start({"dbus-monitor", "--system", "type='signal'"}, emu.env(), monitored, "/dev/null"));
	ASSERT_TRUE(test_wait_for([&] { return test_read_file(monitored).find("member=NameLost") != std::string::npos; },
				  10s));
	ASSERT_TRUE(test_write_file(ap, "72"));
	ASSERT_TRUE(seen("[COOLDOWN] state: Warning (t:72)"));
	ASSERT_TRUE(test_write_file(ap, "76"));
	ASSERT_TRUE(seen("[COOLDOWN] \"ap\" state: Release -> LimitAction (t:76)"));
	EXPECT_EQ(test_read_file(key).substr(0, 1), "1");
	ASSERT_TRUE(test_write_file(ap, "86"));
	ASSERT_TRUE(seen("[COOLDOWN] \"ap\" state: LimitAction -> ShutDown (t:86)"));

	auto r = kmsg(emu);
	auto at = [&](const std::string &record) { return std::find(r.begin(), r.end(), "[thermal] " + record) - r.begin(); };
	auto first_wait = at("[COOLDOWN] wait shutdown until 60s (LimitAction -> ShutDown, t:86)");
	auto expiry = at("[WAKEUP] shutdown delay alarm expired (interval:60s)");
	EXPECT_LT(first_wait, expiry);
	EXPECT_LT(expiry, at("[COOLDOWN] \"ap\" state: LimitAction -> ShutDown (t:86)"));
	const std::string head = "member=ChangedCooldownMode\n   string \"";
	EXPECT_TRUE(test_wait_for([&] {
		std::string signals = test_read_file(root + "/monitor.out");
		auto limit = signals.find(head + "LimitAction\""), shutdown = signals.find(head + "ShutDown\"");
		return limit != std::string::npos && shutdown != std::string::npos && limit < shutdown;
	}, 10s)) << test_read_file(root + "/monitor.out");
	test_process call;
	ASSERT_TRUE(call.start({"busctl", "--system", "call", "org.vexel.qor", "/Org/Vexel/Qor/Vorn", "org.vexel.qor.vorn",
				"GetCooldownTemp"}, emu.env(), root + "/call.out", "/dev/null"));
	ASSERT_TRUE(call.wait_exit(10s, nullptr));
	EXPECT_EQ(test_read_file(root + "/call.out"), "i 86\n");
	ASSERT_TRUE(test_write_file(ap, "40")); // final for the life of the process
	ASSERT_TRUE(seen("[COOLDOWN] Already Shutdown requested!!"));
	EXPECT_EQ(count(emu, "[thermal] [COOLDOWN] state: ShutDown -> Release"), 0);
	EXPECT_EQ(emu.stop(), 0);
}

} // namespace
