// qor-devsim as a process: the mounted nodes, the kernel log, the journal, the display service
// on a private bus, and its start and stop.
#include "test_support.h"

#include <algorithm>
#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <sstream>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

using namespace std::chrono_literals;

namespace {

constexpr char CPUFREQ_MIN[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min";
constexpr char SCALING_MAX[] = "/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq";
constexpr char GPU_MIN[] = "/sys/power/gpufreq_min_limit";
constexpr char AP_THERM[] = "/sys/class/xun/temperature/ap_therm";
constexpr char KMSG[] = "/dev/kmsg";

bool is_mounted(const std::string &path)
{
	return test_read_file("/proc/self/mountinfo").find(" " + path + " ") != std::string::npos;
}

// One qor-devsim on its own root; stopped when the test ends, and whatever it left mounted
// (killed, crashed) detached.
struct devsim_run {
	test_tmpdir dir;
	test_process proc;
	~devsim_run()
	{
		proc.stop();
		for (const char *rel : {KMSG, "/sys"})
			while (is_mounted(path(rel)) && umount2(path(rel).c_str(), MNT_DETACH) == 0)
				;
	}
	std::string path(const char *rel) const { return dir.path + rel; }
	std::string err() const { return test_read_file(path("/err")); }
	std::string journal() const { return test_read_file(path("/journal")); }
	// A later --root in args takes the place of this run's own.
	bool start(std::vector<std::string> args, const std::vector<std::string> &env = {})
	{
		args.insert(args.begin(), {test_build_dir() + "/qor-devsim", "--root", dir.path});
		return proc.start(args, env, path("/out"), path("/err"));
	}
	bool ready()
	{
		auto up = [&] { return test_read_file(path("/out")) == "qor-devsim: ready\n"; };
		return test_wait_for([&] { return up() || !proc.running(); }, 10s) && up();
	}
	int exit_status()
	{
		int st = 0;
		return proc.wait_exit(10s, &st) && WIFEXITED(st) ? WEXITSTATUS(st) : -1;
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

// The text one read returns, or "errno N".
std::string read_node(const std::string &path, int fd = -1)
{
	int own = fd < 0 ? open(path.c_str(), O_RDONLY) : fd;
	char buf[8192];
	ssize_t n = own < 0 ? -1 : pread(own, buf, sizeof buf, 0);
	std::string r = n < 0 ? "errno " + std::to_string(errno) : std::string(buf, static_cast<size_t>(n));
	if (fd < 0 && own >= 0)
		close(own);
	return r;
}

struct DevsimNodes : ::testing::Test {
	devsim_run dev;
	void SetUp() override
	{
		ASSERT_TRUE(test_write_file(dev.path("/journal"), "1 stale event of an earlier run\n"));
		ASSERT_TRUE(dev.start({"--no-display", "--journal", dev.path("/journal")}));
		ASSERT_TRUE(dev.ready()) << dev.err();
	}
	std::string node(const char *rel) { return dev.path(rel); }
};

TEST_F(DevsimNodes, WritesAreWholeValuesSeenAtOnceAndJournaledInOrder)
{
	int held = open(node(SCALING_MAX).c_str(), O_RDONLY); // a kept descriptor sees each new value
	ASSERT_GE(held, 0);
	EXPECT_EQ(read_node("", held), "1400000\n");
	ASSERT_EQ(write_node(node("/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max"), "1000000 id6"), 0);
	EXPECT_EQ(read_node("", held), "1000000\n");
	close(held);
	ASSERT_EQ(write_node(node(CPUFREQ_MIN), "900000 id3", 0, 5), 0); // the offset is ignored
	EXPECT_EQ(read_node(node(CPUFREQ_MIN)), "900000\n");
	ASSERT_EQ(write_node(node(GPU_MIN), "123456", O_TRUNC), 0);
	ASSERT_EQ(write_node(node(GPU_MIN), "7"), 0); // no O_TRUNC, shorter text: nothing of 123456 stays
	close(open(node(GPU_MIN).c_str(), O_WRONLY | O_TRUNC)); // truncation alone is no write
	ASSERT_EQ(truncate(node(GPU_MIN).c_str(), 0), 0);
	EXPECT_EQ(read_node(node(GPU_MIN)), "7\n");
	int fd = open(node(KMSG).c_str(), O_WRONLY);
	ASSERT_GE(fd, 0);
	ASSERT_EQ(write(fd, "[thermal] a\\b\n", 14), 14); // two records on one descriptor stay two
	ASSERT_EQ(write(fd, "two\nlines", 9), 9);
	close(fd);
	ASSERT_EQ(write_node(node(AP_THERM), "fail"), 0);
	EXPECT_EQ(read_node(node(AP_THERM)), "errno " + std::to_string(EIO));
	std::string verbatim = "temp:\n" + std::string(4090, 'z'); // the longest text, served whole
	ASSERT_EQ(write_node(node(AP_THERM), verbatim), 0);
	EXPECT_EQ(read_node(node(AP_THERM)), verbatim);
	EXPECT_EQ(dev.journal(), "1 /sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max 1000000 id6\n"
				 "2 /sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min 900000 id3\n"
				 "3 /sys/power/gpufreq_min_limit 123456\n"
				 "4 /sys/power/gpufreq_min_limit 7\n"
				 "5 /dev/kmsg [thermal] a\\\\b\\n\n"
				 "6 /dev/kmsg two\\nlines\n"
				 "7 /sys/class/xun/temperature/ap_therm fail\n"
				 "8 /sys/class/xun/temperature/ap_therm temp:\\n" +
					 std::string(4090, 'z') + "\n");
}

TEST_F(DevsimNodes, TheTreeIsFixedAndBadWritesAreRefused)
{
	std::string names;
	for (const auto &e : std::filesystem::directory_iterator(node("/sys/class/xun/temperature")))
		if ((names += e.path().filename().string() + ",").size() > 100)
			break; // a listing that never ends
	EXPECT_EQ(names, "ap_therm,batt_therm,xo_therm,");
	for (const char *missing : {"/sys/power/gpufreq_boost", "/sys/sys"}) {
		EXPECT_EQ(write_node(node(missing), "1"), ENOENT) << missing;
		EXPECT_EQ(write_node(node(missing), "1", O_CREAT), ENOENT) << missing;
		EXPECT_EQ(access(node(missing).c_str(), F_OK), -1) << missing;
	}
	EXPECT_EQ(mkdir(node("/sys/power/extra").c_str(), 0755), -1);
	EXPECT_EQ(write_node(node(GPU_MIN), "6"), 0);
	EXPECT_EQ(write_node(node(GPU_MIN), std::string(4097, '1')), EINVAL); // not journaled
	EXPECT_EQ(write_node(node(CPUFREQ_MIN), "bogus"), EINVAL);	       // journaled
	EXPECT_EQ(write_node(node(SCALING_MAX), "1"), EACCES);
	EXPECT_EQ(read_node(node(GPU_MIN)), "6\n");
	EXPECT_EQ(dev.journal(), "1 /sys/power/gpufreq_min_limit 6\n"
				 "2 /sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min bogus\n");
}

// Several writers at once: every write is served and journaled exactly once, each writer's in
// its own order.
TEST_F(DevsimNodes, ConcurrentWritersAreJournaledOnceEach)
{
	constexpr int WRITERS = 4, WRITES = 150;
	const char *targets[WRITERS] = {"/sys/power/gpufreq_max_limit", GPU_MIN, AP_THERM, KMSG};
	std::vector<std::thread> threads;
	for (int w = 0; w < WRITERS; w++)
		threads.emplace_back([&, w] {
			for (int i = 0; i < WRITES; i++)
				EXPECT_EQ(write_node(node(targets[w]), std::to_string(i)), 0);
		});
	for (auto &t : threads)
		t.join();
	std::istringstream lines(dev.journal());
	std::string path;
	int count = 0, next[WRITERS] = {}, seq, value;
	while (lines >> seq >> path >> value) {
		ASSERT_EQ(seq, ++count) << path;
		auto w = std::find(targets, targets + WRITERS, path) - targets;
		ASSERT_LT(w, WRITERS) << path;
		EXPECT_EQ(value, next[w]++) << seq;
	}
	EXPECT_EQ(count, WRITERS * WRITES);
	EXPECT_EQ(read_node(node(GPU_MIN)), std::to_string(WRITES - 1) + "\n");
}

TEST(DevsimDisplay, CallsAreAnsweredAndJournaledInOrder)
{
	test_tmpdir tmp;
	std::string address = "unix:path=" + tmp.path + "/bus", printed = tmp.path + "/address";
	test_process bus;
	ASSERT_TRUE(bus.start({"dbus-daemon", "--config-file=" QOR_PRIVATE_BUS_CONF, "--nofork", "--address=" + address,
			       "--print-address=1"},
			      {}, printed, "/dev/null"));
	ASSERT_TRUE(test_wait_for([&] { return !test_read_file(printed).empty(); }, 10s));
	devsim_run dev;
	ASSERT_TRUE(dev.start({"--journal", dev.path("/journal")}, {"DBUS_SYSTEM_BUS_ADDRESS=" + address}));
	ASSERT_TRUE(dev.ready()) << dev.err();
	auto call = [&](const std::string &method_and_value) { // busctl's reply, bounded by timeout(1)
		std::string out(64, '\0'), cmd = "timeout 10 busctl --address=" + address +
						   " -- call org.vexel.system.corvad /Org/Vexel/System/Corvad/Display "
						   "org.vexel.system.corvad.display " + method_and_value;
		FILE *p = popen(cmd.c_str(), "r");
		out.resize(p ? fread(out.data(), 1, out.size(), p) : 0);
		return p && pclose(p) == 0 ? out : "failed: " + out;
	};
	EXPECT_EQ(call("SetMaxBrightness i 55"), "i 0\n");
	ASSERT_EQ(write_node(dev.path(GPU_MIN), "3"), 0);
	EXPECT_EQ(call("SetAutoToneForce i -1"), "i 0\n");
	EXPECT_EQ(dev.journal(), "1 dbus SetMaxBrightness 55\n"
				 "2 /sys/power/gpufreq_min_limit 3\n"
				 "3 dbus SetAutoToneForce -1\n");
}

// A journal that cannot be written is reported and leaves the nodes working; a stop signal
// unmounts both mounts and ends with status 0.
TEST(DevsimLifecycle, StopSignalsUnmountAndExitZero)
{
	for (int sig : {SIGTERM, SIGINT}) {
		devsim_run dev;
		ASSERT_TRUE(dev.start({"--no-display", "--journal", "/dev/full"}));
		ASSERT_TRUE(dev.ready()) << dev.err();
		EXPECT_TRUE(is_mounted(dev.path("/sys")) && is_mounted(dev.path(KMSG)));
		ASSERT_EQ(write_node(dev.path(GPU_MIN), "4"), 0);
		ASSERT_EQ(write_node(dev.path(KMSG), "record"), 0);
		EXPECT_EQ(read_node(dev.path(GPU_MIN)), "4\n");
		EXPECT_TRUE(test_wait_for([&] { return dev.err().find("event 2") != std::string::npos; }, 5s)) << dev.err();
		kill(dev.proc.pid, sig);
		EXPECT_EQ(dev.exit_status(), 0) << dev.err();
		EXPECT_FALSE(is_mounted(dev.path("/sys")) || is_mounted(dev.path(KMSG))) << sig;
	}
}

// Each refused start exits 1 with a reason and nothing mounted; the running one keeps serving.
TEST(DevsimLifecycle, UnusableStartsAreRefused)
{
	devsim_run first;
	ASSERT_TRUE(first.start({"--no-display"}));
	ASSERT_TRUE(first.ready()) << first.err();
	struct {
		bool sys_is_file;
		std::vector<std::string> args, env;
		const char *reason;
	} cases[] = {
		{true, {"--no-display"}, {}, "not a directory"},
		{false, {"--root", first.dir.path, "--no-display"}, {}, "mounted there already"},
		{false, {}, {"DBUS_SYSTEM_BUS_ADDRESS=unix:path=/nonexistent/bus"}, "system bus"},
		{false, {"--root", "/nonexistent/root", "--no-display"}, {}, "root /nonexistent/root"},
		{false, {"--no-display", "--journal", "/nonexistent/journal"}, {}, "journal /nonexistent/journal"},
	};
	for (const auto &c : cases) {
		devsim_run dev;
		ASSERT_TRUE(!c.sys_is_file || test_write_file(dev.path("/sys"), "not a directory"));
		ASSERT_TRUE(dev.start(c.args, c.env));
		EXPECT_EQ(dev.exit_status(), 1) << c.reason;
		EXPECT_NE(dev.err().find(c.reason), std::string::npos) << dev.err();
		EXPECT_FALSE(is_mounted(dev.path("/sys")) || is_mounted(dev.path(KMSG))) << c.reason;
	}
	EXPECT_EQ(write_node(first.path(GPU_MIN), "5"), 0); // also without a journal
	EXPECT_EQ(read_node(first.path(GPU_MIN)), "5\n");
}

} // namespace
