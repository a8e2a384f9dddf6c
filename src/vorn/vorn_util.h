// Diagnostics writers of the thermal side: kernel-log and gate lines, the wakeup-source dump,
// a shell-command runner and the file append and rotation helpers.
#pragma once
#include "jotlog.h"

constexpr int VORN_KMSG_BUF_SIZE = 256;
constexpr int VORN_KMSG_MAX = 254; // characters of a kernel-log line, prefix included
constexpr char VORN_KMSG_PREFIX[] = "[thermal] ";
constexpr int VORN_GATE_MAX = 254;
constexpr int VORN_CMD_SIZE = 512;
constexpr int VORN_WS_NAME_MAX = 255;
constexpr int VORN_ROTATE_NAME_SIZE = 128;
constexpr int VORN_COPY_CHUNK = 8096;

// Writes "[thermal] " + message to "/dev/kmsg" and copies the line to jotlog with the given
// priority; JOTLOG_DEBUG sends the copy to the debug trace instead.
void vorn_kmsg_log(int priority, const char *file, const char *func, int line, const char *fmt, ...)
	__attribute__((format(printf, 5, 6)));
// One "<GATE-M>...</GATE-M>" line in the main log buffer, tag "GATE".
void vorn_gate_log(const char *fmt, ...) __attribute__((format(printf, 1, 2)));
// Sink of debug traces: emits nothing.
void vorn_debug_trace(const char *fmt, ...) __attribute__((format(printf, 1, 2)));

#define VORN_KMSG_LOG(fmt, ...) \
	vorn_kmsg_log(JOTLOG_INFO, __FILE_NAME__, __func__, __LINE__, fmt __VA_OPT__(, ) __VA_ARGS__)
#define VORN_KMSG_LOG_WARN(fmt, ...) \
	vorn_kmsg_log(JOTLOG_WARN, __FILE_NAME__, __func__, __LINE__, fmt __VA_OPT__(, ) __VA_ARGS__)
#define VORN_KMSG_LOG_DEBUG(fmt, ...) \
	vorn_kmsg_log(JOTLOG_DEBUG, __FILE_NAME__, __func__, __LINE__, fmt __VA_OPT__(, ) __VA_ARGS__)
#define VORN_GATE_LOG(fmt, ...) vorn_gate_log(fmt __VA_OPT__(, ) __VA_ARGS__)

// One jotlog line per record of "/sys/kernel/debug/wakeup_sources_active".
void vorn_log_wakeup_sources(void);
// Runs the formatted command (at most 511 characters; a longer one is refused) through system().
// One read of at most size-1 bytes of a device file into a zeroed, terminated buffer.
// Returns the count, -1 when the file cannot be opened, -2 when the read fails.
long vorn_read_device_file(const char *path, char *buf, int size);

void vorn_run_system_cmd(const char *fmt, ...) __attribute__((format(printf, 1, 2)));
// Appends the source file and "\n\n" to the target (device paths). 0, -1 read error,
// -5 write error, -22 bad argument or a file that cannot be opened.
int vorn_save_to_file(const char *src, const char *dst);
// When the file has reached limit bytes: path.(i) -> path.(i+1) for i = count-1..0, path -> path.0.
void vorn_rotate_file(const char *path, long limit, int count);
// Hooks called by the core; this device does nothing in them.
void vorn_save_log(const char *src, const char *dst);
void vorn_cooldown_action(const char *action, int seq);
