// Recording log service: same call as the platform's, lines kept in memory.
#include "fake_jotlog.h"
#include "jotlog.h"

#include <cstdarg>
#include <cstdio>
#include <mutex>

namespace {
std::mutex lines_lock;
std::vector<fake_jotlog_line> lines;
} // namespace

extern "C" int __jotlog_print(int buffer, int priority, const char *tag, const char *fmt, ...)
{
	char text[4096];
	va_list ap;
	va_start(ap, fmt);
	vsnprintf(text, sizeof text, fmt, ap);
	va_end(ap);
	std::lock_guard<std::mutex> g(lines_lock);
	lines.push_back({buffer, priority, tag ? tag : "", text});
	return 0;
}

std::vector<fake_jotlog_line> fake_jotlog_lines(void)
{
	std::lock_guard<std::mutex> g(lines_lock);
	return lines;
}

void fake_jotlog_clear(void)
{
	std::lock_guard<std::mutex> g(lines_lock);
	lines.clear();
}

int fake_jotlog_count(const std::string &needle)
{
	std::lock_guard<std::mutex> g(lines_lock);
	int n = 0;
	for (const auto &l : lines)
		if (l.text.find(needle) != std::string::npos)
			n++;
	return n;
}
