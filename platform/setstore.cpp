// Settings store (being written).
#include "setstore.h"

int setstore_get_int(const char *, int *) { return -1; }
int setstore_get_bool(const char *, bool *) { return -1; }
int setstore_set_int(const char *, int) { return -1; }
int setstore_notify_key_changed(const char *, setstore_changed_cb, void *) { return -1; }
const char *setstore_keynode_get_name(const setstore_keynode_t *) { return nullptr; }
