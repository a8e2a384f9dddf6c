// Thermal record and sensors: reading, averaging, threshold offsets and look-up by name.
#include "test-vorn-root.h"
#include "vorn_info.h"

#include <unistd.h>

namespace {

using VornSensors = VornTest;

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
	vorn_sensor *ap = vorn_get_sensor("AP"), *cpu0 = vorn_get_sensor("cpu0"), *batt = vorn_get_sensor("batt");
	ASSERT_TRUE(ap && cpu0 && batt);
	EXPECT_EQ(vorn_get_sensor("cpu"), nullptr);
	vorn_read_sensors();
	EXPECT_EQ(std::tuple(ap->prev_temp, ap->temp, cpu0->temp), std::tuple(-99, 40, 45000));

	put("/sys/class/xun/temperature/ap_therm", "garbage");
	unlink(real("/sys/class/thermal/thermal_zone1/temp").c_str());
	batt->avg_enabled = 1;
	batt->avg_window = 2;
	put("/sys/class/xun/temperature/batt_therm", "temp:");
	vorn_read_sensors();
	// The substitute 30 enters the average like any reading.
	EXPECT_EQ(std::tuple(ap->prev_temp, ap->temp, cpu0->temp, batt->temp), std::tuple(40, 30, 30, 30));
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
	vorn_adjust_threshold(-10);
	EXPECT_EQ(kmsg_take(), "[thermal] Adjust threshold:  -10\n");
	vorn_adjust_threshold(3);
	vorn_adjust_threshold(4);
	vorn_sensor *batt = vorn_get_sensor("batt"), *xo = vorn_get_sensor("xo");
	EXPECT_EQ(std::vector<int>(batt->temp_table, batt->temp_table + 5), (std::vector<int>{62, 67, 72, 77, 87}));
	EXPECT_EQ(std::vector<int>(xo->temp_table, xo->temp_table + 5), (std::vector<int>{92, 97, 102, 107, 112}));
	EXPECT_EQ(vorn_get_sensor("cpu0")->temp_table, nullptr);
}

} // namespace
