// Device layer: sensor readers, board revision, profile installation and mode look-ups.
#include "test-vorn-root.h"
#include "vorn_device.h"

#include <unistd.h>

namespace {

using VornDevice = VornTest;

TEST_F(VornDevice, SensorReaders)
{
	const struct {
		const char *text;
		int result, temp; // temp: expected on success, else untouched (-777)
	} cases[] = {
		{"temp: 37\n", 0, 37},	  {"temp:-5\n", 0, -5}, {"v2 temp:  41 mC", 0, 41},
		{"temp: 99999999999", 0, 2147483647}, {"temp:", -22, -777}, {"Temp: 37", -22, -777},
	};
	for (auto read : {vorn_ext_therm_read_temp, vorn_ext_therm_read_temp_2}) {
		for (const auto &c : cases) {
			put("/sys/node", c.text);
			int temp = -777;
			EXPECT_EQ(read("/sys/node", &temp), c.result) << c.text;
			EXPECT_EQ(temp, c.temp) << c.text;
		}
		int temp = -777;
		EXPECT_EQ(read("/sys/missing", &temp), -1);
		EXPECT_EQ(temp, -777);
	}
	int temp = 0;
	put("/sys/zone", "  -17abc\n");
	EXPECT_EQ(vorn_thermal_zone_read_temp("/sys/zone", &temp), 0);
	EXPECT_EQ(temp, -17);

	EXPECT_EQ(vorn_msm_vadc_read_temp("chan", &temp), -2); // no /sys/devices
	// A path that does not fit (264 characters) is refused, not cut.
	std::string dev = "x:qpnp-vadc-" + std::string(28, 'd'), channel(210, 'c');
	put("/sys/devices/" + dev + "/" + channel, "Result: 5\n");
	EXPECT_EQ(vorn_msm_vadc_read_temp(channel.c_str(), &temp), -2);
	EXPECT_EQ(jot("> vadc path too long: " + dev), 1);
	ASSERT_EQ(unlink(real("/sys/devices/" + dev + "/" + channel).c_str()) | rmdir(real("/sys/devices/" + dev).c_str()), 0);
	put("/sys/devices/soc.0:qpnp-vadc-8/chan", "Result: 27\nRaw: 1\n");
	EXPECT_EQ(vorn_msm_vadc_read_temp("chan", &temp), 0); // searched again: found now
	EXPECT_EQ(temp, 27);
}

TEST_F(VornDevice, BoardRevisionFromCpuinfo)
{
	// The colon is the last of the 1023 bytes read: nothing past the buffer may be read.
	const std::string ends_at_colon = std::string(1014, 'y') + "Revision:";
	const struct {
		std::string cpuinfo;
		int rev;
		const char *message;
	} cases[] = {
		{"Revision :712", 18, "Board Rev:18\n"}, // from two characters after the colon
		{"Revision 000a\n", -1, "> revision not found"},
		{std::string(1100, 'x') + "\nRevision\t: 000a\n", -1, "> Failed to init board_rev"},
		{ends_at_colon + " 0a\n", 0, "Board Rev:0\n"},
	};
	for (const auto &c : cases) {
		fake_jotlog_clear();
		put("/proc/cpuinfo", c.cpuinfo);
		EXPECT_EQ(vorn_get_board_revision(), c.rev) << c.cpuinfo.substr(0, 30);
		EXPECT_EQ(jot(c.message), 1) << c.cpuinfo.substr(0, 30);
	}
	unlink(real("/proc/cpuinfo").c_str());
	EXPECT_EQ(vorn_get_board_revision(), -1);
}

TEST_F(VornDevice, OldHardwareRaisesEveryThresholdOnce)
{
	vorn_info_t *info = vorn_get_info();
	EXPECT_EQ(info->board_rev, 10);
	EXPECT_EQ(vorn_get_sensor("ap")->temp_table[0], 60);
	put("/proc/cpuinfo", "Hardware\t: X200A\n");
	for (int run = 0; run < 2; run++) { // a second init starts again from the built-in tables
		ASSERT_EQ(vorn_init_device_info(info), 0);
		for (auto [name, first, last] : {std::tuple{"ap", 70, 95}, {"batt", 65, 90}, {"xo", 95, 115}}) {
			EXPECT_EQ(vorn_get_sensor(name)->temp_table[0], first) << name;
			EXPECT_EQ(vorn_get_sensor(name)->temp_table[4], last) << name;
		}
	}
	EXPECT_EQ(jot("> [thermal] Rev -1 is OLD HW\n"), 2);
}

TEST_F(VornDevice, ModeLookUps)
{
	vorn_info_t *info = vorn_get_info();
	for (auto [name, mode] : {std::pair{"Browser", 6}, {"browser", -1}, {"defaultBrowser", 0}, {"defaul", -1},
				  {"Hotgame", 7}, {"", -1}})
		EXPECT_EQ(vorn_get_mode_by_name(info->mode_name_map, name), mode) << name;
	EXPECT_EQ(vorn_get_mode_by_name(info->mode_name_map, nullptr), -22);
	// SuperFastHash over the id and its terminating NUL.
	EXPECT_EQ(vorn_app_hash("com.vandrel.browser"), 0x360b1a20u);
	EXPECT_EQ(vorn_get_mode_by_app_name(info, "com.vandrel.browser"), 6);
	EXPECT_EQ(vorn_get_mode_by_app_name(info, "com.vandrel.browse"), -1);
}

} // namespace
