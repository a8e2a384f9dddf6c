// Diagnostics writers: kernel log, gate lines, wakeup sources, shell commands and file helpers.
#include "vorn_util.h"

#include "device_info.h"
#include "qor_log.h"
#include "qor_text.h"
#include "sysroot.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr char KMSG_PATH[] = "/dev/kmsg";
constexpr char WAKEUP_SOURCES_ACTIVE[] = "/sys/kernel/debug/wakeup_sources_active";
constexpr size_t PREFIX_LEN = sizeof VORN_KMSG_PREFIX - 1;

// Writes all of text, retrying short writes; false on an error.
bool write_all(int fd, const char *text, size_t len, ssize_t *last)
{
	while (len > 0) {
		ssize_t n = write(fd, text, len);
		*last = n;
		if (n < 0) {
			if (errno == EINTR)
				continue;
			return false;
		}
		text += n;
		len -= static_cast<size_t>(n);
	}
	return true;
}

} // namespace

void vorn_debug_trace(const char *, ...)
{
}

void vorn_kmsg_log(int priority, const char *file, const char *func, int line, const char *fmt, ...)
{
	char buf[VORN_KMSG_BUF_SIZE] = {};
	memcpy(buf, VORN_KMSG_PREFIX, PREFIX_LEN);
	// The message gets the rest of a 254-character line: 245 bytes with the terminator.
	va_list ap;
	va_start(ap, fmt);
	int n = vsnprintf(buf + PREFIX_LEN, VORN_KMSG_MAX + 1 - PREFIX_LEN, fmt, ap);
	va_end(ap);
	if (n < 0)
		buf[PREFIX_LEN] = '\0';
	sys_set_str(KMSG_PATH, buf);
	if (priority == JOTLOG_DEBUG)
		vorn_debug_trace(QOR_LOG_PREFIX "%s", file, func, line, buf);
	else
		__jotlog_print(JOTLOG_SYSTEM, priority, "VORN", QOR_LOG_PREFIX "%s", file, func, line, buf);
}

void vorn_gate_log(const char *fmt, ...)
{
	char buf[VORN_GATE_MAX + 1] = {};
	va_list ap;
	va_start(ap, fmt);
	int n = vsnprintf(buf, sizeof buf, fmt, ap);
	va_end(ap);
	if (n < 0)
		buf[0] = '\0';
	__jotlog_print(JOTLOG_MAIN, JOTLOG_INFO, "GATE", "<GATE-M>%s</GATE-M>\n", buf);
}

void vorn_log_wakeup_sources(void)
{
	char real[QOR_PATH_MAX];
	if (qor_path(WAKEUP_SOURCES_ACTIVE, real) < 0)
		return;
	FILE *f = fopen(real, "re");
	if (!f)
		return;
	char name[VORN_WS_NAME_MAX + 1] = {};
	int active = 0, total = 0;
	for (int seq = 0; fscanf(f, "%255s", name) == 1; seq++) {
		// A name longer than the buffer is cut; the rest of it is not taken for a new record.
		int rest = fscanf(f, "%*[^ \t\n\v\f\r]");
		// A partial record keeps the integers of the record before.
		if (rest != EOF && fscanf(f, "%d", &active) == 1)
			(void)!fscanf(f, "%d", &total);
		VORN_LOGI("[WS:%d] %s: %.2lf (%.2lf)", seq, name, active / 1000.0, total / 1000.0);
		memset(name, 0, sizeof name);
	}
	fclose(f);
}

void vorn_run_system_cmd(const char *fmt, ...)
{
	char cmd[VORN_CMD_SIZE] = {};
	va_list ap;
	va_start(ap, fmt);
	int n = vsnprintf(cmd, sizeof cmd, fmt, ap);
	va_end(ap);
	// A cut command would act on the wrong names: refuse it.
	if (n < 0 || n >= VORN_CMD_SIZE) {
		VORN_LOGE("Command too long (%d)", n);
		return;
	}
	if (system(cmd) == -1)
		VORN_LOGE("Failed to run system cmd");
}

int vorn_save_to_file(const char *src, const char *dst)
{
	if (!src || !dst) {
		VORN_LOGE("Invalid argument");
		return -22;
	}
	char src_real[QOR_PATH_MAX], dst_real[QOR_PATH_MAX];
	if (qor_path(src, src_real) < 0) {
		VORN_LOGE("Failed to open: %s", src_real);
		return -22;
	}
	int in = open(src_real, O_RDONLY | O_CLOEXEC);
	if (in < 0) {
		VORN_LOGE("Failed to open: %s", src_real);
		return -22;
	}
	int out = qor_path(dst, dst_real) < 0 ? -1 : open(dst_real, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
	if (out < 0) {
		VORN_LOGE("Failed to open: %s", dst_real);
		close(in);
		return -22;
	}
	static_assert(VORN_COPY_CHUNK > 1);
	char buf[VORN_COPY_CHUNK];
	ssize_t rd;
	for (;;) {
		memset(buf, 0, sizeof buf);
		rd = read(in, buf, sizeof buf - 1);
		if (rd <= 0)
			break;
		ssize_t wr = 0;
		if (!write_all(out, buf, strlen(buf), &wr)) {
			VORN_LOGE("Failed to write to %s, rd:%d/wr:%d", dst_real, static_cast<int>(rd), static_cast<int>(wr));
			close(out);
			close(in);
			return -5;
		}
	}
	ssize_t wr = 0;
	write_all(out, "\n\n", 2, &wr);
	close(out);
	close(in);
	return rd < 0 ? -1 : 0;
}

void vorn_rotate_file(const char *path, long limit, int count)
{
	if (!path)
		return;
	char real[QOR_PATH_MAX];
	struct stat st;
	if (qor_path(path, real) < 0 || stat(real, &st) < 0 || static_cast<long>(st.st_size) < limit)
		return;
	// A numbered name that does not fit is refused rather than cut into another file's name.
	int longest = snprintf(nullptr, 0, "%s.%d", path, count);
	if (count < 0 || longest < 0 || longest >= VORN_ROTATE_NAME_SIZE) {
		VORN_LOGE("Invalid rotation of %s (%d)", path, count);
		return;
	}
	char name[VORN_ROTATE_NAME_SIZE];
	for (int i = count - 1; i >= 0; i--) {
		QOR_FORMAT(name, "%s.%d", path, i);
		char old_real[QOR_PATH_MAX];
		if (qor_path(name, old_real) < 0 || access(old_real, F_OK) != 0)
			continue;
		vorn_run_system_cmd("mv %s %s.%d", old_real, real, i + 1);
	}
	vorn_run_system_cmd("mv %s %s.0", real, real);
}

void vorn_save_log(const char *, const char *)
{
}

void vorn_cooldown_action(const char *, int)
{
}

long vorn_read_device_file(const char *path, char *buf, int size)
{
	char real[QOR_PATH_MAX];
	int fd = qor_path(path, real) < 0 ? -1 : open(real, O_RDONLY | O_CLOEXEC);
	if (fd < 0)
		return -1;
	memset(buf, 0, static_cast<size_t>(size));
	ssize_t n = read(fd, buf, static_cast<size_t>(size - 1));
	close(fd);
	return n < 0 ? -2 : n;
}
