// SMACK socket labels.
#pragma once

enum smack_label_type { SMACK_LABEL_IPIN = 4, SMACK_LABEL_IPOUT = 5 };

// 0 on success; -1 with errno set by the kernel (EOPNOTSUPP where SMACK is absent).
int smack_fsetlabel(int fd, const char *label, int type);
