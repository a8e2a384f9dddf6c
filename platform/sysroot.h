// Root mapping of device paths: every absolute device path is resolved under QOR_SYSROOT.
#pragma once
#include <cstddef>

// Writes QOR_SYSROOT + dev_path into out (size bytes, always terminated).
// Returns 0, or -36 (ENAMETOOLONG) when the result would not fit; out then holds the cut text.
int qor_path(const char *dev_path, char *out, size_t size);

template <size_t N> inline int qor_path(const char *dev_path, char (&out)[N])
{
	return qor_path(dev_path, out, N);
}

// Maximum length of a resolved path, terminator included.
constexpr size_t QOR_PATH_MAX = 4096;
