// Fixture of the thermal unit tests.
#include "test-vorn-root.h"

#include "fake_jotlog.h"
#include "fake_vorn_dbus.h"
#include "vorn_core.h"
#include "vorn_device.h"

#include <Ecore.h>
#include <unistd.h>

void VornTest::SetUp()
{
	setenv("VORN_TIME_SCALE", "0.001", 1); // read once per process: the same for every test
	setenv("QOR_SYSROOT", dir.path.c_str(), 1);
	ecore_app_no_system_modules();
	ecore_init();
	put("/dev/kmsg", "");
	put("/proc/cpuinfo", "Processor\t: ARMv7\nRevision\t: 000a\n");
	put("/sys/class/xun/temperature/ap_therm", "temp: 40\n");
	put("/sys/class/xun/temperature/batt_therm", "temp: 35\n");
	put("/sys/class/xun/temperature/xo_therm", "temp: 38\n");
	put("/sys/class/thermal/thermal_zone1/temp", "45000\n");
	put("/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max", "2147483647\n");
	put("/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq", "1400000\n");
	put("/sys/class/power_supply/battery/capacity", "80\n");
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
	std::string path = real(dev_path);
	test_mkdirs(path.substr(0, path.rfind('/')));
	ASSERT_TRUE(test_write_file(path, text)) << path;
}

std::string VornTest::kmsg_take()
{
	std::string text = test_read_file(real("/dev/kmsg"));
	EXPECT_EQ(truncate(real("/dev/kmsg").c_str(), 0), 0);
	return text;
}

int VornTest::jot(const std::string &needle)
{
	return fake_jotlog_count(needle);
}

bool VornTest::loop_until(const std::function<bool()> &cond, std::chrono::milliseconds timeout)
{
	auto deadline = std::chrono::steady_clock::now() + timeout;
	while (!cond()) {
		if (std::chrono::steady_clock::now() >= deadline)
			return false;
		ecore_main_loop_iterate_may_block(0);
		usleep(500);
	}
	return true;
}
