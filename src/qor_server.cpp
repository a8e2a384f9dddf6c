// Request server: identifies the activated sockets and serves the scenario and application sockets,
// one connection and one message at a time.
#include "qor_server.h"

#include "qor_appinfo.h"
#include "qor_log.h"
#include "qor_main.h"
#include "qor_text.h"
#include "sysroot.h"

#include <cerrno>
#include <cstring>
#include <poll.h>
#include <string_view>
#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>
#include <time.h>
#include <unistd.h>

int scenario_info_fd = -1;
int app_info_fd = -1;

namespace {

constexpr int QOR_RECV_TIMEOUT_MS = 1000;
// Once another client is waiting to be accepted, a silent one gets only this long in all, so a
// burst of silent clients costs the client behind them a fraction of a second each.
constexpr int QOR_RECV_BUSY_TIMEOUT_MS = 100;

bool is_socket_at(int fd, const char *dev_path)
{
	char path[sizeof(sockaddr_un::sun_path)];
	if (qor_path(dev_path, path) < 0)
		return false;
	return sd_is_socket_unix(fd, SOCK_STREAM, 1, path, 0) > 0;
}

void sleep_ms(long ms)
{
	timespec ts{ms / 1000, (ms % 1000) * 1000000L};
	while (nanosleep(&ts, &ts) < 0 && errno == EINTR) {
	}
}

// accept that never spins: a socket that was not passed parks the thread for good, and any
// other persistent failure is retried with a growing pause, logged once per run of failures.
int qor_accept(int listen_fd, sockaddr_un *peer, const char *func)
{
	long backoff_ms = 10;
	bool logged = false;
	for (;;) {
		socklen_t len = sizeof *peer;
		int fd = accept4(listen_fd, reinterpret_cast<sockaddr *>(peer), &len, SOCK_CLOEXEC);
		if (fd >= 0)
			return fd;
		int err = errno;
		if (err == EINTR || err == ECONNABORTED)
			continue;
		if (!logged) {
			__jotlog_print(JOTLOG_SYSTEM, JOTLOG_INFO, "QOR_SERVER", QOR_LOG_PREFIX "accept failed",
				       __FILE_NAME__, func, __LINE__);
			logged = true;
		}
		if (err == EBADF || err == ENOTSOCK || err == EINVAL) {
			for (;;)
				pause();
		}
		sleep_ms(backoff_ms);
		if (backoff_ms < 1000)
			backoff_ms *= 2;
	}
}

long elapsed_ms(const timespec &since)
{
	timespec now;
	clock_gettime(CLOCK_MONOTONIC, &now);
	return (now.tv_sec - since.tv_sec) * 1000L + (now.tv_nsec - since.tv_nsec) / 1000000L;
}

// Receives one message of at most size-1 bytes into a zeroed buffer; a client that stays silent
// past the time-out counts as a failed receive so it cannot hold up the clients behind it (the
// time-out shrinks while one is queued on listen_fd). Clients write right after connecting, so
// the data is usually there already.
ssize_t qor_recv_message(int fd, int listen_fd, char *buf, size_t size)
{
	memset(buf, 0, size);
	ssize_t n;
	do {
		n = recv(fd, buf, size - 1, MSG_DONTWAIT);
	} while (n < 0 && errno == EINTR);
	if (n >= 0 || errno != EAGAIN)
		return n;
	timespec start;
	clock_gettime(CLOCK_MONOTONIC, &start);
	int limit_ms = QOR_RECV_TIMEOUT_MS;
	for (;;) {
		pollfd p[2] = {{fd, POLLIN, 0}, {listen_fd, POLLIN, 0}};
		long left = limit_ms - elapsed_ms(start);
		if (left <= 0)
			return -1;
		int ready = poll(p, limit_ms == QOR_RECV_TIMEOUT_MS ? 2 : 1, static_cast<int>(left));
		if (ready < 0 && errno == EINTR)
			continue;
		if (ready <= 0)
			return -1;
		if (p[0].revents)
			return recv(fd, buf, size - 1, MSG_DONTWAIT);
		limit_ms = QOR_RECV_BUSY_TIMEOUT_MS; // only the listening socket is ready
	}
}

} // namespace

int QOR_socket_init(void)
{
	int n = sd_listen_fds(1);
	if (n < 0) {
		char errtext[128];
		__jotlog_print(JOTLOG_SYSTEM, JOTLOG_INFO, "QOR_SERVER", "%s: %s(%d) > %s: %s", __FILE_NAME__,
			       __func__, __LINE__, "Failed to read listening file descriptors from environment",
			       strerror_r(-n, errtext, sizeof errtext));
		return n;
	}
	for (int fd = SD_LISTEN_FDS_START; fd < SD_LISTEN_FDS_START + n; fd++) {
		if (is_socket_at(fd, "/dev/socket/scenario_info")) {
			if (scenario_info_fd >= 0) {
				QOR_LOG("Too many scenario info sockets passed.");
				return -22;
			}
			scenario_info_fd = fd;
		} else if (!is_socket_at(fd, "/dev/socket/app_info")) {
			QOR_LOG("Unknown socket passed.");
			return -22;
		} else {
			if (app_info_fd >= 0) {
				QOR_LOG("Too many app info sockets passed.");
				return -22;
			}
			app_info_fd = fd;
		}
	}
	return 0;
}

int QOR_cut_token(char *dst, const char *src, const char *token, int *number)
{
	if (!token || !*token)
		return -2;
	const char *at = strstr(src, token);
	if (!at)
		return -1;
	size_t token_len = strlen(token);
	if (number)
		*number = at[token_len] ? qor_leading_int(at + token_len) : -1;
	// The token's own opening bracket does not count as the start of the rest.
	const char *rest = strchr(at + 1, '[');
	std::string_view before(src, static_cast<size_t>(at - src));
	size_t n = qor_copy(dst, QOR_NAME_SIZE, before);
	if (rest)
		qor_copy(dst + n, QOR_NAME_SIZE - n, rest);
	return 0;
}

int qor_build_request(const char *received, char *cut1, char *cut2, char *request)
{
	int pid = 0;
	if (strstr(received, "[START]")) {
		if (QOR_cut_token(cut1, received, "[START]", nullptr) != 0 ||
		    QOR_cut_token(cut2, cut1, "[PID]", &pid) != 0)
			return -1;
		qor_format(request, QOR_NAME_SIZE, "%sLock[PID]%d", cut2, pid);
	} else if (strstr(received, "[END]")) {
		if (QOR_cut_token(cut1, received, "[END]", nullptr) != 0 ||
		    QOR_cut_token(cut2, cut1, "[PID]", nullptr) != 0)
			return -1;
		qor_format(request, QOR_NAME_SIZE, "%sUnlock", cut2);
	} else {
		qor_copy(request, QOR_NAME_SIZE, received);
	}
	return 0;
}

void *QOR_scenario_thread(void *)
{
	sockaddr_un peer{};
	char received[QOR_NAME_SIZE] = {};
	char cut1[QOR_NAME_SIZE] = {};
	char cut2[QOR_NAME_SIZE] = {};
	char request[QOR_NAME_SIZE] = {};

	for (;;) {
		int fd = qor_accept(scenario_info_fd, &peer, __func__);
		if (qor_recv_message(fd, scenario_info_fd, received, sizeof received) < 1) {
			QOR_LOG("recv failed");
		} else {
			if (!strstr(received, "GpuWakeup"))
				QOR_LOG("[RECEIVE]%s", received);
			if (qor_build_request(received, cut1, cut2, request) == 0)
				Vexel_Resource_Manager(request);
		}
		close(fd);
	}
	return nullptr;
}

void *QOR_app_info_thread(void *)
{
	sockaddr_un peer{};
	char received[QOR_NAME_SIZE] = {};

	for (;;) {
		int fd = qor_accept(app_info_fd, &peer, __func__);
		if (qor_recv_message(fd, app_info_fd, received, sizeof received) < 1)
			QOR_LOG("recv failed");
		else
			QOR_appinfo_Manager(received);
		close(fd);
	}
	return nullptr;
}
