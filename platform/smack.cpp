// SMACK socket labels through extended attributes; the kernel's result and errno pass through.
#include "smack.h"

#include <cerrno>
#include <cstring>
#include <sys/xattr.h>

int smack_fsetlabel(int fd, const char *label, int type)
{
	const char *attr;
	switch (type) {
	case SMACK_LABEL_IPIN: attr = "security.SMACK64IPIN"; break;
	case SMACK_LABEL_IPOUT: attr = "security.SMACK64IPOUT"; break;
	default: errno = EINVAL; return -1;
	}
	if (!label) {
		errno = EINVAL;
		return -1;
	}
	return fsetxattr(fd, attr, label, strlen(label), 0) == 0 ? 0 : -1;
}
