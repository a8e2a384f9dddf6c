// Process, file and socket helpers for integration tests.
#include "test_support.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <poll.h>
#include <sstream>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

#ifndef QOR_BUILD_DIR
#error "QOR_BUILD_DIR must name the build directory"
#endif

test_tmpdir::test_tmpdir()
{
	char tmpl[] = "/tmp/qt.XXXXXX";
	const char *p = mkdtemp(tmpl);
	path = p ? p : "";
}

test_tmpdir::~test_tmpdir()
{
	if (!path.empty()) {
		std::error_code ec;
		std::filesystem::remove_all(path, ec);
	}
}

bool test_process::start(const std::vector<std::string> &argv, const std::vector<std::string> &env,
			 const std::string &stdout_file, const std::string &stderr_file)
{
	std::vector<char *> args;
	for (const auto &a : argv)
		args.push_back(const_cast<char *>(a.c_str()));
	args.push_back(nullptr);
	pid = fork();
	if (pid < 0)
		return false;
	if (pid == 0) {
		for (const auto &e : env)
			putenv(const_cast<char *>(e.c_str()));
		if (!stdout_file.empty()) {
			int fd = open(stdout_file.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
			if (fd >= 0)
				dup2(fd, STDOUT_FILENO);
		}
		if (!stderr_file.empty()) {
			int fd = open(stderr_file.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
			if (fd >= 0)
				dup2(fd, STDERR_FILENO);
		}
		execvp(args[0], args.data());
		_exit(127);
	}
	return true;
}

bool test_process::wait_exit(std::chrono::milliseconds timeout, int *status)
{
	if (pid <= 0)
		return false;
	auto deadline = std::chrono::steady_clock::now() + timeout;
	for (;;) {
		int st;
		pid_t r = waitpid(pid, &st, WNOHANG);
		if (r == pid) {
			pid = -1;
			if (status)
				*status = st;
			return true;
		}
		if (r < 0)
			return false;
		if (std::chrono::steady_clock::now() >= deadline)
			return false;
		std::this_thread::sleep_for(std::chrono::milliseconds(10));
	}
}

bool test_process::running()
{
	return pid > 0 && waitpid(pid, nullptr, WNOHANG) == 0;
}

void test_process::stop(std::chrono::milliseconds grace)
{
	if (pid <= 0)
		return;
	kill(pid, SIGTERM);
	if (!wait_exit(grace, nullptr) && pid > 0) {
		kill(pid, SIGKILL);
		wait_exit(std::chrono::milliseconds(5000), nullptr);
	}
	pid = -1;
}

test_process::~test_process()
{
	stop();
}

bool test_wait_for(const std::function<bool()> &cond, std::chrono::milliseconds timeout)
{
	auto deadline = std::chrono::steady_clock::now() + timeout;
	for (;;) {
		if (cond())
			return true;
		if (std::chrono::steady_clock::now() >= deadline)
			return false;
		std::this_thread::sleep_for(std::chrono::milliseconds(10));
	}
}

std::string test_read_file(const std::string &path)
{
	std::ifstream in(path, std::ios::binary);
	std::stringstream ss;
	ss << in.rdbuf();
	return ss.str();
}

bool test_write_file(const std::string &path, const std::string &text)
{
	std::ofstream out(path, std::ios::binary | std::ios::trunc);
	out << text;
	return static_cast<bool>(out);
}

bool test_mkdirs(const std::string &path)
{
	std::error_code ec;
	std::filesystem::create_directories(path, ec);
	return !ec;
}

bool test_send_unix(const std::string &path, const std::string &text)
{
	int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
	if (fd < 0)
		return false;
	sockaddr_un addr{};
	addr.sun_family = AF_UNIX;
	if (path.size() >= sizeof addr.sun_path) {
		close(fd);
		return false;
	}
	memcpy(addr.sun_path, path.c_str(), path.size() + 1);
	if (connect(fd, reinterpret_cast<sockaddr *>(&addr), sizeof addr) < 0) {
		close(fd);
		return false;
	}
	bool ok = text.empty() || send(fd, text.data(), text.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(text.size());
	close(fd);
	return ok;
}

int test_listen_unix(const std::string &path)
{
	sockaddr_un addr{};
	addr.sun_family = AF_UNIX;
	if (path.size() >= sizeof addr.sun_path)
		return -1;
	memcpy(addr.sun_path, path.c_str(), path.size() + 1);
	unlink(path.c_str());
	int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
	if (fd >= 0 && (bind(fd, reinterpret_cast<sockaddr *>(&addr), sizeof addr) < 0 || listen(fd, 64) < 0)) {
		close(fd);
		fd = -1;
	}
	return fd;
}

std::vector<std::string> test_accept_texts(int listen_fd, size_t want, std::chrono::milliseconds wait)
{
	std::vector<std::string> texts;
	auto deadline = std::chrono::steady_clock::now() + wait;
	while (texts.size() < want) {
		auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
		pollfd p{listen_fd, POLLIN, 0};
		if (poll(&p, 1, left.count() > 0 ? static_cast<int>(left.count()) : 0) != 1)
			break;
		int c = accept(listen_fd, nullptr, nullptr);
		if (c < 0)
			break;
		std::string text;
		char buf[256];
		ssize_t n;
		while ((n = read(c, buf, sizeof buf)) > 0)
			text.append(buf, static_cast<size_t>(n));
		close(c);
		texts.push_back(text);
	}
	return texts;
}

std::string test_build_dir(void)
{
	return QOR_BUILD_DIR;
}

bool test_emu::start(double time_scale, const std::vector<std::string> &extra_env)
{
	std::vector<std::string> env = {"QOR_BUILD_DIR=" + test_build_dir()}; // extra_env may override
	env.insert(env.end(), extra_env.begin(), extra_env.end());
	std::string out = dir.path + "/emu.out";
	char scale[32];
	snprintf(scale, sizeof scale, "%g", time_scale);
	if (!process.start({std::string(QOR_SOURCE_DIR) + "/tools/qor-emu", "--root", dir.path, "--time-scale", scale},
			   env, out, dir.path + "/emu.err"))
		return false;
	std::string ready = "qor-emu: ready " + dir.path + "\n";
	return test_wait_for([&] { return test_read_file(out).find(ready) != std::string::npos || !process.running(); },
			     std::chrono::seconds(60)) &&
	       test_read_file(out).find(ready) != std::string::npos;
}

namespace {

// qor-emu's longest teardown: three processes at 6 s + 5 s each, and the unmounts.
constexpr auto EMU_GRACE = std::chrono::seconds(60);

// Whether a live process has root in its command line or environment (pid files can be stale).
bool runs_on(pid_t pid, const std::string &root)
{
	std::string proc = "/proc/" + std::to_string(pid);
	return pid > 0 && (test_read_file(proc + "/cmdline").find(root) != std::string::npos ||
			   test_read_file(proc + "/environ").find(root) != std::string::npos);
}

} // namespace

int test_emu::stop()
{
	if (process.pid <= 0)
		return -1;
	kill(process.pid, SIGTERM);
	int status;
	if (process.wait_exit(EMU_GRACE, &status))
		return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
	// qor-emu hung in its teardown: end what it started and detach what is still mounted, so
	// that removing the root never walks into a mount.
	process.stop(std::chrono::milliseconds(0));
	for (const char *name : {"qor-server", "qor-devsim", "dbus-daemon"}) {
		std::string text = test_read_file(dir.path + "/" + name + ".pid");
		pid_t pid = text.empty() ? -1 : static_cast<pid_t>(std::atoi(text.c_str()));
		if (runs_on(pid, dir.path))
			kill(pid, SIGKILL);
	}
	std::ifstream in("/proc/self/mountinfo");
	std::vector<std::string> mounts;
	for (std::string id, parent, dev, root, mp, rest; in >> id >> parent >> dev >> root >> mp && std::getline(in, rest);)
		if (mp.starts_with(dir.path + "/"))
			mounts.push_back(mp);
	for (auto it = mounts.rbegin(); it != mounts.rend(); ++it) {
		test_process umount;
		if (umount.start({"fusermount3", "-uz", *it}) && !umount.wait_exit(std::chrono::seconds(5), nullptr))
			umount.stop();
	}
	return -1;
}

test_emu::~test_emu()
{
	stop();
}

std::string test_emu::journal() const
{
	return test_read_file(dir.path + "/journal");
}

std::string test_emu::jotlog() const
{
	return test_read_file(dir.path + "/jotlog");
}

std::vector<std::string> test_emu::env() const
{
	std::vector<std::string> vars;
	std::istringstream in(test_read_file(dir.path + "/emu.env"));
	std::string line;
	while (std::getline(in, line)) {
		// export NAME='value'
		if (line.rfind("export ", 0) != 0)
			continue;
		std::string kv = line.substr(7);
		size_t eq = kv.find('=');
		if (eq == std::string::npos)
			continue;
		std::string value = kv.substr(eq + 1);
		if (value.size() >= 2 && value.front() == '\'' && value.back() == '\'')
			value = value.substr(1, value.size() - 2);
		vars.push_back(kv.substr(0, eq) + "=" + value);
	}
	return vars;
}
