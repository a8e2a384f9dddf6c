// Emulated kernel nodes: write grammars, PM-QoS aggregation, sensor modes, tree lookup.
#include "devsim_nodes.h"

#include <cerrno>
#include <climits>
#include <gtest/gtest.h>
#include <memory>
#include <string>

namespace {

struct DevsimModel : ::testing::Test {
	std::unique_ptr<devsim_model> m = std::make_unique<devsim_model>();
	void SetUp() override { ASSERT_EQ(devsim_model_init(m.get()), 0); }

	int ino(const char *path)
	{
		int i = devsim_find(m.get(), path);
		EXPECT_NE(i, 0) << path;
		return i;
	}
	std::string show(const char *path)
	{
		char buf[DEVSIM_TEXT_MAX + 1];
		int n = devsim_show(m.get(), ino(path), buf, sizeof buf);
		return n < 0 ? "errno " + std::to_string(-n) : std::string(buf, static_cast<size_t>(n));
	}
	int store(const char *path, std::string_view text) { return devsim_store(m.get(), ino(path), text); }
};

constexpr char CPUFREQ_MIN[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min";
constexpr char CPUFREQ_MAX[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max";
constexpr char SCALING_MAX[] = "/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq";
constexpr char AP_THERM[] = "/sys/class/xun/temperature/ap_therm";
constexpr char ZONE1[] = "/sys/class/thermal/thermal_zone1/temp";

TEST(DevsimParse, NumberGrammar)
{
	struct {
		const char *text;
		bool ok;
		int value;
	} rows[] = {
		{"42", true, 42},	     {" \t-7 \n", true, -7},	{"+5\n\n", true, 5},
		{"2147483647", true, INT_MAX}, {"-2147483648", true, INT_MIN}, {"2147483648", false, 0},
		{"99999999999999999999", false, 0}, {"", false, 0},	   {"-", false, 0},
		{"12abc", false, 0},	     {"1 2", false, 0},		{"\n5", false, 0},
		{"0x10", false, 0},
	};
	for (const auto &r : rows) {
		int v = 12345;
		EXPECT_EQ(devsim_parse_int(r.text, &v), r.ok) << '"' << r.text << '"';
		EXPECT_EQ(v, r.ok ? r.value : 12345) << '"' << r.text << '"';
	}
}

TEST(DevsimParse, PmqosRequestGrammar)
{
	struct {
		const char *text;
		bool ok;
		int value, id;
	} rows[] = {
		{"1200000 id2", true, 1200000, 2}, {"-1 id2", true, -1, 2},  {" 5\tid23\n", true, 5, 23},
		{"0 id0", true, 0, 0},		   {"5id2", false, 0, 0},    {"5 id", false, 0, 0},
		{"5 id-2", false, 0, 0},	   {"5 id2 x", false, 0, 0}, {"5", false, 0, 0},
		{"id2", false, 0, 0},		   {"5 ID2", false, 0, 0},   {"5 id99999999999", false, 0, 0},
	};
	for (const auto &r : rows) {
		int v = -99, id = -99;
		EXPECT_EQ(devsim_parse_pmqos(r.text, &v, &id), r.ok) << '"' << r.text << '"';
		if (r.ok) {
			EXPECT_EQ(v, r.value) << r.text;
			EXPECT_EQ(id, r.id) << r.text;
		}
	}
}

TEST_F(DevsimModel, StartValuesMatchThePhone)
{
	EXPECT_EQ(show(CPUFREQ_MIN), "0\n");
	EXPECT_EQ(show(CPUFREQ_MAX), "2147483647\n");
	EXPECT_EQ(show("/sys/devices/system/cpu/cpufreq/pmqos/cpu_online_min"), "1\n");
	EXPECT_EQ(show("/sys/devices/system/cpu/cpufreq/pmqos/cpu_online_max"), "4\n");
	EXPECT_EQ(show(SCALING_MAX), "1400000\n");
	EXPECT_EQ(show("/sys/class/power_supply/battery/vorn_level"), "100\n");
	EXPECT_EQ(show("/sys/class/power_supply/battery/capacity"), "80\n");
	EXPECT_EQ(show(AP_THERM), "temp: 40\n");
	EXPECT_EQ(show("/sys/class/xun/temperature/batt_therm"), "temp: 35\n");
	EXPECT_EQ(show("/sys/class/xun/temperature/xo_therm"), "temp: 38\n");
	EXPECT_EQ(show(ZONE1), "45000\n");
	EXPECT_EQ(show("/sys/kernel/debug/wakeup_sources_active"), "");
}

TEST_F(DevsimModel, PmqosKeepsOneRequestPerIdentity)
{
	ASSERT_EQ(store(CPUFREQ_MIN, "1200000 id2"), 0);
	ASSERT_EQ(store(CPUFREQ_MIN, "800000 id5"), 0);
	EXPECT_EQ(show(CPUFREQ_MIN), "1200000\n");
	ASSERT_EQ(store(CPUFREQ_MIN, "500000 id2"), 0); // replaces id2's request, does not add one
	EXPECT_EQ(show(CPUFREQ_MIN), "800000\n");
	ASSERT_EQ(store(CPUFREQ_MIN, "-1 id5"), 0);
	EXPECT_EQ(show(CPUFREQ_MIN), "500000\n");
	ASSERT_EQ(store(CPUFREQ_MIN, "-1 id5"), 0); // releasing twice is harmless
	ASSERT_EQ(store(CPUFREQ_MIN, "-1 id2"), 0);
	EXPECT_EQ(show(CPUFREQ_MIN), "0\n");
}

TEST_F(DevsimModel, PmqosMaxNodeTakesTheSmallestAndCapsScalingMax)
{
	ASSERT_EQ(store(CPUFREQ_MAX, "1600000 id1"), 0);
	EXPECT_EQ(show(CPUFREQ_MAX), "1600000\n");
	EXPECT_EQ(show(SCALING_MAX), "1400000\n"); // the hardware maximum is lower still
	ASSERT_EQ(store(CPUFREQ_MAX, "1000000 id6"), 0);
	EXPECT_EQ(show(CPUFREQ_MAX), "1000000\n");
	EXPECT_EQ(show(SCALING_MAX), "1000000\n");
	ASSERT_EQ(store(CPUFREQ_MAX, "-1 id6"), 0);
	EXPECT_EQ(show(SCALING_MAX), "1400000\n");
	EXPECT_EQ(store(SCALING_MAX, "5"), -EACCES);
}

TEST_F(DevsimModel, PmqosRefusesBadTextAndTooManyIdentities)
{
	EXPECT_EQ(store(CPUFREQ_MIN, "1200000"), -EINVAL);
	EXPECT_EQ(show(CPUFREQ_MIN), "0\n");
	for (int id = 0; id < DEVSIM_PMQOS_SLOTS; id++)
		ASSERT_EQ(store(CPUFREQ_MIN, std::to_string(id) + " id" + std::to_string(id)), 0);
	EXPECT_EQ(store(CPUFREQ_MIN, "7 id1000"), -ENOSPC);
	EXPECT_EQ(store(CPUFREQ_MIN, "7 id3"), 0); // a standing identity can still change
	EXPECT_EQ(show(CPUFREQ_MIN), std::to_string(DEVSIM_PMQOS_SLOTS - 1) + "\n");
	ASSERT_EQ(store(CPUFREQ_MIN, "-1 id0"), 0);
	EXPECT_EQ(store(CPUFREQ_MIN, "7 id1000"), 0);
}

TEST_F(DevsimModel, SensorNumberFailAndVerbatim)
{
	ASSERT_EQ(store(AP_THERM, " -5 \n"), 0);
	EXPECT_EQ(show(AP_THERM), "temp: -5\n");
	ASSERT_EQ(store(AP_THERM, "fail\n"), 0);
	EXPECT_EQ(show(AP_THERM), "errno 5");
	ASSERT_EQ(store(AP_THERM, "garbage temp:"), 0);
	EXPECT_EQ(show(AP_THERM), "garbage temp:");
	ASSERT_EQ(store(AP_THERM, "failed"), 0); // not the fail word: served as written
	EXPECT_EQ(show(AP_THERM), "failed");
	ASSERT_EQ(store(AP_THERM, "61"), 0);
	EXPECT_EQ(show(AP_THERM), "temp: 61\n");
	ASSERT_EQ(store(ZONE1, "fail"), 0);
	EXPECT_EQ(show(ZONE1), "errno 5");
	ASSERT_EQ(store(ZONE1, "52000"), 0);
	EXPECT_EQ(show(ZONE1), "52000\n");
}

TEST_F(DevsimModel, TextSizeLimitKeepsTheOldValue)
{
	std::string full(DEVSIM_TEXT_MAX, 'x');
	ASSERT_EQ(store(AP_THERM, full), 0);
	EXPECT_EQ(show(AP_THERM), full);
	EXPECT_EQ(store(AP_THERM, full + "y"), -EINVAL);
	EXPECT_EQ(show(AP_THERM), full);
	EXPECT_EQ(store("/sys/kernel/debug/sleep_history", full + "y"), -EINVAL);
	EXPECT_EQ(store("/sys/power/gpufreq_min_limit", "fast"), -EINVAL);
	EXPECT_EQ(show("/sys/power/gpufreq_min_limit"), "0\n");
}

TEST_F(DevsimModel, TreeLookupAndListing)
{
	int power = devsim_lookup(m.get(), DEVSIM_ROOT_INO, "power");
	ASSERT_NE(power, 0);
	EXPECT_EQ(devsim_lookup(m.get(), power, "gpufreq_max_limit"), ino("/sys/power/gpufreq_max_limit"));
	EXPECT_EQ(devsim_lookup(m.get(), power, "gpufreq_max"), 0);
	EXPECT_EQ(devsim_lookup(m.get(), DEVSIM_ROOT_INO, "sys"), 0); // the root is nobody's child
	int dir = ino("/sys/class/xun/temperature");
	std::string names;
	for (int c = devsim_next_child(m.get(), dir, 0); c; c = devsim_next_child(m.get(), dir, c))
		names += std::string(devsim_get(m.get(), c)->name) + ",";
	EXPECT_EQ(names, "ap_therm,batt_therm,xo_therm,");
	EXPECT_EQ(devsim_show(m.get(), dir, nullptr, 0), -EISDIR);
	EXPECT_EQ(devsim_store(m.get(), dir, "1"), -EISDIR);
	EXPECT_EQ(devsim_store(m.get(), 0, "1"), -ENOENT);
	EXPECT_EQ(devsim_store(m.get(), m->count + 1, "1"), -ENOENT);
}

} // namespace
