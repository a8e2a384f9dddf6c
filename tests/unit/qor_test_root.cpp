// Temporary root for the request-side unit tests.
#include "qor_test_root.h"

#include "qor_appinfo.h"
#include "qor_main.h"
#include "fake_jotlog.h"

#include <cstdint>
#include <cstdlib>
#include <unistd.h>

namespace {
const char *node_paths[] = {
	"/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min",
	"/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max",
	"/sys/devices/system/cpu/cpufreq/pmqos/cpu_online_min",
	"/sys/devices/system/cpu/cpufreq/pmqos/cpu_online_max",
	"/sys/devices/system/cpu/cpufreq/pmqos/bus_mif_freq_min",
	"/sys/devices/system/cpu/cpufreq/pmqos/cpu_freq_up_threshold",
	"/sys/power/gpufreq_min_limit",
	"/sys/power/gpufreq_max_limit",
};
} // namespace

qor_test_root::qor_test_root()
{
	test_mkdirs(dir.path + "/sys/devices/system/cpu/cpufreq/pmqos");
	test_mkdirs(dir.path + "/sys/power");
	test_mkdirs(dir.path + "/dev/socket");
	clear_nodes();
	setenv("QOR_SYSROOT", dir.path.c_str(), 1);

	vorn_fd = test_listen_unix(node("/dev/socket/vorn"));

	qor_main_init();
	qor_appinfo_init();
	fake_jotlog_clear();
}

qor_test_root::~qor_test_root()
{
	close(vorn_fd);
	unsetenv("QOR_SYSROOT");
}

std::string qor_test_root::node(const std::string &dev_path) const
{
	return dir.path + dev_path;
}

std::string qor_test_root::pmqos(const std::string &name) const
{
	return node("/sys/devices/system/cpu/cpufreq/pmqos/" + name);
}

void qor_test_root::clear_nodes()
{
	for (const char *p : node_paths)
		test_write_file(dir.path + p, "");
}

std::vector<std::string> qor_test_root::forwarded()
{
	return test_accept_texts(vorn_fd, SIZE_MAX, std::chrono::milliseconds(0));
}
