// Platform log service: one line per call, written with a single write.
#pragma once

enum { JOTLOG_MAIN = 0, JOTLOG_SYSTEM = 2 };
enum { JOTLOG_DEBUG = 3, JOTLOG_INFO = 4, JOTLOG_WARN = 5, JOTLOG_ERROR = 6 };

extern "C" int __jotlog_print(int buffer, int priority, const char *tag, const char *fmt, ...)
	__attribute__((format(printf, 4, 5)));
