// Sysfs access primitives. Paths are device paths; each is resolved under the root on access.
#include "device_info.h"

#include "qor_log.h"
#include "qor_text.h"
#include "sysroot.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <unistd.h>

namespace {

int open_device(const char *path, int flags, const char *func)
{
	char real[QOR_PATH_MAX];
	if (qor_path(path, real) < 0) {
		errno = ENAMETOOLONG;
	} else {
		int fd = open(real, flags | O_CLOEXEC);
		if (fd >= 0)
			return fd;
	}
	int err = errno;
	char errtext[128];
	QOR_LOG("%s: file:%s, %s.", func, real, strerror_r(err, errtext, sizeof errtext));
	return -1;
}

} // namespace

int sys_write_buf(const char *path, const char *text)
{
	if (!text)
		return -1;
	int fd = open_device(path, O_WRONLY, "sys_write_buf");
	if (fd < 0)
		return -1;
	ssize_t n = write(fd, text, strlen(text));
	close(fd);
	return n < 0 ? -1 : 0;
}

int sys_read_buf(const char *path, char *buf)
{
	int fd = open_device(path, O_RDONLY, "sys_read_buf");
	if (fd < 0)
		return -2;
	ssize_t n = read(fd, buf, SYS_BUF_SIZE);
	close(fd);
	if (n < 0 || n >= SYS_BUF_SIZE)
		return -5;
	buf[n] = '\0';
	return 0;
}

int sys_set_int(const char *path, int value)
{
	char text[SYS_BUF_SIZE];
	QOR_FORMAT(text, "%d", value);
	char real[QOR_PATH_MAX];
	qor_path(path, real);
	QOR_LOG("%s %d", real, value);
	return sys_write_buf(path, text) == 0 ? 0 : -1;
}

int sys_set_str(const char *path, const char *text)
{
	if (!text)
		return -1;
	return sys_write_buf(path, text) == 0 ? 0 : -1;
}

int sys_get_int(const char *path, int *value)
{
	char buf[SYS_BUF_SIZE];
	if (sys_read_buf(path, buf) != 0) {
		*value = -1;
		return -1;
	}
	*value = qor_leading_int(buf);
	return 0;
}

int sys_get_str(const char *path, char *buf)
{
	char tmp[SYS_BUF_SIZE] = {};
	if (sys_read_buf(path, tmp) != 0)
		return -1;
	qor_copy(buf, SYS_BUF_SIZE, tmp);
	return 0;
}
