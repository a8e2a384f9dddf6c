// Write latency of an emulated node (open, write, close) next to the same on a tmpfs file.
// Prints median and 99th percentile in microseconds; asserts nothing.
#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <poll.h>
#include <string>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#ifndef QOR_DEVSIM_PATH
#error "QOR_DEVSIM_PATH must name the qor-devsim executable"
#endif

namespace {

constexpr int ROUNDS = 5000;
constexpr char TEXT[] = "1200000 id2";

struct devsim_child {
	pid_t pid = -1;
	std::string root;

	bool start()
	{
		char tmpl[] = "/tmp/qb.XXXXXX";
		if (!mkdtemp(tmpl))
			return false;
		root = tmpl;
		int out[2];
		if (pipe(out) < 0)
			return false;
		pid = fork();
		if (pid == 0) {
			dup2(out[1], STDOUT_FILENO);
			execl(QOR_DEVSIM_PATH, "qor-devsim", "--root", root.c_str(), "--no-display", (char *)nullptr);
			_exit(127);
		}
		close(out[1]);
		// Ready line within 10 s, or give up.
		std::string got;
		auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
		while (got.find('\n') == std::string::npos && std::chrono::steady_clock::now() < deadline) {
			pollfd p = {out[0], POLLIN, 0};
			if (poll(&p, 1, 100) <= 0)
				continue;
			char buf[64];
			ssize_t n = read(out[0], buf, sizeof buf);
			if (n <= 0)
				break;
			got.append(buf, static_cast<size_t>(n));
		}
		close(out[0]);
		return pid > 0 && got == "qor-devsim: ready\n";
	}

	~devsim_child()
	{
		if (pid > 0) {
			kill(pid, SIGTERM);
			int st;
			for (int i = 0; i < 300 && waitpid(pid, &st, WNOHANG) == 0; i++)
				usleep(10000);
			if (waitpid(pid, &st, WNOHANG) == 0) {
				kill(pid, SIGKILL);
				waitpid(pid, &st, 0);
			}
		}
		if (root.empty())
			return;
		umount2((root + "/dev/kmsg").c_str(), MNT_DETACH); // only if it was left behind
		umount2((root + "/sys").c_str(), MNT_DETACH);
		unlink((root + "/dev/kmsg").c_str());
		rmdir((root + "/dev").c_str());
		rmdir((root + "/sys").c_str());
		rmdir(root.c_str());
	}
};

// Latencies in microseconds of ROUNDS open/write/close cycles on path; empty on a failure.
std::vector<double> measure(const std::string &path)
{
	std::vector<double> us;
	us.reserve(ROUNDS);
	for (int i = 0; i < ROUNDS; i++) {
		auto t0 = std::chrono::steady_clock::now();
		int fd = open(path.c_str(), O_WRONLY);
		if (fd < 0 || write(fd, TEXT, sizeof TEXT - 1) != sizeof TEXT - 1) {
			fprintf(stderr, "bench-devsim: %s: %s\n", path.c_str(), strerror(errno));
			if (fd >= 0)
				close(fd);
			return {};
		}
		close(fd);
		us.push_back(std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - t0).count());
	}
	std::sort(us.begin(), us.end());
	return us;
}

void print(const char *what, const std::vector<double> &us)
{
	printf("%-34s median %7.1f us   p99 %7.1f us   (%d writes)\n", what, us[us.size() / 2],
	       us[us.size() * 99 / 100], ROUNDS);
}

} // namespace

int main()
{
	devsim_child dev;
	if (!dev.start()) {
		fprintf(stderr, "bench-devsim: qor-devsim did not become ready\n");
		return 1;
	}
	char shm[] = "/dev/shm/qor-bench.XXXXXX";
	int fd = mkstemp(shm);
	if (fd < 0) {
		perror("bench-devsim: /dev/shm");
		return 1;
	}
	close(fd);
	auto node = measure(dev.root + "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min");
	auto tmpfs = measure(shm);
	unlink(shm);
	if (node.empty() || tmpfs.empty())
		return 1;
	print("devsim pmqos cpufreq_min", node);
	print("tmpfs file (/dev/shm)", tmpfs);
	return 0;
}
