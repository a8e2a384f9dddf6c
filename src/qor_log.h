// Log helpers: every line starts "<file>: <function>(<line>) > " with the source file's own name.
#pragma once
#include "jotlog.h"

#define QOR_LOG_PREFIX "%s: %s(%d) > "

// Request server, resource control, application tracking, sysfs access: information priority.
#define QOR_LOG(fmt, ...)                                                                          \
	__jotlog_print(JOTLOG_SYSTEM, JOTLOG_INFO, "QOR_SERVER", QOR_LOG_PREFIX fmt, __FILE_NAME__, \
		       __func__, __LINE__ __VA_OPT__(, ) __VA_ARGS__)

// Thermal side.
#define VORN_LOGI(fmt, ...)                                                                   \
	__jotlog_print(JOTLOG_SYSTEM, JOTLOG_INFO, "VORN", QOR_LOG_PREFIX fmt, __FILE_NAME__, \
		       __func__, __LINE__ __VA_OPT__(, ) __VA_ARGS__)
#define VORN_LOGE(fmt, ...)                                                                    \
	__jotlog_print(JOTLOG_SYSTEM, JOTLOG_ERROR, "VORN", QOR_LOG_PREFIX fmt, __FILE_NAME__, \
		       __func__, __LINE__ __VA_OPT__(, ) __VA_ARGS__)
