// Thermal event client: one fresh connection per text, no terminator, nothing read back.
#include "vorn_client.h"

#include "sysroot.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <sys/socket.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

namespace {

// A thermal thread that is busy (a blocking bus call) must not stall the request threads once its
// backlog is full: connecting is retried for at most this long, then the event is given up.
constexpr int VORN_CONNECT_TRIES = 100;
constexpr long VORN_CONNECT_PAUSE_NS = 10 * 1000 * 1000;

int connect_bounded(int fd, const sockaddr_un &addr)
{
	for (int i = 0;; i++) {
		if (connect(fd, reinterpret_cast<const sockaddr *>(&addr), sizeof addr) == 0)
			return 0;
		if (errno != EAGAIN || i + 1 >= VORN_CONNECT_TRIES)
			return -1;
		timespec pause{0, VORN_CONNECT_PAUSE_NS};
		nanosleep(&pause, nullptr);
	}
}

} // namespace

int vorn_send_event(const char *text)
{
	if (!text)
		return -22;
	// Non-blocking: a full backlog answers EAGAIN at once instead of parking the caller.
	int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
	if (fd < 0) {
		printf("Failed to create socket\n");
		return -19;
	}
	sockaddr_un addr{};
	addr.sun_family = AF_UNIX;
	int ret = 0;
	// A root too long for sun_path cannot be reached: that is a failed connect, not a cut path.
	if (qor_path("/dev/socket/vorn", addr.sun_path, sizeof addr.sun_path) < 0 || connect_bounded(fd, addr) < 0) {
		printf("Failed to connect to vorn socket\n");
		ret = -5;
	} else if (send(fd, text, strlen(text), MSG_NOSIGNAL) < 0) { // a closed peer must not kill us
		printf("Failed to write data\n");
		ret = -5;
	}
	close(fd);
	return ret;
}
