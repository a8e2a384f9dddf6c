// Fixture of the thermal unit tests.
#include "test-vorn-root.h"

#include "fake_vorn_dbus.h"
#include "vorn_core.h"
#include "vorn_device.h"

#include <unistd.h>

void VornTest::SetUp()
{
	setenv("VORN_TIME_SCALE", "0.001", 1); // read once per process: the same for every test
	setenv("QOR_SYSROOT", dir.path.c_str(), 1);
	ecore_app_no_system_modules();
	ecore_init();
	for (auto [path, text] : {std::pair{"/dev/kmsg", ""}, {"/proc/cpuinfo", "Processor\t: ARMv7\nRevision\t: 000a\n"},
				  {"/sys/class/xun/temperature/ap_therm", "temp: 40\n"},
				  {"/sys/class/xun/temperature/batt_therm", "temp: 35\n"},
				  {"/sys/class/xun/temperature/xo_therm", "temp: 38\n"},
				  {"/sys/class/thermal/thermal_zone1/temp", "45000\n"},
				  {"/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max", "2147483647\n"},
				  {"/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq", "1400000\n"},
				  {"/sys/class/power_supply/battery/capacity", "80\n"}})
		put(path, text);
	fake_vorn_dbus_reset();
	vorn_info_reset();
	ASSERT_EQ(vorn_init_device_info(vorn_get_info()), 0);
	kmsg_take();
	fake_jotlog_clear();
}

void VornTest::TearDown()
{
	vorn_gate_log_set(0);
	vorn_thermal_stop();
	ecore_shutdown();
	unsetenv("QOR_SYSROOT");
}

void VornTest::put(const std::string &dev_path, const std::string &text)
{
	test_mkdirs(real(dev_path.substr(0, dev_path.rfind('/'))));
	ASSERT_TRUE(test_write_file(real(dev_path), text)) << dev_path;
}

std::string VornTest::kmsg_take()
{
	std::string text = test_read_file(real("/dev/kmsg"));
	EXPECT_EQ(truncate(real("/dev/kmsg").c_str(), 0), 0);
	return text;
}
