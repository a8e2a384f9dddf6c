// Mode look-ups of the device layer: by mode name through the mode-name map, by application id
// through the modes' application hashes.
#include "vorn_device.h"

#include "qor_log.h"

#include <Eina.h>
#include <cstring>

uint32_t vorn_app_hash(const char *app_id)
{
	return static_cast<uint32_t>(eina_hash_superfast(app_id, static_cast<int>(strlen(app_id)) + 1));
}

int vorn_get_mode_by_name(Eina_Hash *map, const char *name)
{
	if (!map || !name) {
		VORN_LOGE("Invalid args");
		return -22;
	}
	// The map's values point at the mode records' ids, so "default" (id 0) is held too.
	const int *id = static_cast<const int *>(eina_hash_find(map, name));
	if (id && *id != 0)
		return *id;
	if (strncmp(name, "default", 7) == 0)
		return 0;
	return -1;
}

int vorn_get_mode_by_app_name(vorn_info_t *info, const char *app_id)
{
	if (!info || !app_id) {
		VORN_LOGE("Invalid args");
		return -22;
	}
	if (!info->modes)
		return -1;
	uint32_t hash = vorn_app_hash(app_id);
	for (int m = 0; m < info->mode_count; m++) {
		const vorn_mode &mode = info->modes[m];
		int count = mode.app_count < VORN_APP_HASH_MAX ? mode.app_count : VORN_APP_HASH_MAX;
		for (int i = 0; i < count; i++)
			if (mode.app_hash[i] == hash)
				return mode.id;
	}
	return -1;
}
