// Sysfs access primitives: each call opens, does one read or write, and closes.
#pragma once

// Reads fill a buffer of this size; content is usable only when shorter.
constexpr int SYS_BUF_SIZE = 255;

int sys_write_buf(const char *path, const char *text);
int sys_read_buf(const char *path, char *buf);
int sys_set_int(const char *path, int value);
int sys_set_str(const char *path, const char *text);
int sys_get_int(const char *path, int *value);
// buf must hold at least SYS_BUF_SIZE bytes.
int sys_get_str(const char *path, char *buf);
