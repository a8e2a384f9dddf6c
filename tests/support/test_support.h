// Helpers for tests that run real processes: temporary roots, child processes, bounded waits.
#pragma once
#include <chrono>
#include <functional>
#include <string>
#include <sys/types.h>
#include <vector>

// A temporary directory removed (recursively) on destruction. Short, under /tmp, so that
// Unix socket paths below it stay within 107 characters.
struct test_tmpdir {
	test_tmpdir();
	~test_tmpdir();
	test_tmpdir(const test_tmpdir &) = delete;
	test_tmpdir &operator=(const test_tmpdir &) = delete;
	std::string path;
};

// A child process started with fork/exec; stopped (SIGTERM, then SIGKILL) and reaped on destruction.
struct test_process {
	test_process() = default;
	// argv[0] is the program; env entries "NAME=value" are added to the current environment.
	// stdout_file/stderr_file: "" keeps the test's own streams.
	bool start(const std::vector<std::string> &argv, const std::vector<std::string> &env = {},
		   const std::string &stdout_file = "", const std::string &stderr_file = "");
	// Waits for the exit, at most timeout; returns true with the wait status once exited.
	bool wait_exit(std::chrono::milliseconds timeout, int *status);
	bool running();
	void stop(std::chrono::milliseconds grace = std::chrono::milliseconds(3000));
	~test_process();
	test_process(const test_process &) = delete;
	test_process &operator=(const test_process &) = delete;
	pid_t pid = -1;
};

// Polls cond every 10 ms until it holds or the deadline passes.
bool test_wait_for(const std::function<bool()> &cond, std::chrono::milliseconds timeout);

std::string test_read_file(const std::string &path);
bool test_write_file(const std::string &path, const std::string &text);
// Creates every directory of path (like mkdir -p).
bool test_mkdirs(const std::string &path);
// Connects to a Unix stream socket, writes text (may be empty) and closes. false when connect fails.
bool test_send_unix(const std::string &path, const std::string &text);
// A listening Unix stream socket at path (a stale file there is replaced); -1 on failure.
int test_listen_unix(const std::string &path);
// Accepts connections on listen_fd and reads each to its end, in order: stops at want texts, or
// when none is pending (wait 0), or when the wait has passed.
std::vector<std::string> test_accept_texts(int listen_fd, size_t want, std::chrono::milliseconds wait);
// Directory holding the built executables.
std::string test_build_dir(void);

// The emulated phone (tools/qor-emu) on a fresh temporary root; stopped on destruction.
struct test_emu {
	test_emu() = default;
	test_emu(const test_emu &) = delete;
	test_emu &operator=(const test_emu &) = delete;
	// Starts qor-emu and waits (bounded) for "qor-emu: ready". extra_env is passed to qor-emu.
	bool start(double time_scale = 0.01, const std::vector<std::string> &extra_env = {});
	// SIGTERM and wait for qor-emu's full teardown; returns its exit status, or -1 when it had to
	// be killed (what it started is then killed by pid and its mounts lazily detached).
	int stop();
	~test_emu();
	std::string root() const { return dir.path; }
	std::string journal() const;
	std::string jotlog() const;
	// Environment entries of emu.env ("NAME=value"), for tools run against the phone.
	std::vector<std::string> env() const;
	test_tmpdir dir;
	test_process process;
};
