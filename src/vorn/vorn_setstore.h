// Settings keys of the thermal side: read and write wrappers over setstore and the start-up of
// the watched keys.
#pragma once
#include "vorn_info.h"

// 0 and the value, or the store's negative result; -1 for a null result pointer.
int vorn_setstore_get_int(const char *key, int *value);
int vorn_setstore_set_int(const char *key, int value);
// Reads the initial platform states and registers the key callbacks.
void vorn_setstore_init(vorn_info_t *info);
