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
#include <gtest/gtest.h>
#include <optional>
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

class Setstore : public ::testing::Test {
protected:
	void SetUp() override { setenv("QOR_SYSROOT", tmp.path.c_str(), 1); }
	std::string file(const std::string &key) { return tmp.path + "/var/lib/setstore/" + key; }
	void put(const std::string &key, const std::string &text)
	{
		ASSERT_TRUE(test_mkdirs(std::filesystem::path(file(key)).parent_path()));
		ASSERT_TRUE(test_write_file(file(key), text));
	}
	test_tmpdir tmp;
};

TEST_F(Setstore, ValuesRoundTripAsDecimalTextReplacedWhole)
{
	for (int v : {0, -1, INT_MAX, INT_MIN}) {
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
	auto entries = std::distance(std::filesystem::directory_iterator(file("memory/pm")), {});
	EXPECT_EQ(entries, 1);
}

TEST_F(Setstore, FileContentsAreParsedStrictly)
{
	const std::pair<std::string, std::optional<int>> rows[] = {
		{"5", 5}, {"1\n", 1}, {"-7\n", -7}, {"2147483647\n", INT_MAX}, {"-2147483648", INT_MIN},
		{"", {}}, {"\n", {}}, {"5x\n", {}}, {" 5\n", {}}, {"5\n\n", {}}, {"+5\n", {}}, {"-\n", {}},
		{"2147483648\n", {}}, {std::string("7\0\n", 3), {}}, {std::string(40, '9') + "\n", {}},
	};
	for (const auto &[text, value] : rows) {
		SCOPED_TRACE(testing::PrintToString(text));
		put("db/k", text);
		int got = -999;
		bool b = false;
		EXPECT_EQ(setstore_get_int("db/k", &got) == 0, value.has_value());
		EXPECT_EQ(got, value.value_or(-999)) << "a failed read must not touch the result";
		// Booleans are 0 or 1; any other number fails like garbage.
		bool is_bool = value == 0 || value == 1;
		EXPECT_EQ(setstore_get_bool("db/k", &b) == 0, is_bool);
		EXPECT_EQ(b, is_bool && value == 1);
	}
}

TEST_F(Setstore, MissingKeysAndBadNamesFail)
{
	int v;
	bool b;
	EXPECT_EQ(setstore_get_int("memory/none", &v), -ENOENT);
	EXPECT_EQ(setstore_get_bool("no/such/dir/key", &b), -ENOENT);
	EXPECT_LT(setstore_get_int("memory/none", nullptr), 0);
	ASSERT_TRUE(test_mkdirs(file("memory/adir"))); // a directory is not a value
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
	int reads = 0, bad = 0;
	for (int v; !done; reads++)
		if (setstore_get_int("memory/atomic", &v) < 0 || (v != a && v != b))
			bad++;
	writer.join();
	EXPECT_GT(reads, 0);
	EXPECT_EQ(bad, 0);
}

// What a registration saw; static in each test, because a registration outlives its test.
struct seen {
	int calls = 0;
	std::string name;
};

void record(setstore_keynode_t *node, void *data)
{
	static_cast<seen *>(data)->calls++;
	static_cast<seen *>(data)->name = setstore_keynode_get_name(node);
}

// Runs the Ecore loop until cond holds; with a false cond, lets queued events run for a while.
bool loop_until(const std::function<bool()> &cond, std::chrono::milliseconds timeout = 5s)
{
	return test_wait_for([&] {
		ecore_main_loop_iterate();
		return cond();
	}, timeout);
}

TEST_F(Setstore, EveryWatcherGetsOneCallPerChangeOfItsOwnKeyOnTheLoop)
{
	// Two watchers of power_off; power_off2 merely starts with its name and is a different key.
	static seen w[4];
	const char *keys[] = {"memory/sysman/power_off", "memory/sysman/power_off", "memory/sysman/charger_status",
			      "memory/sysman/power_off2"};
	for (int i = 0; i < 4; i++)
		ASSERT_EQ(setstore_notify_key_changed(keys[i], record, &w[i]), 0);
	// The directory is made at once, so the first write of a key is seen.
	EXPECT_TRUE(std::filesystem::is_directory(file("memory/sysman")));
	for (int i = 1; i < 4; i++)
		ASSERT_EQ(setstore_set_int(keys[i], 1), 0);
	EXPECT_EQ(w[0].calls, 0) << "delivered from the loop, not from inside the set";
	ASSERT_TRUE(loop_until([] { return w[0].calls && w[1].calls && w[2].calls && w[3].calls; }));
	loop_until([] { return false; }, 150ms);
	for (int i = 0; i < 4; i++) {
		EXPECT_EQ(w[i].calls, 1) << keys[i];
		EXPECT_EQ(w[i].name, keys[i]);
	}
	// Written in place, as a shell redirection does: the close after writing counts.
	ASSERT_TRUE(test_write_file(file(keys[2]), "5\n"));
	EXPECT_TRUE(loop_until([] { return w[2].calls == 2; }));
}

// The command-line tool, run as a separate program on the same root.
TEST_F(Setstore, CliExitCodesTellSuccessFailureAndMisuse)
{
	auto run = [&](std::vector<std::string> args) {
		args.insert(args.begin(), test_build_dir() + "/setstore");
		test_process p;
		int status = -1;
		bool ok = p.start(args, {"QOR_SYSROOT=" + tmp.path}, tmp.path + "/cli.out", "/dev/null") && p.wait_exit(10s, &status);
		return ok && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
	};
	put("db/garbled", "1x\n");
	put("db/file", "1\n");
	const std::pair<std::vector<std::string>, int> rows[] = {
		{{"set", "db/x", "-12"}, 0}, {{"get", "db/missing"}, 1}, {{"get", "db/garbled"}, 1},
		{{"set", "db/file/sub", "1"}, 1}, {{"watch", "a//b"}, 1}, {{}, 2}, {{"frob", "db/x"}, 2},
		{{"get", "db/x", "extra"}, 2}, {{"set", "db/x", "12abc"}, 2}, {{"set", "db/x", "99999999999"}, 2},
		{{"watch"}, 2}, {{"get", "db/x"}, 0},
	};
	for (const auto &[args, code] : rows)
		EXPECT_EQ(run(args), code) << testing::PrintToString(args);
	EXPECT_EQ(test_read_file(tmp.path + "/cli.out"), "-12\n") << "a refused set leaves the value alone";
	EXPECT_EQ(run({"--help"}), 0);
	EXPECT_NE(test_read_file(tmp.path + "/cli.out").find("setstore watch"), std::string::npos);
}

TEST_F(Setstore, CliWatchPrintsChangesUntilTerminated)
{
	std::string out = tmp.path + "/watch.out";
	test_process watch;
	ASSERT_TRUE(watch.start({test_build_dir() + "/setstore", "watch", "memory/pm/state", "memory/camera/state"},
				{"QOR_SYSROOT=" + tmp.path}, out));
	auto printed = [&](const char *line) { return test_read_file(out).find(line) != std::string::npos; };
	// The watcher registers asynchronously: keep changing the key until it reports.
	ASSERT_TRUE(test_wait_for([&] { return setstore_set_int("memory/pm/state", 1) == 0 && printed("memory/pm/state 1\n"); }, 10s));
	ASSERT_EQ(setstore_set_int("memory/camera/state", 3), 0);
	ASSERT_TRUE(test_wait_for([&] { return printed("memory/camera/state 3\n"); }, 5s));
	ASSERT_EQ(kill(watch.pid, SIGTERM), 0);
	int status = -1;
	ASSERT_TRUE(watch.wait_exit(5s, &status));
	EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
}

} // namespace
