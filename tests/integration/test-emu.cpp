// The emulator launcher: start-up on a prepared root, a request reaching the emulated kernel,
// and a teardown that leaves no process and no mount behind, also when start-up fails.
#include "test_support.h"

#include <cerrno>
#include <csignal>
#include <fstream>
#include <gtest/gtest.h>
#include <sstream>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#ifndef QOR_SOURCE_DIR
#error "QOR_SOURCE_DIR must name the source tree"
#endif

using namespace std::chrono_literals;

namespace {

const std::string emu = std::string(QOR_SOURCE_DIR) + "/tools/qor-emu";

bool contains(const std::string &path, const std::string &needle)
{
	return test_read_file(path).find(needle) != std::string::npos;
}

// Mount points at or below dir, as this process sees them.
std::vector<std::string> mounts_below(const std::string &dir)
{
	std::vector<std::string> found;
	std::ifstream in("/proc/self/mountinfo");
	std::string line;
	while (std::getline(in, line)) {
		std::istringstream fields(line);
		std::string id, parent, dev, root, mount_point;
		fields >> id >> parent >> dev >> root >> mount_point;
		if (mount_point == dir || mount_point.rfind(dir + "/", 0) == 0)
			found.push_back(mount_point);
	}
	return found;
}

pid_t read_pid(const std::string &file)
{
	std::string text = test_read_file(file);
	return text.empty() ? -1 : static_cast<pid_t>(std::stol(text));
}

bool pid_gone(pid_t pid)
{
	return pid > 0 && kill(pid, 0) < 0 && errno == ESRCH;
}

int exit_code(test_process &p, std::chrono::milliseconds timeout)
{
	int status;
	if (!p.wait_exit(timeout, &status) || !WIFEXITED(status))
		return -1;
	return WEXITSTATUS(status);
}

TEST(QorEmu, RunsThePhoneAndLeavesNothingBehind)
{
	test_tmpdir tmp;
	const std::string &root = tmp.path;
	// A caller's own layout is kept.
	ASSERT_TRUE(test_mkdirs(root + "/proc"));
	ASSERT_TRUE(test_write_file(root + "/proc/cmdline", "console=ttyS0 marker=kept\n"));
	ASSERT_TRUE(test_mkdirs(root + "/var/lib/setstore/memory/camera"));
	ASSERT_TRUE(test_write_file(root + "/var/lib/setstore/memory/camera/state", "2\n"));

	test_process p;
	std::string out = root + "/emu.out";
	ASSERT_TRUE(p.start({emu, "--root", root, "--time-scale", "0.01"}, {"QOR_BUILD_DIR=" + test_build_dir()}, out,
			    root + "/emu.err"));
	ASSERT_TRUE(test_wait_for([&] { return contains(out, "qor-emu: ready " + root + "\n") || !p.running(); }, 60s));
	ASSERT_TRUE(contains(out, "qor-emu: ready " + root + "\n")) << test_read_file(root + "/emu.err");

	EXPECT_EQ(test_read_file(root + "/proc/cmdline"), "console=ttyS0 marker=kept\n");
	EXPECT_EQ(test_read_file(root + "/var/lib/setstore/memory/camera/state"), "2\n");
	EXPECT_EQ(test_read_file(root + "/var/lib/setstore/memory/pm/state"), "1\n");
	EXPECT_EQ(test_read_file(root + "/var/lib/setstore/db/private/overheat/control"), "1\n");
	EXPECT_TRUE(contains(root + "/proc/cpuinfo", "Revision\t: 000a\n"));
	std::string env = test_read_file(root + "/emu.env");
	EXPECT_NE(env.find("export QOR_SYSROOT='" + root + "'\n"), std::string::npos) << env;
	EXPECT_NE(env.find("export DBUS_SYSTEM_BUS_ADDRESS='unix:"), std::string::npos) << env;
	EXPECT_NE(env.find("export JOTLOG_FILE='" + root + "/jotlog'\n"), std::string::npos) << env;
	EXPECT_NE(env.find("export VORN_TIME_SCALE='0.01'\n"), std::string::npos) << env;
	EXPECT_FALSE(test_read_file(root + "/jotlog").empty());

	pid_t daemon = read_pid(root + "/qor-server.pid");
	pid_t devsim = read_pid(root + "/qor-devsim.pid");
	pid_t bus = read_pid(root + "/dbus-daemon.pid");
	ASSERT_GT(daemon, 0);
	ASSERT_GT(devsim, 0);
	ASSERT_GT(bus, 0);
	EXPECT_EQ(test_read_file("/proc/" + std::to_string(daemon) + "/comm"), "qor-server\n");
	EXPECT_FALSE(mounts_below(root).empty());

	// A scenario request goes through the daemon to the emulated kernel.
	ASSERT_TRUE(test_send_unix(root + "/dev/socket/scenario_info", "AppLaunch[START][PID]1234"));
	EXPECT_TRUE(test_wait_for(
		[&] { return contains(root + "/journal", " /sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min 1200000 id2\n"); },
		10s))
		<< test_read_file(root + "/journal");

	ASSERT_EQ(kill(p.pid, SIGTERM), 0);
	EXPECT_EQ(exit_code(p, 30s), 0) << test_read_file(root + "/emu.err");
	EXPECT_TRUE(pid_gone(daemon));
	EXPECT_TRUE(pid_gone(devsim));
	EXPECT_TRUE(pid_gone(bus));
	EXPECT_TRUE(mounts_below(root).empty());
}

// qor-devsim killed outright leaves its mounts dangling; the launcher still removes them.
TEST(QorEmu, MountsOfADeadKernelAreRemoved)
{
	test_tmpdir tmp;
	const std::string &root = tmp.path;
	test_process p;
	std::string out = root + "/emu.out";
	ASSERT_TRUE(p.start({emu, "--root", root, "--time-scale", "0.01"}, {"QOR_BUILD_DIR=" + test_build_dir()}, out,
			    root + "/emu.err"));
	ASSERT_TRUE(test_wait_for([&] { return contains(out, "qor-emu: ready") || !p.running(); }, 60s));
	ASSERT_TRUE(contains(out, "qor-emu: ready")) << test_read_file(root + "/emu.err");
	pid_t devsim = read_pid(root + "/qor-devsim.pid");
	ASSERT_GT(devsim, 0);
	ASSERT_EQ(kill(devsim, SIGKILL), 0);
	ASSERT_TRUE(test_wait_for([&] { return contains(root + "/emu.err", "qor-devsim (" + std::to_string(devsim) + ") has ended"); }, 10s));
	EXPECT_FALSE(mounts_below(root).empty()) << "a killed FUSE server leaves its mount";

	ASSERT_EQ(kill(p.pid, SIGTERM), 0);
	EXPECT_EQ(exit_code(p, 30s), 0) << test_read_file(root + "/emu.err");
	EXPECT_TRUE(mounts_below(root).empty());
	EXPECT_TRUE(pid_gone(read_pid(root + "/qor-server.pid")));
	EXPECT_TRUE(pid_gone(read_pid(root + "/dbus-daemon.pid")));
}

// A phone whose kernel never gets ready: what was started is stopped and the launcher fails.
TEST(QorEmu, FailedStartIsTornDown)
{
	test_tmpdir tmp;
	const std::string bin = tmp.path + "/bin", root = tmp.path + "/root";
	ASSERT_TRUE(test_mkdirs(bin));
	for (const char *exe : {"qor-server", "setstore", "qor-send"})
		ASSERT_EQ(symlink((test_build_dir() + "/" + exe).c_str(), (bin + "/" + exe).c_str()), 0);
	ASSERT_TRUE(test_write_file(bin + "/qor-devsim", "#!/bin/sh\nexec sleep 60\n"));
	ASSERT_EQ(chmod((bin + "/qor-devsim").c_str(), 0755), 0);

	test_process p;
	std::string out = tmp.path + "/emu.out";
	ASSERT_TRUE(p.start({emu, "--root", root}, {"QOR_BUILD_DIR=" + bin, "QOR_EMU_STEP_TIMEOUT=1"}, out,
			    tmp.path + "/emu.err"));
	EXPECT_EQ(exit_code(p, 30s), 1);
	EXPECT_FALSE(contains(out, "ready"));
	EXPECT_TRUE(contains(tmp.path + "/emu.err", "qor-devsim did not get ready"));
	pid_t fake_devsim = read_pid(root + "/qor-devsim.pid");
	pid_t bus = read_pid(root + "/dbus-daemon.pid");
	EXPECT_TRUE(pid_gone(fake_devsim));
	EXPECT_TRUE(pid_gone(bus));
	EXPECT_FALSE(std::ifstream(root + "/qor-server.pid").good()) << "the daemon was never started";
}

} // namespace
