// Emulated kernel nodes: write grammars, PM-QoS aggregation, sensor modes, limits.
#include "devsim_nodes.h"

#include <cerrno>
#include <gtest/gtest.h>
#include <memory>
#include <string>

namespace {

constexpr char CPUFREQ_MIN[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min";
constexpr char CPUFREQ_MAX[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max";
constexpr char SCALING_MAX[] = "/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq";
constexpr char AP_THERM[] = "/sys/class/xun/temperature/ap_therm";
constexpr char ZONE1[] = "/sys/class/thermal/thermal_zone1/temp";
constexpr char GPU_MIN[] = "/sys/power/gpufreq_min_limit";

struct DevsimModel : ::testing::Test {
	std::unique_ptr<devsim_model> m = std::make_unique<devsim_model>();
	void SetUp() override { ASSERT_EQ(devsim_model_init(m.get()), 0); }
	// The node's text, or "errno N".
	std::string show(const char *path)
	{
		char buf[DEVSIM_TEXT_MAX + 1];
		int n = devsim_show(m.get(), devsim_find(m.get(), path), buf, sizeof buf);
		return n < 0 ? "errno " + std::to_string(-n) : std::string(buf, static_cast<size_t>(n));
	}
	int store(const char *path, std::string_view text)
	{
		return devsim_store(m.get(), devsim_find(m.get(), path), text);
	}
};

TEST(DevsimParse, RefusesMalformedNumbersAndRequests)
{
	int v = 12345, id = 0;
	for (const char *bad : {"2147483648", "99999999999999999999", "", "-", "12abc", "1 2", "\n5", "0x10"})
		EXPECT_FALSE(devsim_parse_int(bad, &v)) << '"' << bad << '"';
	EXPECT_EQ(v, 12345); // untouched when refused
	for (const char *bad : {"5id2", "5 id", "5 id-2", "5 id2 x", "5", "id2", "5 ID2", "5 id99999999999"})
		EXPECT_FALSE(devsim_parse_pmqos(bad, &v, &id)) << '"' << bad << '"';
}

// Each step writes one text and checks what a node shows afterwards.
TEST_F(DevsimModel, WritesChangeWhatNodesShow)
{
	const std::string full(DEVSIM_TEXT_MAX, 'x');
	struct {
		const char *node;
		std::string text;
		int result;
		const char *shown_node;
		std::string shown;
	} steps[] = {
		// A minimum node shows the largest request, one request per identity.
		{CPUFREQ_MIN, "1200000 id2", 0, CPUFREQ_MIN, "1200000\n"},
		{CPUFREQ_MIN, "800000 id5", 0, CPUFREQ_MIN, "1200000\n"},
		{CPUFREQ_MIN, "500000 id2", 0, CPUFREQ_MIN, "800000\n"}, // replaces id2's request
		{CPUFREQ_MIN, "-1 id5", 0, CPUFREQ_MIN, "500000\n"},
		{CPUFREQ_MIN, "-1 id5", 0, CPUFREQ_MIN, "500000\n"}, // releasing twice is harmless
		{CPUFREQ_MIN, "-1 id2", 0, CPUFREQ_MIN, "0\n"},
		{CPUFREQ_MIN, " 5\tid23\n", 0, CPUFREQ_MIN, "5\n"},
		{CPUFREQ_MIN, "1200000", -EINVAL, CPUFREQ_MIN, "5\n"},
		// A maximum node takes the smallest request and caps the read-only hardware maximum.
		{CPUFREQ_MAX, "1600000 id1", 0, CPUFREQ_MAX, "1600000\n"},
		{CPUFREQ_MAX, "1000000 id6", 0, SCALING_MAX, "1000000\n"},
		{CPUFREQ_MAX, "-1 id6", 0, SCALING_MAX, "1400000\n"},
		{SCALING_MAX, "5", -EACCES, SCALING_MAX, "1400000\n"},
		// Sensors: a number, the fail word (reads fail with EIO), or any other text as written.
		{AP_THERM, " -5 \n", 0, AP_THERM, "temp: -5\n"},
		{AP_THERM, "fail\n", 0, AP_THERM, "errno 5"},
		{AP_THERM, "failed", 0, AP_THERM, "failed"},
		{AP_THERM, "61", 0, AP_THERM, "temp: 61\n"},
		{ZONE1, "fail", 0, ZONE1, "errno 5"},
		{ZONE1, "52000", 0, ZONE1, "52000\n"},
		// The size limit; a refused write keeps the old value.
		{AP_THERM, full, 0, AP_THERM, full},
		{AP_THERM, full + "y", -EINVAL, AP_THERM, full},
		// Integers: blanks around an optionally signed number, within int.
		{GPU_MIN, "2147483647", 0, GPU_MIN, "2147483647\n"},
		{GPU_MIN, "-2147483648\n\n", 0, GPU_MIN, "-2147483648\n"},
		{GPU_MIN, " \t+5 ", 0, GPU_MIN, "5\n"},
		{GPU_MIN, "fast", -EINVAL, GPU_MIN, "5\n"},
	};
	for (const auto &s : steps) {
		EXPECT_EQ(store(s.node, s.text), s.result) << s.node << " <- " << s.text.substr(0, 20);
		EXPECT_EQ(show(s.shown_node), s.shown) << s.node << " <- " << s.text.substr(0, 20);
	}
}

TEST_F(DevsimModel, IdentitiesAndInodesAreBounded)
{
	for (int id = 0; id < DEVSIM_PMQOS_SLOTS; id++)
		ASSERT_EQ(store(CPUFREQ_MIN, std::to_string(id) + " id" + std::to_string(id)), 0);
	EXPECT_EQ(store(CPUFREQ_MIN, "7 id1000"), -ENOSPC);
	EXPECT_EQ(store(CPUFREQ_MIN, "7 id3"), 0); // a standing identity can still change
	EXPECT_EQ(show(CPUFREQ_MIN), std::to_string(DEVSIM_PMQOS_SLOTS - 1) + "\n");
	ASSERT_EQ(store(CPUFREQ_MIN, "-1 id0"), 0);
	EXPECT_EQ(store(CPUFREQ_MIN, "7 id1000"), 0);
	for (int bad : {0, m->count + 1}) // never indexes outside the table
		EXPECT_EQ(devsim_store(m.get(), bad, "1"), -ENOENT);
}

} // namespace
