// Application tracking: the application table, its lock identities and event forwarding.
#pragma once

constexpr int QOR_APP_NAME_SIZE = 256;

struct qor_app {
	char name[QOR_APP_NAME_SIZE];
	int cpufreq_min;
	int cpufreq_max;
	int pid;
};

enum qor_appinfo_type {
	QOR_APPINFO_LAUNCH = 0,
	QOR_APPINFO_TERMINATED = 1,
	QOR_APPINFO_PAUSE = 2,
	QOR_APPINFO_RESUME = 3,
	QOR_APPINFO_NONE = 4,
};

// Restores the build-time application table.
void qor_appinfo_init(void);

int QOR_appinfo_Manager(const char *text);
int QOR_get_app_count(void);
int QOR_get_appinfo_type(const char *text);
int QOR_get_pid_from_str(int *pid, const char *text);
// out holds QOR_APP_NAME_SIZE bytes.
int QOR_get_appname_from_str(char *out, const char *text);
int QOR_get_appname_from_pid(char *out, int pid);
int QOR_get_app_index(const char *name);
int QOR_store_appname_pid(const char *name, int pid);
int QOR_clear_app_pid(const char *name);
int QOR_appinfo_check_app(const char *text);
int QOR_appinfo_set_Lock(int index);
int QOR_appinfo_set_Unlock(int index);
// Copy of a row; -1 for an index out of range.
int qor_app_get(int index, qor_app *out);
