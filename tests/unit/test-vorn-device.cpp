// Device layer: sensor readers, board revision, profile installation and mode look-ups.
#include "fake_jotlog.h"
#include "test-vorn-root.h"
#include "vorn_device.h"

#include <dirent.h>
#include <unistd.h>

namespace {

using VornDevice = VornTest;

TEST_F(VornDevice, MarkerReaderTexts)
{
	const struct {
		const char *text;
		int result, temp; // temp: expected on success, else untouched (-777)
	} cases[] = {
		{"temp: 37\n", 0, 37},	 {"temp:37", 0, 37},	     {"temp:-5\n", 0, -5},
		{"temp:abc", 0, 0},	 {"v2 temp:  41 mC", 0, 41}, {"temp: 99999999999", 0, 2147483647},
		{"temp:", -22, -777},	 {"37\n", -22, -777},	     {"Temp: 37", -22, -777},
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
	EXPECT_EQ(jot("vorn_ext_therm_read_temp_2("), 3);
	EXPECT_EQ(jot("> Invalid temper info"), 6);

	int temp = 0;
	put("/sys/zone", "  -17abc\n");
	EXPECT_EQ(vorn_thermal_zone_read_temp("/sys/zone", &temp), 0);
	EXPECT_EQ(temp, -17);
	EXPECT_EQ(vorn_thermal_zone_read_temp("/sys/missing", &temp), -1);
	EXPECT_EQ(temp, -1);
}

TEST_F(VornDevice, VadcSearchTakesTheLastDeviceWalked)
{
	int temp = -777;
	EXPECT_EQ(vorn_msm_vadc_read_temp("chan", &temp), -2); // no /sys/devices
	put("/sys/devices/soc.0:qpnp-vadc-8/chan", "Result: 27\nRaw: 1\n");
	put("/sys/devices/soc.1:qpnp-vadc-9/chan", "Result: -4\n");
	put("/sys/devices/soc.1:qpnp-vadc-9/other", "Result: 80\n");
	std::string last;
	DIR *d = opendir(real("/sys/devices").c_str());
	while (dirent *e = readdir(d))
		if (std::string(e->d_name).find("qpnp-vadc-") != std::string::npos)
			last = e->d_name;
	closedir(d);
	const int expected = last == "soc.0:qpnp-vadc-8" ? 27 : -4;

	EXPECT_EQ(vorn_msm_vadc_read_temp("chan", &temp), 0); // searched again: found now
	EXPECT_EQ(temp, expected);
	EXPECT_EQ(jot("> vadc_path: "), 2);
	EXPECT_EQ(jot("> vadc_path: " + real("/sys/devices/" + last + "/chan")), 1);
	// Found once: later channel names are ignored.
	EXPECT_EQ(vorn_msm_vadc_read_temp("other", &temp), 0);
	EXPECT_EQ(temp, expected);
	EXPECT_EQ(jot("> vadc_path: "), 2);
}

TEST_F(VornDevice, VadcPathThatDoesNotFitIsRefused)
{
	std::string dev = "x:qpnp-vadc-" + std::string(28, 'd');
	std::string channel(210, 'c'); // "/sys/devices/" + 40 + "/" + 210: 264 characters
	put("/sys/devices/" + dev + "/" + channel, "Result: 5\n");
	int temp = -777;
	EXPECT_EQ(vorn_msm_vadc_read_temp(channel.c_str(), &temp), -2);
	EXPECT_EQ(jot("> vadc path too long: " + dev), 1);
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
		{"Processor\t: ARMv7\nRevision\t: 000a\n", 10, "> [thermal] Board Rev:10\n"},
		{"Revision :712", 18, "Board Rev:18\n"}, // from two characters after the colon
		{"Hardware\t: X200A\n", -1, "> Failed to init board_rev"},
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
	EXPECT_EQ(jot("> Failed to open cpuinfo"), 1);
}

TEST_F(VornDevice, OldHardwareRaisesEveryThresholdOnce)
{
	vorn_info_t *info = vorn_get_info();
	EXPECT_EQ(info->board_rev, 10);
	EXPECT_EQ(vorn_get_sensor("ap")->temp_table[0], 60);
	put("/proc/cpuinfo", "Hardware\t: X200A\n");
	for (int run = 0; run < 2; run++) { // a second init starts again from the built-in tables
		ASSERT_EQ(vorn_init_device_info(info), 0);
		EXPECT_EQ(info->board_rev, -1);
		for (auto [name, first, last] : {std::tuple{"ap", 70, 95}, {"batt", 65, 90}, {"xo", 95, 115}}) {
			EXPECT_EQ(vorn_get_sensor(name)->temp_table[0], first) << name;
			EXPECT_EQ(vorn_get_sensor(name)->temp_table[4], last) << name;
		}
	}
	EXPECT_EQ(jot("> [thermal] Rev -1 is OLD HW\n"), 2);
	EXPECT_EQ(jot("> [thermal] Adjust threshold: +10\n"), 2);
	EXPECT_EQ(vorn_init_device_info(nullptr), -22);
}

TEST_F(VornDevice, ModeLookUps)
{
	vorn_info_t *info = vorn_get_info();
	Eina_Hash *map = info->mode_name_map;
	for (auto [name, mode] : {std::pair{"Browser", 6}, {"browser", -1}, {"default", 0}, {"defaultBrowser", 0},
				  {"defaul", -1}, {"ScreenOffInCall", 2}, {"Hotgame", 7}, {"", -1}})
		EXPECT_EQ(vorn_get_mode_by_name(map, name), mode) << name;
	EXPECT_EQ(vorn_get_mode_by_name(map, nullptr), -22);
	EXPECT_EQ(vorn_get_mode_by_name(nullptr, "Browser"), -22);
	EXPECT_EQ(jot("Failed to add hash"), 0);

	// SuperFastHash over the id and its terminating NUL.
	EXPECT_EQ(vorn_app_hash("com.vandrel.browser"), 0x360b1a20u);
	EXPECT_EQ(vorn_get_mode_by_app_name(info, "com.vandrel.browser"), 6);
	EXPECT_EQ(vorn_get_mode_by_app_name(info, "com.vandrel.browse"), -1);
	EXPECT_EQ(vorn_get_mode_by_app_name(info, nullptr), -22);
}

} // namespace
