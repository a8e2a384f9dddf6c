// The emulator launcher: start-up on a prepared root, and a teardown that leaves no process and
// no mount behind, also after its kernel died and when start-up fails.
#include "test_support.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <fstream>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#ifndef QOR_SOURCE_DIR
#error "QOR_SOURCE_DIR must name the source tree"
#endif

using namespace std::chrono_literals;

namespace {

bool contains(const std::string &path, const std::string &needle)
{
	return test_read_file(path).find(needle) != std::string::npos;
}

// Mount points at or below dir, as this process sees them.
int mounts_below(const std::string &dir)
{
	std::ifstream in("/proc/self/mountinfo");
	int n = 0;
	for (std::string id, parent, dev, root, mp, rest; in >> id >> parent >> dev >> root >> mp && std::getline(in, rest);)
		n += mp == dir || mp.starts_with(dir + "/");
	return n;
}

pid_t pid_in(const std::string &file)
{
	std::string text = test_read_file(file);
	return text.empty() ? -1 : std::stoi(text);
}

bool gone(pid_t pid)
{
	return pid > 0 && kill(pid, 0) < 0 && errno == ESRCH;
}

// qor-devsim killed outright leaves its mounts dangling; the launcher still removes them.
TEST(QorEmu, KeepsTheCallersLayoutAndLeavesNothingBehindAfterItsKernelDied)
{
	test_emu emu;
	const std::string root = emu.root();
	ASSERT_TRUE(test_mkdirs(root + "/proc") && test_mkdirs(root + "/var/lib/setstore/memory/camera"));
	ASSERT_TRUE(test_write_file(root + "/proc/cmdline", "console=ttyS0 marker=kept\n"));
	ASSERT_TRUE(test_write_file(root + "/var/lib/setstore/memory/camera/state", "2\n"));
	ASSERT_TRUE(emu.start()) << test_read_file(root + "/emu.err");

	EXPECT_EQ(test_read_file(root + "/proc/cmdline"), "console=ttyS0 marker=kept\n");
	EXPECT_EQ(test_read_file(root + "/var/lib/setstore/memory/camera/state"), "2\n");
	EXPECT_EQ(test_read_file(root + "/var/lib/setstore/db/private/overheat/control"), "1\n");
	EXPECT_TRUE(contains(root + "/proc/cpuinfo", "Revision\t: 000a\n"));
	std::vector<std::string> env = emu.env();
	for (const std::string &v : {"QOR_SYSROOT=" + root, "JOTLOG_FILE=" + root + "/jotlog", std::string("VORN_TIME_SCALE=0.01")})
		EXPECT_NE(std::find(env.begin(), env.end(), v), env.end()) << v;
	EXPECT_FALSE(emu.jotlog().empty());
	pid_t daemon = pid_in(root + "/qor-server.pid"), devsim = pid_in(root + "/qor-devsim.pid"),
	      bus = pid_in(root + "/dbus-daemon.pid");
	EXPECT_EQ(test_read_file("/proc/" + std::to_string(daemon) + "/comm"), "qor-server\n");

	ASSERT_EQ(kill(devsim, SIGKILL), 0);
	ASSERT_TRUE(test_wait_for([&] { return contains(root + "/emu.err", "qor-devsim (" + std::to_string(devsim) + ") has ended"); }, 10s));
	EXPECT_GT(mounts_below(root), 0) << "a killed FUSE server leaves its mount";
	EXPECT_EQ(emu.stop(), 0) << test_read_file(root + "/emu.err");
	EXPECT_EQ(mounts_below(root), 0);
	EXPECT_TRUE(gone(daemon) && gone(bus));
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
	ASSERT_TRUE(p.start({std::string(QOR_SOURCE_DIR) + "/tools/qor-emu", "--root", root},
			    {"QOR_BUILD_DIR=" + bin, "QOR_EMU_STEP_TIMEOUT=1"}, tmp.path + "/emu.out", tmp.path + "/emu.err"));
	int status = -1;
	ASSERT_TRUE(p.wait_exit(30s, &status));
	EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 1) << status;
	EXPECT_FALSE(contains(tmp.path + "/emu.out", "ready"));
	EXPECT_TRUE(contains(tmp.path + "/emu.err", "qor-devsim did not get ready"));
	EXPECT_TRUE(gone(pid_in(root + "/qor-devsim.pid")) && gone(pid_in(root + "/dbus-daemon.pid")));
	EXPECT_EQ(pid_in(root + "/qor-server.pid"), -1) << "the daemon was never started";
}

// A daemon that ignores SIGTERM keeps qor-emu's teardown busy past a few seconds: the helper's
// own clean-up (no stop() call) waits for it, and no process or mount stays behind.
TEST(QorEmu, HelperOutwaitsTheTeardownOfAStubbornDaemon)
{
	test_tmpdir bin;
	for (const char *exe : {"qor-devsim", "setstore", "qor-send"})
		ASSERT_EQ(symlink((test_build_dir() + "/" + exe).c_str(), (bin.path + "/" + exe).c_str()), 0);
	ASSERT_TRUE(test_write_file(bin.path + "/qor-server", "#!/bin/bash\ntrap '' TERM\n"
							     "echo stubborn >>\"$JOTLOG_FILE\"\n"
							     "mkfifo \"$QOR_SYSROOT/hold\" && exec 3<>\"$QOR_SYSROOT/hold\"\n"
							     "while :; do read -r -t 1 -u 3 _ || :; done\n"));
	ASSERT_EQ(chmod((bin.path + "/qor-server").c_str(), 0755), 0);
	std::string root;
	pid_t daemon = -1, devsim = -1, bus = -1;
	{
		test_emu emu;
		root = emu.root();
		ASSERT_TRUE(emu.start(0.01, {"QOR_BUILD_DIR=" + bin.path})) << test_read_file(root + "/emu.err");
		daemon = pid_in(root + "/qor-server.pid");
		devsim = pid_in(root + "/qor-devsim.pid");
		bus = pid_in(root + "/dbus-daemon.pid");
		ASSERT_GT(mounts_below(root), 0);
	}
	EXPECT_EQ(mounts_below(root), 0);
	EXPECT_TRUE(test_wait_for([&] { return gone(daemon) && gone(devsim) && gone(bus); }, 5s));
}

} // namespace
