// Thermal record and sensors: reading, averaging, threshold offsets and look-up by name.
#include "test-vorn-root.h"
#include "vorn_info.h"

#include <unistd.h>

namespace {

using VornSensors = VornTest;

std::vector<int> thresholds(const char *name)
{
	vorn_sensor *s = vorn_get_sensor(name);
	return std::vector<int>(s->temp_table, s->temp_table + s->temp_table_count);
}

TEST_F(VornSensors, AveragingOverItsWindow)
{
	struct {
		int window;
		std::vector<int> readings, results;
	} cases[] = {
		// Raw until the window is full, then the mean truncated toward zero (-2 / 4 is 0, not -1).
		{4, {-3, -3, -3, -4, 8, 50}, {-3, -3, -3, -3, 0, 12}},
		// A reading of exactly 0 marks an empty slot: the raw reading is returned.
		{2, {40, 0, 42, 44}, {40, 0, 42, 43}},
		// A window outside 1..4 means averaging off: no modulus by 0, no slot overrun.
		{0, {70, 72}, {70, 72}},
		{5, {70, 72}, {70, 72}},
	};
	for (const auto &c : cases) {
		vorn_sensor s{};
		s.avg_enabled = 1;
		s.avg_window = c.window;
		for (size_t i = 0; i < c.readings.size(); i++)
			EXPECT_EQ(vorn_avg_temp(&s, c.readings[i]), c.results[i]) << "window " << c.window << " #" << i;
	}
}

TEST_F(VornSensors, ReadingMovesThePreviousValueAndSubstitutesFailures)
{
	vorn_sensor *ap = vorn_get_sensor("ap"), *cpu0 = vorn_get_sensor("cpu0");
	vorn_read_sensors();
	EXPECT_EQ(ap->prev_temp, -99);
	EXPECT_EQ(ap->temp, 40);
	EXPECT_EQ(cpu0->temp, 45000);

	put("/sys/class/xun/temperature/ap_therm", "garbage");
	unlink(real("/sys/class/thermal/thermal_zone1/temp").c_str());
	vorn_sensor *batt = vorn_get_sensor("batt");
	batt->avg_enabled = 1;
	batt->avg_window = 2;
	put("/sys/class/xun/temperature/batt_therm", "temp:");
	vorn_read_sensors();
	EXPECT_EQ(ap->prev_temp, 40);
	EXPECT_EQ(ap->temp, 30);
	EXPECT_EQ(cpu0->temp, 30);
	EXPECT_EQ(batt->temp, 30); // the substitute enters the average like any reading
	EXPECT_EQ(jot("> [thermal] Failed to read ap temp (-22)\n"), 1);
	EXPECT_EQ(jot("> [thermal] Failed to read cpu0 temp (-1)\n"), 1);
	put("/sys/class/xun/temperature/batt_therm", "temp: 36");
	vorn_read_sensors();
	EXPECT_EQ(batt->temp, 33);
}

TEST_F(VornSensors, ThresholdOffsetsAccumulateAndReverse)
{
	vorn_adjust_threshold(+10);
	EXPECT_EQ(kmsg_take(), "[thermal] Adjust threshold: +10\n");
	EXPECT_EQ(thresholds("ap"), (std::vector<int>{70, 75, 80, 85, 95}));
	vorn_adjust_threshold(-10);
	EXPECT_EQ(kmsg_take(), "[thermal] Adjust threshold:  -10\n");
	EXPECT_EQ(thresholds("ap"), (std::vector<int>{60, 65, 70, 75, 85}));
	vorn_adjust_threshold(3);
	vorn_adjust_threshold(4);
	vorn_adjust_threshold(0);
	EXPECT_EQ(jot("Adjust threshold"), 4);
	EXPECT_EQ(thresholds("batt"), (std::vector<int>{62, 67, 72, 77, 87}));
	EXPECT_EQ(thresholds("xo"), (std::vector<int>{92, 97, 102, 107, 112}));
	EXPECT_EQ(vorn_get_sensor("cpu0")->temp_table, nullptr);
}

TEST_F(VornSensors, LookUpIgnoresCaseAndReportsMisses)
{
	vorn_sensor *ap = vorn_get_sensor("AP");
	ASSERT_NE(ap, nullptr);
	EXPECT_STREQ(ap->name, "ap");
	EXPECT_EQ(jot("> Get ap sensor"), 1);
	EXPECT_STREQ(vorn_get_sensor("bAtT")->name, "batt");
	EXPECT_EQ(vorn_get_sensor("cpu"), nullptr);
	EXPECT_EQ(jot("> Sensor cpu Not found"), 1);
	EXPECT_EQ(vorn_get_sensor(nullptr), nullptr);
	EXPECT_EQ(jot("> name is null"), 1);
	EXPECT_EQ(vorn_sensor_at(0), ap);
	EXPECT_EQ(vorn_sensor_at(4), nullptr); // the end record is no sensor
}

} // namespace
