// qor-send: writes one message on one connection to a Unix stream socket, as the platform's
// clients do. The socket is a device path, resolved under QOR_SYSROOT.
#include "sysroot.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

int main(int argc, char **argv)
{
	if (argc == 2 && (strcmp(argv[1], "--help") == 0 || strcmp(argv[1], "-h") == 0)) {
		puts("usage: qor-send SOCKET [TEXT]\n"
		     "Connects to SOCKET (e.g. /dev/socket/scenario_info, under $QOR_SYSROOT), writes TEXT\n"
		     "without terminator (nothing when TEXT is left out) and closes.");
		return 0;
	}
	if (argc != 2 && argc != 3) {
		fputs("usage: qor-send SOCKET [TEXT]\n", stderr);
		return 2;
	}
	sockaddr_un addr{};
	addr.sun_family = AF_UNIX;
	if (qor_path(argv[1], addr.sun_path) < 0) {
		fprintf(stderr, "qor-send: socket path too long: %s\n", argv[1]);
		return 2;
	}
	int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
	if (fd < 0 || connect(fd, reinterpret_cast<sockaddr *>(&addr), sizeof addr) < 0) {
		fprintf(stderr, "qor-send: cannot connect to %s: %s\n", addr.sun_path, strerror(errno));
		return 1;
	}
	const char *text = argc == 3 ? argv[2] : "";
	size_t len = strlen(text);
	while (len > 0) {
		ssize_t n = send(fd, text, len, MSG_NOSIGNAL);
		if (n < 0 && errno == EINTR)
			continue;
		if (n < 0) {
			fprintf(stderr, "qor-send: cannot write to %s: %s\n", addr.sun_path, strerror(errno));
			close(fd);
			return 1;
		}
		text += n;
		len -= static_cast<size_t>(n);
	}
	close(fd);
	return 0;
}
