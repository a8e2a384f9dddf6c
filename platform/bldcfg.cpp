// Build configuration: a factory build is marked by the file etc/bldcfg/factory under the root.
#include "bldcfg.h"
#include "sysroot.h"

#include <unistd.h>

int bldcfg_is_factory_binary(void)
{
	char path[QOR_PATH_MAX];
	if (qor_path("/etc/bldcfg/factory", path) < 0)
		return 0;
	return access(path, F_OK) == 0 ? 1 : 0;
}
