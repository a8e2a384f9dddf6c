// Resolves device paths under QOR_SYSROOT so the daemon runs unchanged off the phone.
#include "sysroot.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>

int qor_path(const char *dev_path, char *out, size_t size)
{
	if (!out || size == 0)
		return -EINVAL;
	const char *root = getenv("QOR_SYSROOT");
	if (!root)
		root = "";
	int n = snprintf(out, size, "%s%s", root, dev_path ? dev_path : "");
	if (n < 0 || static_cast<size_t>(n) >= size)
		return -ENAMETOOLONG;
	return 0;
}
