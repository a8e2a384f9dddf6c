// Scenario requests through the real socket against a tmpfs root, side by side with a bare
// accept/recv/close loop doing the same two node writes per request. Prints figures only.
#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <poll.h>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

#ifndef QOR_BUILD_DIR
#error "QOR_BUILD_DIR must name the build directory"
#endif

using clk = std::chrono::steady_clock;

namespace {

std::string root;

sockaddr_un unix_addr(const std::string &path)
{
	sockaddr_un a{};
	a.sun_family = AF_UNIX;
	strncpy(a.sun_path, path.c_str(), sizeof a.sun_path - 1);
	return a;
}

int listen_at(const std::string &path)
{
	unlink(path.c_str());
	int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
	sockaddr_un a = unix_addr(path);
	if (bind(fd, reinterpret_cast<sockaddr *>(&a), sizeof a) < 0 || listen(fd, 128) < 0) {
		perror(path.c_str());
		exit(1);
	}
	return fd;
}

// One request: connect, send, then wait for the server to close the connection (it does so once
// the request has been applied), so the latency covers the whole server-side work.
bool request(const std::string &path, const char *text)
{
	int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
	sockaddr_un a = unix_addr(path);
	if (connect(fd, reinterpret_cast<sockaddr *>(&a), sizeof a) < 0) {
		close(fd);
		return false;
	}
	send(fd, text, strlen(text), MSG_NOSIGNAL);
	shutdown(fd, SHUT_WR);
	char c;
	pollfd p{fd, POLLIN, 0};
	bool ok = poll(&p, 1, 5000) == 1 && read(fd, &c, 1) == 0;
	close(fd);
	return ok;
}

struct figures {
	double rps;
	double p50_us;
	double p99_us;
};

figures run(const std::string &path, int count)
{
	const char *texts[] = {"AppLaunch[START][PID]1234", "AppLaunch[END][PID]1234"};
	std::vector<double> lat;
	lat.reserve(count);
	auto start = clk::now();
	for (int i = 0; i < count; i++) {
		auto t0 = clk::now();
		if (!request(path, texts[i & 1])) {
			fprintf(stderr, "request %d to %s failed\n", i, path.c_str());
			exit(1);
		}
		lat.push_back(std::chrono::duration<double, std::micro>(clk::now() - t0).count());
	}
	double secs = std::chrono::duration<double>(clk::now() - start).count();
	std::sort(lat.begin(), lat.end());
	return {count / secs, lat[lat.size() / 2], lat[lat.size() * 99 / 100]};
}

void write_node(const char *name, const char *text)
{
	std::string p = root + "/sys/devices/system/cpu/cpufreq/pmqos/" + name;
	int fd = open(p.c_str(), O_WRONLY | O_CLOEXEC);
	if (fd >= 0) {
		ssize_t n = write(fd, text, strlen(text));
		(void)n;
		close(fd);
	}
}

// The floor: what serving the socket and writing the two nodes costs with nothing else.
void bare_server(int listen_fd, std::atomic<bool> *stop)
{
	char buf[64];
	while (!*stop) {
		int c = accept4(listen_fd, nullptr, nullptr, SOCK_CLOEXEC);
		if (c < 0)
			continue;
		memset(buf, 0, sizeof buf);
		ssize_t n = recv(c, buf, sizeof buf - 1, 0);
		if (n > 0) {
			bool lock = strstr(buf, "[START]") != nullptr;
			write_node("cpu_online_min", lock ? "2 id2" : "-1 id2");
			write_node("cpufreq_min", lock ? "1200000 id2" : "-1 id2");
		}
		close(c);
	}
}

// Plays the thermal side: drains the events the daemon forwards.
void vorn_reader(int listen_fd, std::atomic<bool> *stop)
{
	char buf[256];
	while (!*stop) {
		pollfd p{listen_fd, POLLIN, 0};
		if (poll(&p, 1, 100) != 1)
			continue;
		int c = accept4(listen_fd, nullptr, nullptr, SOCK_CLOEXEC);
		if (c < 0)
			continue;
		while (read(c, buf, sizeof buf) > 0) {
		}
		close(c);
	}
}

} // namespace

int main(int argc, char **argv)
{
	int count = argc > 1 ? atoi(argv[1]) : 20000;
	if (count < 100)
		count = 100;
	char tmpl[] = "/dev/shm/qb.XXXXXX";
	if (!mkdtemp(tmpl)) {
		perror("mkdtemp");
		return 1;
	}
	root = tmpl;
	std::filesystem::create_directories(root + "/sys/devices/system/cpu/cpufreq/pmqos");
	std::filesystem::create_directories(root + "/sys/power");
	std::filesystem::create_directories(root + "/dev/socket");
	for (const char *n : {"cpufreq_min", "cpufreq_max", "cpu_online_min", "cpu_online_max", "bus_mif_freq_min",
			      "cpu_freq_up_threshold"})
		close(open((root + "/sys/devices/system/cpu/cpufreq/pmqos/" + n).c_str(), O_CREAT | O_WRONLY, 0644));

	std::atomic<bool> stop{false};
	int vorn_fd = listen_at(root + "/dev/socket/vorn");
	std::thread reader(vorn_reader, vorn_fd, &stop);

	std::string scenario = root + "/dev/socket/scenario_info";
	pid_t daemon = fork();
	if (daemon == 0) {
		setenv("QOR_SYSROOT", root.c_str(), 1);
		setenv("JOTLOG_FILE", (root + "/jotlog").c_str(), 1);
		setenv("ECORE_NO_SYSTEM_MODULES", "1", 1);
		setenv("DBUS_SYSTEM_BUS_ADDRESS", ("unix:path=" + root + "/no-bus").c_str(), 1);
		int null = open("/dev/null", O_WRONLY);
		dup2(null, STDOUT_FILENO);
		std::string daemon_path = std::string(QOR_BUILD_DIR) + "/qor-server";
		execlp("systemd-socket-activate", "systemd-socket-activate", "-EQOR_SYSROOT", "-EJOTLOG_FILE",
		       "-EECORE_NO_SYSTEM_MODULES", "-EDBUS_SYSTEM_BUS_ADDRESS", ("-l" + scenario).c_str(),
		       ("-l" + root + "/dev/socket/app_info").c_str(), daemon_path.c_str(), nullptr);
		_exit(127);
	}
	bool up = false;
	for (int i = 0; i < 500 && !up; i++) {
		up = request(scenario, "");
		if (!up)
			usleep(10000);
	}
	if (!up) {
		fprintf(stderr, "qor-server did not come up\n");
		kill(daemon, SIGKILL);
		return 1;
	}

	int bare_fd = listen_at(root + "/dev/socket/bare");
	std::thread bare(bare_server, bare_fd, &stop);

	// Warm both paths, then measure each in turn.
	run(scenario, 200);
	run(root + "/dev/socket/bare", 200);
	figures q = run(scenario, count);
	figures b = run(root + "/dev/socket/bare", count);

	printf("requests per path: %d (alternating start/end of AppLaunch, two node writes each)\n", count);
	printf("%-24s %12s %10s %10s\n", "path", "requests/s", "p50 us", "p99 us");
	printf("%-24s %12.0f %10.1f %10.1f\n", "qor-server", q.rps, q.p50_us, q.p99_us);
	printf("%-24s %12.0f %10.1f %10.1f\n", "bare accept/recv/close", b.rps, b.p50_us, b.p99_us);
	printf("ratio qor-server / bare: %.2f\n", q.rps / b.rps);

	stop = true;
	request(root + "/dev/socket/bare", ""); // wake the bare loop
	bare.join();
	reader.join();
	kill(daemon, SIGTERM);
	int st;
	for (int i = 0; i < 300 && waitpid(daemon, &st, WNOHANG) == 0; i++)
		usleep(10000);
	if (waitpid(daemon, &st, WNOHANG) == 0) {
		kill(daemon, SIGKILL);
		waitpid(daemon, &st, 0);
	}
	std::filesystem::remove_all(root);
	return 0;
}
