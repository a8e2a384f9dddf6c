// Settings store: values on disk, atomic replacement, change notification on the Ecore loop,
// and the setstore command-line tool.
#include "setstore.h"
#include "test_support.h"

#include <Ecore.h>
#include <atomic>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <gtest/gtest.h>
#include <map>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>

using namespace std::chrono_literals;

namespace {

// Registrations outlive a test, so Ecore stays up for the whole program.
struct ecore_env : ::testing::Environment {
	void SetUp() override
	{
		ecore_app_no_system_modules();
		ecore_init();
		// The tests reap their own children; Ecore's SIGCHLD handler would reap them first.
		signal(SIGCHLD, SIG_DFL);
	}
};
[[maybe_unused]] auto *const env = ::testing::AddGlobalTestEnvironment(new ecore_env);

// Each test gets its own root.
class Setstore : public ::testing::Test {
protected:
	void SetUp() override
	{
		ASSERT_FALSE(tmp.path.empty());
		setenv("QOR_SYSROOT", tmp.path.c_str(), 1);
	}
	void TearDown() override { unsetenv("QOR_SYSROOT"); }
	std::string file(const std::string &key) { return tmp.path + "/var/lib/setstore/" + key; }
	void put(const std::string &key, const std::string &text)
	{
		std::filesystem::path p = file(key);
		ASSERT_TRUE(test_mkdirs(p.parent_path()));
		ASSERT_TRUE(test_write_file(p, text));
	}
	test_tmpdir tmp;
};

TEST_F(Setstore, ValuesRoundTripAsDecimalText)
{
	for (int v : {0, 1, -1, 42, INT_MAX, INT_MIN}) {
		ASSERT_EQ(setstore_set_int("memory/pm/state", v), 0);
		int got = 12345;
		ASSERT_EQ(setstore_get_int("memory/pm/state", &got), 0);
		EXPECT_EQ(got, v);
	}
	EXPECT_EQ(test_read_file(file("memory/pm/state")), std::to_string(INT_MIN) + "\n");
	struct stat st;
	ASSERT_EQ(stat(file("memory/pm/state").c_str(), &st), 0);
	EXPECT_EQ(st.st_mode & 0777, 0644u);
	// No temporary file is left beside the key.
	int entries = 0;
	for ([[maybe_unused]] auto &e : std::filesystem::directory_iterator(file("memory/pm")))
		entries++;
	EXPECT_EQ(entries, 1);
}

TEST_F(Setstore, FileContentsAreParsedStrictly)
{
	struct row {
		const char *text;
		bool ok;
		int value;
	} rows[] = {
		{"5", true, 5},
		{"-7\n", true, -7},
		{"2147483647\n", true, INT_MAX},
		{"-2147483648", true, INT_MIN},
		{"", false, 0},
		{"\n", false, 0},
		{"abc\n", false, 0},
		{"5x\n", false, 0},
		{" 5\n", false, 0},
		{"5\n\n", false, 0},
		{"+5\n", false, 0},
		{"-\n", false, 0},
		{"2147483648\n", false, 0},
		{"99999999999999999999999999999999999999\n", false, 0},
	};
	for (const row &r : rows) {
		SCOPED_TRACE(testing::PrintToString(std::string(r.text)));
		put("db/k", r.text);
		int got = -999;
		int res = setstore_get_int("db/k", &got);
		if (r.ok) {
			EXPECT_EQ(res, 0);
			EXPECT_EQ(got, r.value);
		} else {
			EXPECT_LT(res, 0);
			EXPECT_EQ(got, -999) << "a failed read must not touch the result";
		}
	}
	// An embedded NUL is garbage too (the literal above stops at it, so write it by hand).
	put("db/k", std::string("7\0\n", 3));
	int got;
	EXPECT_LT(setstore_get_int("db/k", &got), 0);
}

TEST_F(Setstore, BooleansAreZeroOrOne)
{
	bool b = false;
	put("memory/call/ecc_state", "1\n");
	ASSERT_EQ(setstore_get_bool("memory/call/ecc_state", &b), 0);
	EXPECT_TRUE(b);
	for (const char *bad : {"2\n", "-1\n", "true\n"}) {
		put("memory/call/ecc_state", bad);
		EXPECT_LT(setstore_get_bool("memory/call/ecc_state", &b), 0) << bad;
		EXPECT_TRUE(b);
	}
}

TEST_F(Setstore, MissingKeysAndBadNamesFail)
{
	int v;
	bool b;
	EXPECT_EQ(setstore_get_int("memory/none", &v), -ENOENT);
	EXPECT_EQ(setstore_get_bool("no/such/dir/key", &b), -ENOENT);
	EXPECT_LT(setstore_get_int("memory/none", nullptr), 0);
	// A directory where the value should be is not a value.
	ASSERT_TRUE(test_mkdirs(file("memory/adir")));
	EXPECT_LT(setstore_get_int("memory/adir", &v), 0);

	for (const char *bad : {"", "/abs", "a//b", "../escape", "a/../b", "a/./b", "a/", "."}) {
		SCOPED_TRACE(bad);
		EXPECT_LT(setstore_get_int(bad, &v), 0);
		EXPECT_LT(setstore_set_int(bad, 1), 0);
		EXPECT_LT(setstore_notify_key_changed(bad, [](setstore_keynode_t *, void *) {}, nullptr), 0);
	}
	EXPECT_LT(setstore_get_int(nullptr, &v), 0);
	EXPECT_LT(setstore_set_int(std::string(300, 'k').c_str(), 1), 0);
	EXPECT_FALSE(std::filesystem::exists(tmp.path + "/var/lib/escape"));
	put("memory/file", "1\n"); // a key where a directory would have to go
	EXPECT_LT(setstore_set_int("memory/file/sub", 3), 0);
}

// A reader polling while a writer keeps replacing the key sees one whole value or the other.
TEST_F(Setstore, ReadersNeverSeeAHalfWrittenValue)
{
	const int a = 1111111111, b = -22;
	ASSERT_EQ(setstore_set_int("memory/atomic", a), 0);
	std::atomic<bool> done{false};
	std::thread writer([&] {
		for (int i = 0; i < 3000; i++)
			setstore_set_int("memory/atomic", i % 2 ? a : b);
		done = true;
	});
	int reads = 0, bad = 0, failed = 0;
	while (!done) {
		int v;
		if (setstore_get_int("memory/atomic", &v) < 0)
			failed++;
		else if (v != a && v != b)
			bad++;
		reads++;
	}
	writer.join();
	EXPECT_GT(reads, 0);
	EXPECT_EQ(failed, 0);
	EXPECT_EQ(bad, 0);
}

// Notification: callbacks record into process-wide state, because a registration outlives its test.
std::map<long, int> calls;
std::map<long, std::string> last_name;

void record(setstore_keynode_t *node, void *tag)
{
	long t = reinterpret_cast<long>(tag);
	calls[t]++;
	last_name[t] = setstore_keynode_get_name(node);
}

void *tag(long t)
{
	return reinterpret_cast<void *>(t);
}

Eina_Bool poll_tick(void *data)
{
	auto *p = static_cast<std::pair<std::function<bool()>, std::chrono::steady_clock::time_point> *>(data);
	if (p->first() || std::chrono::steady_clock::now() >= p->second) {
		ecore_main_loop_quit();
		return ECORE_CALLBACK_CANCEL;
	}
	return ECORE_CALLBACK_RENEW;
}

// Runs the Ecore loop until cond holds (true) or the timeout passes (false).
bool loop_until(std::function<bool()> cond, std::chrono::milliseconds timeout)
{
	std::pair<std::function<bool()>, std::chrono::steady_clock::time_point> p{cond,
										   std::chrono::steady_clock::now() + timeout};
	ecore_timer_add(0.01, poll_tick, &p);
	ecore_main_loop_begin();
	return cond();
}

// Lets already-queued events run, so that "nothing happened" is checked after the fact.
void drain_loop()
{
	loop_until([] { return false; }, 150ms);
}

using SetstoreNotify = Setstore;

TEST_F(SetstoreNotify, CallbackRunsOnTheLoopAfterASet)
{
	calls.clear();
	ASSERT_EQ(setstore_notify_key_changed("memory/pm/state", record, tag(1)), 0);
	ASSERT_EQ(setstore_set_int("memory/pm/state", 3), 0);
	EXPECT_EQ(calls[1], 0) << "delivered from the loop, not from inside the set";
	ASSERT_TRUE(loop_until([] { return calls[1] >= 1; }, 5s));
	EXPECT_EQ(last_name[1], "memory/pm/state");
	drain_loop();
	EXPECT_EQ(calls[1], 1) << "one completed change, one call";
	ASSERT_EQ(setstore_set_int("memory/pm/state", 1), 0);
	ASSERT_TRUE(loop_until([] { return calls[1] >= 2; }, 5s));
}

TEST_F(SetstoreNotify, ChangeByAnotherProcessIsSeen)
{
	calls.clear();
	ASSERT_EQ(setstore_notify_key_changed("memory/call/state", record, tag(2)), 0);
	test_process child;
	ASSERT_TRUE(child.start({test_build_dir() + "/setstore", "set", "memory/call/state", "4"},
				{"QOR_SYSROOT=" + tmp.path}));
	// The child has finished before the loop runs: the event waits in the queue.
	int status = -1;
	ASSERT_TRUE(child.wait_exit(5s, &status));
	EXPECT_EQ(status, 0);
	ASSERT_TRUE(loop_until([] { return calls[2] >= 1; }, 5s));
	EXPECT_EQ(last_name[2], "memory/call/state");
	int v;
	ASSERT_EQ(setstore_get_int("memory/call/state", &v), 0);
	EXPECT_EQ(v, 4);
}

TEST_F(SetstoreNotify, WatchingCreatesTheDirectoryAndSeesPlainWrites)
{
	calls.clear();
	ASSERT_FALSE(std::filesystem::exists(file("memory/private/overheat")));
	ASSERT_EQ(setstore_notify_key_changed("memory/private/overheat/gate_log", record, tag(3)), 0);
	EXPECT_TRUE(std::filesystem::is_directory(file("memory/private/overheat")));
	// Written in place, as a shell redirection does: the close after writing counts.
	ASSERT_TRUE(test_write_file(file("memory/private/overheat/gate_log"), "5\n"));
	ASSERT_TRUE(loop_until([] { return calls[3] >= 1; }, 5s));
}

TEST_F(SetstoreNotify, EveryWatcherOfADirectoryGetsOnlyItsOwnKey)
{
	calls.clear();
	ASSERT_EQ(setstore_notify_key_changed("memory/sysman/power_off", record, tag(10)), 0);
	ASSERT_EQ(setstore_notify_key_changed("memory/sysman/power_off", record, tag(11)), 0);
	ASSERT_EQ(setstore_notify_key_changed("memory/sysman/charger_status", record, tag(12)), 0);
	ASSERT_EQ(setstore_notify_key_changed("memory/sysman/power_off2", record, tag(13)), 0);

	ASSERT_EQ(setstore_set_int("memory/sysman/power_off", 2), 0);
	ASSERT_TRUE(loop_until([] { return calls[10] >= 1 && calls[11] >= 1; }, 5s));
	drain_loop();
	EXPECT_EQ(calls[12], 0);
	EXPECT_EQ(calls[13], 0);

	ASSERT_EQ(setstore_set_int("memory/sysman/charger_status", 1), 0);
	ASSERT_TRUE(loop_until([] { return calls[12] >= 1; }, 5s));
	EXPECT_EQ(last_name[12], "memory/sysman/charger_status");
	// A name that merely starts with another key's name is a different key.
	ASSERT_EQ(setstore_set_int("memory/sysman/power_off2", 1), 0);
	ASSERT_TRUE(loop_until([] { return calls[13] >= 1; }, 5s));
	drain_loop();
	EXPECT_EQ(calls[10], 1);
	EXPECT_EQ(calls[11], 1);
	EXPECT_EQ(calls[12], 1);
}

// The command-line tool, run as a separate program on the same root.
class SetstoreCli : public Setstore {
protected:
	int run(const std::vector<std::string> &args, std::string *out = nullptr)
	{
		std::vector<std::string> argv{test_build_dir() + "/setstore"};
		argv.insert(argv.end(), args.begin(), args.end());
		std::string out_file = tmp.path + "/cli.out";
		test_process p;
		if (!p.start(argv, {"QOR_SYSROOT=" + tmp.path}, out_file, tmp.path + "/cli.err"))
			return -1;
		int status;
		if (!p.wait_exit(10s, &status) || !WIFEXITED(status))
			return -1;
		if (out)
			*out = test_read_file(out_file);
		return WEXITSTATUS(status);
	}
};

TEST_F(SetstoreCli, ExitCodesTellSuccessFailureAndMisuse)
{
	std::string out;
	EXPECT_EQ(run({"set", "db/private/overheat/control", "1"}), 0);
	EXPECT_EQ(run({"get", "db/private/overheat/control"}, &out), 0);
	EXPECT_EQ(out, "1\n");
	EXPECT_EQ(run({"set", "db/x", "-12"}), 0);

	EXPECT_EQ(run({"get", "db/missing"}, &out), 1);
	EXPECT_EQ(out, "");
	put("db/garbled", "1x\n");
	EXPECT_EQ(run({"get", "db/garbled"}), 1);
	put("db/file", "1\n");
	EXPECT_EQ(run({"set", "db/file/sub", "1"}), 1);
	EXPECT_EQ(run({"watch", "a//b"}), 1);

	EXPECT_EQ(run({}), 2);
	EXPECT_EQ(run({"frob", "db/x"}), 2);
	EXPECT_EQ(run({"get", "db/x", "extra"}), 2);
	EXPECT_EQ(run({"set", "db/x", "12abc"}), 2);
	EXPECT_EQ(run({"set", "db/x", "99999999999"}), 2);
	EXPECT_EQ(run({"watch"}), 2);
	EXPECT_EQ(run({"get", "db/x"}, &out), 0);
	EXPECT_EQ(out, "-12\n") << "a refused set leaves the value alone";
	EXPECT_EQ(run({"--help"}, &out), 0);
	EXPECT_NE(out.find("setstore watch"), std::string::npos);
}

TEST_F(SetstoreCli, WatchPrintsChangesUntilTerminated)
{
	std::string out_file = tmp.path + "/watch.out";
	test_process watch;
	ASSERT_TRUE(watch.start({test_build_dir() + "/setstore", "watch", "memory/pm/state", "memory/camera/state"},
				{"QOR_SYSROOT=" + tmp.path}, out_file));
	// The watcher registers asynchronously: keep changing the key until it reports.
	int v = 0;
	ASSERT_TRUE(test_wait_for(
		[&] {
			setstore_set_int("memory/pm/state", 1);
			return test_read_file(out_file).find("memory/pm/state 1\n") != std::string::npos;
		},
		10s));
	ASSERT_EQ(setstore_set_int("memory/camera/state", 3), 0);
	ASSERT_TRUE(test_wait_for(
		[&] { return test_read_file(out_file).find("memory/camera/state 3\n") != std::string::npos; }, 5s));
	ASSERT_EQ(setstore_get_int("memory/camera/state", &v), 0);

	ASSERT_EQ(kill(watch.pid, SIGTERM), 0);
	int status = -1;
	ASSERT_TRUE(watch.wait_exit(5s, &status));
	EXPECT_TRUE(WIFEXITED(status));
	EXPECT_EQ(WEXITSTATUS(status), 0);
}

} // namespace
