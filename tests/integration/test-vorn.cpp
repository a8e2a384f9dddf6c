// The thermal thread of the real daemon on the emulated phone: start-up order, boot modes, the
// booting period, the status lines, failing sensors and the stop, read from the kernel log.
#include "test_support.h"

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <gtest/gtest.h>
#include <sstream>

using namespace std::chrono_literals;

namespace {

struct status_line {
	int seq, enabled;
	std::string temps;
};

// The daemon at VORN_TIME_SCALE 0.01: polling every 0.3 s, a booting period of 1.8 s.
class VornOnPhone : public ::testing::Test {
protected:
	test_emu emu;
	const std::string &root = emu.dir.path;

	void TearDown() override { emu.stop(); }

	void lay_out(const std::string &dev_path, const std::string &text)
	{
		ASSERT_TRUE(test_mkdirs((root + dev_path).substr(0, root.size() + dev_path.rfind('/'))));
		ASSERT_TRUE(test_write_file(root + dev_path, text));
	}

	void start() { ASSERT_TRUE(emu.start(0.01)) << test_read_file(root + "/emu.err"); }

	// Kernel-log records in order, without their final line end.
	std::vector<std::string> kmsg()
	{
		std::vector<std::string> records;
		std::istringstream journal(test_read_file(root + "/journal"));
		for (std::string line; std::getline(journal, line);) {
			auto at = line.find(" /dev/kmsg ");
			if (at != std::string::npos && line.size() >= at + 13)
				records.push_back(line.substr(at + 11, line.size() - at - 13));
		}
		return records;
	}

	std::vector<status_line> status_lines()
	{
		std::vector<status_line> lines;
		for (const auto &r : kmsg()) {
			status_line l;
			int mode, level;
			char temps[64];
			if (sscanf(r.c_str(), "[thermal] [%d] [%d/%d/%d/Booting] %63s [", &l.seq, &mode, &level, &l.enabled,
				   temps) == 5)
				lines.push_back({l.seq, l.enabled, temps});
		}
		return lines;
	}

	int count(const std::string &record)
	{
		auto r = kmsg();
		return static_cast<int>(std::count(r.begin(), r.end(), record));
	}

	bool wait_status(const std::function<bool(const std::vector<status_line> &)> &cond)
	{
		return test_wait_for([&] { return cond(status_lines()); }, 20s);
	}
};

TEST_F(VornOnPhone, StartsInOrderAndCyclesWithOneBootingPeriod)
{
	start();
	ASSERT_TRUE(test_wait_for([&] { return count("[thermal] booting_timer expired!") == 1; }, 20s));
	size_t seen = status_lines().size();
	ASSERT_TRUE(wait_status([seen](const auto &l) { return l.size() >= seen + 4; }));

	auto records = kmsg();
	const std::vector<std::string> first = {
		"[thermal] +++ VORN START +++",
		"[thermal] Board Rev:10",
		"[thermal] Normal booting mode",
		"[thermal] booting_timer: adjust threshold for 180 sec",
		"[thermal] Adjust threshold: +10",
		"[thermal] [0] [0/-1/1/Booting] 40/35/38/45000 [-1 -1 -1 -1 -1 -1 -1 ] [-1/1400000/80/0]",
		"[thermal] +++ VORN LOOP ENTER +++",
	};
	ASSERT_GE(records.size(), first.size());
	EXPECT_EQ(std::vector<std::string>(records.begin(), records.begin() + first.size()), first);
	// The offset goes exactly once; the expiry runs a cycle of its own.
	EXPECT_EQ(count("[thermal] Adjust threshold: +10"), 1);
	EXPECT_EQ(count("[thermal] Adjust threshold:  -10"), 1);
	auto expiry = std::find(records.begin(), records.end(), "[thermal] booting_timer expired!");
	ASSERT_LT(expiry + 2, records.end());
	EXPECT_EQ(expiry[1], "[thermal] Adjust threshold:  -10");
	EXPECT_EQ(expiry[2].rfind("[thermal] [", 0), 0u) << expiry[2];
	auto lines = status_lines();
	for (size_t i = 0; i < lines.size(); i++)
		EXPECT_EQ(lines[i].seq, static_cast<int>(i));
}

TEST_F(VornOnPhone, FailingSensorReadsCountAsThirtyDegrees)
{
	start();
	ASSERT_TRUE(test_write_file(root + "/sys/class/xun/temperature/batt_therm", "fail"));
	ASSERT_TRUE(test_write_file(root + "/sys/class/xun/temperature/ap_therm", "temp: 44 broken"));
	ASSERT_TRUE(wait_status([](const auto &l) { return !l.empty() && l.back().temps == "44/30/38/45000"; }));
	EXPECT_GE(count("[thermal] Failed to read batt temp (-1)"), 1);
	ASSERT_TRUE(test_write_file(root + "/sys/class/xun/temperature/ap_therm", "driver lost"));
	ASSERT_TRUE(test_write_file(root + "/sys/class/xun/temperature/batt_therm", "36"));
	ASSERT_TRUE(wait_status([](const auto &l) { return !l.empty() && l.back().temps == "30/36/38/45000"; }));
	EXPECT_GE(count("[thermal] Failed to read ap temp (-22)"), 1);
}

TEST_F(VornOnPhone, FactoryBuildInPowerOffCharging)
{
	lay_out("/etc/bldcfg/factory", "");
	lay_out("/proc/cmdline", "console=ttyS0 androidboot.mode=charging\n");
	start();
	ASSERT_TRUE(wait_status([](const auto &l) { return l.size() >= 2; }));
	auto records = kmsg();
	auto at = [&](const char *r) { return std::find(records.begin(), records.end(), r) - records.begin(); };
	EXPECT_LT(at("[thermal] factory mode"), at("[thermal] Poweroff charging mode"));
	EXPECT_LT(at("[thermal] Poweroff charging mode"), at("[thermal] Disable VORN (fac:1)"));
	EXPECT_LT(at("[thermal] Disable VORN (fac:1)"), at("[thermal] +++ VORN LOOP ENTER +++"));
	EXPECT_EQ(test_read_file(root + "/var/lib/setstore/db/private/overheat/control").substr(0, 1), "0");
	EXPECT_EQ(status_lines().back().enabled, 1); // kept until a change of the key is delivered
}

TEST_F(VornOnPhone, TerminationSignalEndsTheLoopAndTheProcess)
{
	start();
	pid_t daemon = static_cast<pid_t>(std::stol(test_read_file(root + "/qor-server.pid")));
	ASSERT_EQ(kill(daemon, SIGTERM), 0);
	ASSERT_TRUE(test_wait_for([daemon] { // gone, or a zombie the launcher has still to reap
		std::string stat = test_read_file("/proc/" + std::to_string(daemon) + "/stat");
		return stat.empty() || stat.substr(stat.rfind(") ") + 2, 1) == "Z";
	}, 5000ms));
	auto records = kmsg();
	ASSERT_GE(records.size(), 2u);
	EXPECT_EQ(records[records.size() - 2], "[thermal] --- VORN LOOP END ---");
	EXPECT_EQ(records.back(), "[thermal] --- VORN EXIT (0) ---");
}

} // namespace
