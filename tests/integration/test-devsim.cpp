// qor-devsim as a process: the mounted nodes, the kernel log, the journal, the display service
// on a private bus, and its start and stop.
#include "test_support.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <gtest/gtest.h>
#include <sstream>
#include <string>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

#ifndef QOR_PRIVATE_BUS_CONF
#error "QOR_PRIVATE_BUS_CONF must name data/dbus/private-bus.conf"
#endif

using namespace std::chrono_literals;

namespace {

constexpr char CPUFREQ_MIN[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min";
constexpr char CPUFREQ_MAX[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max";
constexpr char SCALING_MAX[] = "/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq";
constexpr char GPU_MIN[] = "/sys/power/gpufreq_min_limit";
constexpr char AP_THERM[] = "/sys/class/xun/temperature/ap_therm";
constexpr char KMSG[] = "/dev/kmsg";

bool is_mounted(const std::string &path)
{
	std::ifstream in("/proc/self/mountinfo");
	std::string line;
	while (std::getline(in, line)) {
		std::istringstream fields(line);
		std::string id, parent, dev, root, point;
		fields >> id >> parent >> dev >> root >> point;
		if (point == path)
			return true;
	}
	return false;
}

// Last resort for a devsim that could not unmount (killed, crashed): detach what is left.
struct mount_guard {
	std::string root;
	~mount_guard()
	{
		for (const char *rel : {KMSG, "/sys"}) {
			std::string p = root + rel;
			while (is_mounted(p) && umount2(p.c_str(), MNT_DETACH) == 0)
				;
		}
	}
};

// One qor-devsim on its own root; stopped, and its mounts removed, when the test ends.
struct devsim_run {
	test_tmpdir dir;
	mount_guard guard{dir.path};
	test_process proc;

	std::string path(const char *rel) const { return dir.path + rel; }
	std::string out() const { return test_read_file(path("/out")); }
	std::string err() const { return test_read_file(path("/err")); }
	std::string journal() const { return test_read_file(path("/journal")); }

	bool start(std::vector<std::string> extra, const std::vector<std::string> &env = {})
	{
		std::vector<std::string> argv = {test_build_dir() + "/qor-devsim", "--root", dir.path};
		argv.insert(argv.end(), extra.begin(), extra.end());
		return proc.start(argv, env, path("/out"), path("/err"));
	}
	bool ready()
	{
		return test_wait_for([&] { return out() == "qor-devsim: ready\n" || !proc.running(); }, 10s) &&
		       out() == "qor-devsim: ready\n";
	}
	// Waits for an exit and gives its status, or -1.
	int exit_status(std::chrono::milliseconds limit = 10s)
	{
		int st = 0;
		if (!proc.wait_exit(limit, &st))
			return -1;
		return WIFEXITED(st) ? WEXITSTATUS(st) : 128 + WTERMSIG(st);
	}
};

// A private system bus from the repository's permissive configuration.
struct private_bus {
	test_tmpdir dir;
	test_process proc;
	std::string address;

	bool start()
	{
		std::string file = dir.path + "/address";
		if (!proc.start({"dbus-daemon", "--config-file=" QOR_PRIVATE_BUS_CONF, "--nofork", "--print-address=1"}, {},
				file, "/dev/null"))
			return false;
		test_wait_for([&] { return test_read_file(file).find('\n') != std::string::npos; }, 10s);
		std::string text = test_read_file(file);
		address = text.substr(0, text.find('\n'));
		return !address.empty();
	}
	std::string env() const { return "DBUS_SYSTEM_BUS_ADDRESS=" + address; }

	// Calls a display method with busctl; its output, or "exit N" when it failed.
	std::string call_display(const char *member, int value)
	{
		std::string out = dir.path + "/call";
		test_process busctl;
		busctl.start({"busctl", "--system", "--", "call", "org.vexel.system.corvad", "/Org/Vexel/System/Corvad/Display",
			      "org.vexel.system.corvad.display", member, "i", std::to_string(value)},
			     {env()}, out, "/dev/null");
		int st = 0;
		if (!busctl.wait_exit(10s, &st))
			return "timeout";
		if (!WIFEXITED(st) || WEXITSTATUS(st) != 0)
			return "exit " + std::to_string(WEXITSTATUS(st));
		return test_read_file(out);
	}
};

// One open, one pwrite at off, one close; 0 or the errno of the step that failed.
int write_node(const std::string &path, const std::string &text, int flags = 0, off_t off = 0)
{
	int fd = open(path.c_str(), O_WRONLY | flags, 0644);
	if (fd < 0)
		return errno;
	int r = pwrite(fd, text.data(), text.size(), off) < 0 ? errno : 0;
	close(fd);
	return r;
}

// The node's text, or "errno N".
std::string read_node(const std::string &path)
{
	int fd = open(path.c_str(), O_RDONLY);
	if (fd < 0)
		return "errno " + std::to_string(errno);
	char buf[8192];
	ssize_t n = read(fd, buf, sizeof buf);
	int err = errno;
	close(fd);
	return n < 0 ? "errno " + std::to_string(err) : std::string(buf, static_cast<size_t>(n));
}

struct DevsimNodes : ::testing::Test {
	devsim_run dev;
	void SetUp() override
	{
		ASSERT_TRUE(dev.start({"--no-display", "--journal", dev.path("/journal")}));
		ASSERT_TRUE(dev.ready()) << dev.err();
	}
	std::string node(const char *rel) { return dev.path(rel); }
};

TEST_F(DevsimNodes, PmqosAggregatesAndReleasesByIdentity)
{
	ASSERT_EQ(write_node(node(CPUFREQ_MIN), "1200000 id2"), 0);
	ASSERT_EQ(write_node(node(CPUFREQ_MIN), "800000 id5"), 0);
	ASSERT_EQ(write_node(node(CPUFREQ_MIN), "-1 id2"), 0);
	EXPECT_EQ(read_node(node(CPUFREQ_MIN)), "800000\n");
	// A reader that keeps its descriptor sees each new value, as with sysfs.
	int fd = open(node(SCALING_MAX).c_str(), O_RDONLY);
	ASSERT_GE(fd, 0);
	char buf[64];
	EXPECT_EQ(std::string(buf, std::max<ssize_t>(0, pread(fd, buf, sizeof buf, 0))), "1400000\n");
	ASSERT_EQ(write_node(node(CPUFREQ_MAX), "1000000 id6"), 0);
	EXPECT_EQ(std::string(buf, std::max<ssize_t>(0, pread(fd, buf, sizeof buf, 0))), "1000000\n");
	close(fd);
}

TEST_F(DevsimNodes, EachWriteIsTheWholeValueWhateverTheOffset)
{
	ASSERT_EQ(write_node(node(CPUFREQ_MIN), "900000 id3", 0, 5), 0);
	EXPECT_EQ(read_node(node(CPUFREQ_MIN)), "900000\n");
	ASSERT_EQ(write_node(node(GPU_MIN), "123456", O_TRUNC), 0);
	ASSERT_EQ(write_node(node(GPU_MIN), "7"), 0); // no O_TRUNC, shorter text: nothing of 123456 stays
	EXPECT_EQ(read_node(node(GPU_MIN)), "7\n");
	ASSERT_EQ(write_node(node(AP_THERM), "broken driver text"), 0);
	ASSERT_EQ(write_node(node(AP_THERM), "xy", 0, 100), 0);
	EXPECT_EQ(read_node(node(AP_THERM)), "xy");
	// A truncating open without a write changes nothing and is no event.
	int fd = open(node(GPU_MIN).c_str(), O_WRONLY | O_TRUNC);
	ASSERT_GE(fd, 0);
	close(fd);
	ASSERT_EQ(truncate(node(GPU_MIN).c_str(), 0), 0);
	EXPECT_EQ(read_node(node(GPU_MIN)), "7\n");
	std::string journal = dev.journal();
	EXPECT_EQ(std::count(journal.begin(), journal.end(), '\n'), 5) << journal;
}

TEST_F(DevsimNodes, SensorFailsWithEioUntilTheNextWrite)
{
	EXPECT_EQ(read_node(node(AP_THERM)), "temp: 40\n");
	ASSERT_EQ(write_node(node(AP_THERM), "fail"), 0);
	EXPECT_EQ(read_node(node(AP_THERM)), "errno " + std::to_string(EIO));
	EXPECT_EQ(read_node(node(AP_THERM)), "errno " + std::to_string(EIO));
	ASSERT_EQ(write_node(node(AP_THERM), " 72\n"), 0);
	EXPECT_EQ(read_node(node(AP_THERM)), "temp: 72\n");
	std::string verbatim = "temp:\n" + std::string(4090, 'z');
	ASSERT_EQ(write_node(node(AP_THERM), verbatim), 0);
	EXPECT_EQ(read_node(node(AP_THERM)), verbatim);
}

TEST_F(DevsimNodes, UnknownNodesAndOverlongTextsAreRefused)
{
	std::string unknown = node("/sys/power/gpufreq_boost");
	EXPECT_EQ(write_node(unknown, "1"), ENOENT);
	EXPECT_EQ(write_node(unknown, "1", O_CREAT), ENOENT);
	struct stat st;
	EXPECT_EQ(stat(unknown.c_str(), &st), -1);
	EXPECT_EQ(mkdir(node("/sys/power/extra").c_str(), 0755), -1);
	EXPECT_EQ(write_node(node(GPU_MIN), "6"), 0);
	EXPECT_EQ(write_node(node(GPU_MIN), std::string(4097, '1')), EINVAL);
	EXPECT_EQ(read_node(node(GPU_MIN)), "6\n");
	EXPECT_EQ(write_node(node(GPU_MIN), "fast"), EINVAL);
	EXPECT_EQ(write_node(node(SCALING_MAX), "1"), EACCES);
	EXPECT_EQ(read_node(node("/sys/kernel/debug/wakeup_sources_active")), "");
}

TEST_F(DevsimNodes, JournalListsEveryWriteInOrder)
{
	ASSERT_EQ(write_node(node(CPUFREQ_MIN), "1200000 id2"), 0);
	int fd = open(node(KMSG).c_str(), O_WRONLY);
	ASSERT_GE(fd, 0);
	ASSERT_EQ(write(fd, "[thermal] a\\b\n", 14), 14); // two records on one descriptor stay two
	ASSERT_EQ(write(fd, "two\nlines", 9), 9);
	close(fd);
	ASSERT_EQ(write_node(node(GPU_MIN), "6"), 0);
	ASSERT_EQ(write_node(node(CPUFREQ_MIN), "bogus"), EINVAL); // refused, yet written
	ASSERT_EQ(write_node(node(AP_THERM), "fail"), 0);
	ASSERT_EQ(write_node(node(CPUFREQ_MIN), "-1 id2", O_TRUNC), 0);
	EXPECT_EQ(dev.journal(), "1 /sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min 1200000 id2\n"
				 "2 /dev/kmsg [thermal] a\\\\b\\n\n"
				 "3 /dev/kmsg two\\nlines\n"
				 "4 /sys/power/gpufreq_min_limit 6\n"
				 "5 /sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min bogus\n"
				 "6 /sys/class/xun/temperature/ap_therm fail\n"
				 "7 /sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min -1 id2\n");
}

// Several writers at once: every write is served and journaled exactly once, each writer's in
// its own order.
TEST_F(DevsimNodes, ConcurrentWritersAreJournaledOnceEach)
{
	constexpr int WRITERS = 4, WRITES = 150;
	const char *targets[WRITERS] = {CPUFREQ_MIN, GPU_MIN, AP_THERM, KMSG};
	std::vector<std::thread> threads;
	for (int w = 0; w < WRITERS; w++)
		threads.emplace_back([&, w] {
			for (int i = 0; i < WRITES; i++)
				EXPECT_EQ(write_node(node(targets[w]), std::to_string(i) + (w == 0 ? " id1" : "")), 0);
		});
	for (auto &t : threads)
		t.join();
	std::istringstream lines(dev.journal());
	std::string line;
	int count = 0, next[WRITERS] = {};
	while (std::getline(lines, line)) {
		std::istringstream f(line);
		int seq, value;
		std::string path;
		f >> seq >> path >> value;
		ASSERT_EQ(seq, ++count) << line;
		int w = 0;
		while (w < WRITERS && path != targets[w])
			w++;
		ASSERT_LT(w, WRITERS) << line;
		EXPECT_EQ(value, next[w]++) << line;
	}
	EXPECT_EQ(count, WRITERS * WRITES);
	EXPECT_EQ(read_node(node(GPU_MIN)), std::to_string(WRITES - 1) + "\n");
}

TEST(DevsimDisplay, CallsAreAnsweredAndJournaledInOrder)
{
	private_bus bus;
	ASSERT_TRUE(bus.start());
	devsim_run dev;
	ASSERT_TRUE(dev.start({"--journal", dev.path("/journal")}, {bus.env()}));
	ASSERT_TRUE(dev.ready()) << dev.err();
	EXPECT_EQ(bus.call_display("SetMaxBrightness", 55), "i 0\n");
	ASSERT_EQ(write_node(dev.path(GPU_MIN), "3"), 0);
	EXPECT_EQ(bus.call_display("SetAutoToneForce", -1), "i 0\n");
	EXPECT_EQ(dev.journal(), "1 dbus SetMaxBrightness 55\n"
				 "2 /sys/power/gpufreq_min_limit 3\n"
				 "3 dbus SetAutoToneForce -1\n");
}

TEST(DevsimDisplay, NoDisplayLeavesTheServiceAbsent)
{
	private_bus bus;
	ASSERT_TRUE(bus.start());
	devsim_run dev;
	ASSERT_TRUE(dev.start({"--no-display", "--journal", dev.path("/journal")}, {bus.env()}));
	ASSERT_TRUE(dev.ready()) << dev.err();
	EXPECT_NE(bus.call_display("SetMaxBrightness", 55), "i 0\n");
	EXPECT_EQ(dev.journal(), "");
}

TEST(DevsimLifecycle, StopSignalsUnmountAndExitZero)
{
	for (int sig : {SIGTERM, SIGINT}) {
		devsim_run dev;
		ASSERT_TRUE(dev.start({"--no-display"}));
		ASSERT_TRUE(dev.ready()) << dev.err();
		EXPECT_TRUE(is_mounted(dev.path("/sys")));
		EXPECT_TRUE(is_mounted(dev.path(KMSG)));
		kill(dev.proc.pid, sig);
		EXPECT_EQ(dev.exit_status(), 0) << dev.err();
		EXPECT_FALSE(is_mounted(dev.path("/sys"))) << sig;
		EXPECT_FALSE(is_mounted(dev.path(KMSG))) << sig;
	}
}

TEST(DevsimLifecycle, UnusableMountPointsAreRefused)
{
	{
		devsim_run dev;
		ASSERT_TRUE(test_write_file(dev.path("/sys"), "not a directory"));
		ASSERT_TRUE(dev.start({"--no-display"}));
		EXPECT_EQ(dev.exit_status(), 1);
		EXPECT_NE(dev.err().find(dev.path("/sys")), std::string::npos) << dev.err();
		EXPECT_FALSE(is_mounted(dev.path(KMSG)));
	}
	{
		devsim_run dev;
		ASSERT_TRUE(dev.start({"--no-display"}));
		ASSERT_TRUE(dev.ready()) << dev.err();
		test_process second;
		ASSERT_TRUE(second.start({test_build_dir() + "/qor-devsim", "--root", dev.dir.path, "--no-display"}, {},
					 "/dev/null", dev.path("/err2")));
		int st = 0;
		ASSERT_TRUE(second.wait_exit(10s, &st));
		EXPECT_TRUE(WIFEXITED(st) && WEXITSTATUS(st) != 0);
		EXPECT_NE(test_read_file(dev.path("/err2")).find("mounted there already"), std::string::npos);
		EXPECT_EQ(read_node(dev.path(GPU_MIN)), "0\n"); // the first one still serves
	}
	{
		devsim_run dev;
		ASSERT_TRUE(dev.start({}, {"DBUS_SYSTEM_BUS_ADDRESS=unix:path=" + dev.path("/no-bus")}));
		EXPECT_EQ(dev.exit_status(), 1);
		EXPECT_NE(dev.err().find("system bus"), std::string::npos) << dev.err();
		EXPECT_FALSE(is_mounted(dev.path("/sys")));
	}
	devsim_run dev;
	ASSERT_TRUE(dev.proc.start({test_build_dir() + "/qor-devsim", "--root", dev.path("/missing"), "--no-display"}, {},
				   "/dev/null", "/dev/null"));
	EXPECT_EQ(dev.exit_status(), 1);
}

TEST(DevsimLifecycle, JournalFailureLeavesTheNodesWorking)
{
	devsim_run dev;
	ASSERT_TRUE(dev.start({"--no-display", "--journal", "/dev/full"}));
	ASSERT_TRUE(dev.ready()) << dev.err();
	ASSERT_EQ(write_node(dev.path(GPU_MIN), "4"), 0);
	ASSERT_EQ(write_node(dev.path(KMSG), "record"), 0);
	EXPECT_EQ(read_node(dev.path(GPU_MIN)), "4\n");
	EXPECT_TRUE(test_wait_for([&] { return dev.err().find("event 2") != std::string::npos; }, 5s)) << dev.err();
	kill(dev.proc.pid, SIGTERM);
	EXPECT_EQ(dev.exit_status(), 0);
}

} // namespace
