// Settings keys of the thermal side: thin wrappers over setstore and the watched keys' start-up.
#include "vorn_setstore.h"

#include "qor_log.h"
#include "setstore.h"

int vorn_setstore_get_int(const char *key, int *value)
{
	if (!value) {
		VORN_LOGE("Invalid args");
		return -1;
	}
	return setstore_get_int(key, value);
}

int vorn_setstore_set_int(const char *key, int value)
{
	return setstore_set_int(key, value);
}

void vorn_setstore_init(vorn_info_t *)
{
	// Empty for now: the initial platform states and the nine key callbacks come with the
	// platform state events they raise.
}
