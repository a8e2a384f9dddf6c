// Thermal event client: one fresh connection per text, no terminator, nothing read back.
#include "vorn_client.h"

#include "sysroot.h"

#include <cstdio>
#include <cstring>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

int vorn_send_event(const char *text)
{
	if (!text)
		return -22;
	int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
	if (fd < 0) {
		printf("Failed to create socket\n");
		return -19;
	}
	// A thermal thread that is busy (a blocking bus call) must not stall the request threads
	// once its backlog is full: connect waits at most this long.
	timeval tv{1, 0};
	setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv);
	sockaddr_un addr{};
	addr.sun_family = AF_UNIX;
	int ret = 0;
	// A root too long for sun_path cannot be reached: that is a failed connect, not a cut path.
	if (qor_path("/dev/socket/vorn", addr.sun_path, sizeof addr.sun_path) < 0 ||
	    connect(fd, reinterpret_cast<sockaddr *>(&addr), sizeof addr) < 0) {
		printf("Failed to connect to vorn socket\n");
		ret = -5;
	} else if (send(fd, text, strlen(text), MSG_NOSIGNAL) < 0) { // a closed peer must not kill us
		printf("Failed to write data\n");
		ret = -5;
	}
	close(fd);
	return ret;
}
