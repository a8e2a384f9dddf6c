// Log service: "<sec>.<usec> <P>/<TAG> <buffer>: <message>", one write per line.
#include "jotlog.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <sys/time.h>
#include <unistd.h>

namespace {

// Opened once; O_APPEND makes each single write land whole at the end of the file.
int jotlog_fd()
{
	static const int fd = [] {
		const char *file = getenv("JOTLOG_FILE");
		if (!file || !*file)
			return STDERR_FILENO;
		int f = open(file, O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
		return f >= 0 ? f : STDERR_FILENO;
	}();
	return fd;
}

char priority_letter(int priority)
{
	switch (priority) {
	case JOTLOG_DEBUG: return 'D';
	case JOTLOG_INFO: return 'I';
	case JOTLOG_WARN: return 'W';
	case JOTLOG_ERROR: return 'E';
	default: return '?';
	}
}

} // namespace

extern "C" int __jotlog_print(int buffer, int priority, const char *tag, const char *fmt, ...)
{
	char msg[2048];
	va_list ap;
	va_start(ap, fmt);
	int n = vsnprintf(msg, sizeof msg, fmt ? fmt : "", ap);
	va_end(ap);
	if (n < 0)
		return -1;
	size_t len = strnlen(msg, sizeof msg);
	if (len > 0 && msg[len - 1] == '\n')
		msg[--len] = '\0';

	// Escaped newlines can double the message; the line is cut, never overrun.
	char line[4608];
	struct timeval tv;
	gettimeofday(&tv, nullptr);
	int head = snprintf(line, sizeof line, "%lld.%06ld %c/%s %s: ", static_cast<long long>(tv.tv_sec),
			    static_cast<long>(tv.tv_usec), priority_letter(priority), tag ? tag : "",
			    buffer == JOTLOG_MAIN ? "main" : "system");
	size_t pos = head > 0 ? static_cast<size_t>(head) : 0;
	if (pos >= sizeof line)
		pos = sizeof line - 1;
	for (size_t i = 0; i < len && pos + 2 < sizeof line; i++) {
		if (msg[i] == '\n') {
			line[pos++] = '\\';
			line[pos++] = 'n';
		} else {
			line[pos++] = msg[i];
		}
	}
	line[pos++] = '\n';
	ssize_t w = write(jotlog_fd(), line, pos);
	return w < 0 ? -1 : 0;
}
