// Platform settings store: integer and boolean keys with change notification.
#pragma once

typedef struct setstore_keynode setstore_keynode_t;
typedef void (*setstore_changed_cb)(setstore_keynode_t *node, void *user_data);

// 0 and the value on success, negative when the key is missing or unparsable.
int setstore_get_int(const char *key, int *value);
int setstore_get_bool(const char *key, bool *value);
int setstore_set_int(const char *key, int value);
// The callback runs on the registering thread's Ecore loop after every completed change of key.
int setstore_notify_key_changed(const char *key, setstore_changed_cb cb, void *user_data);
const char *setstore_keynode_get_name(const setstore_keynode_t *node);
