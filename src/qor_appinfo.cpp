// Application tracking: records each listed application's pid, applies its CPU limits, releases
// scenario locks left by terminated processes and forwards events to the thermal side.
#include "qor_appinfo.h"

#include "qor_log.h"
#include "qor_main.h"
#include "qor_text.h"
#include "vorn/vorn_client.h"

#include <cstring>
#include <string_view>

namespace {

constexpr int QOR_APP_COUNT = 1;

constexpr qor_app app_row(const char *name, int cpufreq_min, int cpufreq_max)
{
	qor_app a{};
	for (int i = 0; name[i] && i < QOR_APP_NAME_SIZE - 1; i++)
		a.name[i] = name[i];
	a.cpufreq_min = cpufreq_min;
	a.cpufreq_max = cpufreq_max;
	a.pid = 0;
	return a;
}

constexpr qor_app app_defaults[QOR_APP_COUNT] = {
	app_row("com.vandrel.browser", -2, -2),
};

// Touched only by the application info thread.
qor_app app_list_table[QOR_APP_COUNT];

// Event prefixes, in the order they are tested; the index is the event type.
constexpr const char *appinfo_prefixes[] = {
	"appinfo_launch:",
	"appinfo_terminated:",
	"appinfo_pause:",
	"appinfo_resume:",
};

int app_lock_id(int index)
{
	return QOR_get_scenario_count() + index;
}

bool valid_app(int index)
{
	return index >= 0 && index < QOR_APP_COUNT;
}

} // namespace

void qor_appinfo_init(void)
{
	memcpy(app_list_table, app_defaults, sizeof app_list_table);
}

static const bool app_table_ready = (qor_appinfo_init(), true);

int QOR_get_app_count(void)
{
	return QOR_APP_COUNT;
}

int qor_app_get(int index, qor_app *out)
{
	if (!valid_app(index) || !out)
		return -1;
	*out = app_list_table[index];
	return 0;
}

int QOR_get_appinfo_type(const char *text)
{
	for (int i = 0; i < QOR_APPINFO_NONE; i++)
		if (strstr(text, appinfo_prefixes[i]))
			return i;
	return QOR_APPINFO_NONE;
}

int QOR_get_pid_from_str(int *pid, const char *text)
{
	const char *tag = strstr(text, "[PID]");
	int value = tag ? qor_leading_int(tag + 5) : 0;
	// A pid of -1 would match every row that has no holder: only real pids count.
	if (value <= 0) {
		QOR_LOG("[FAIL]");
		return -1;
	}
	*pid = value;
	return 0;
}

int QOR_get_appname_from_str(char *out, const char *text)
{
	const char *colon = strchr(text, ':');
	if (!colon)
		return -1;
	const char *name = colon + 1;
	if (*name == '[') {
		out[0] = '\0';
		return -1;
	}
	const char *end = strstr(name, "[PID]");
	size_t len = end ? static_cast<size_t>(end - name) : strlen(name);
	qor_copy(out, QOR_APP_NAME_SIZE, std::string_view(name, len));
	return 0;
}

int QOR_get_appname_from_pid(char *out, int pid)
{
	for (const auto &a : app_list_table) {
		if (a.pid == pid) {
			qor_copy(out, QOR_APP_NAME_SIZE, a.name);
			return 0;
		}
	}
	return -1;
}

int QOR_get_app_index(const char *name)
{
	for (int i = 0; i < QOR_APP_COUNT; i++)
		if (strcmp(app_list_table[i].name, name) == 0)
			return i;
	return -1;
}

int QOR_store_appname_pid(const char *name, int pid)
{
	int index = QOR_get_app_index(name);
	if (index < 0)
		return -1;
	app_list_table[index].pid = pid;
	QOR_LOG("app_list_table[%d].pid=%d\n", index, pid);
	return 0;
}

int QOR_clear_app_pid(const char *name)
{
	int index = QOR_get_app_index(name);
	if (index < 0)
		return -1;
	app_list_table[index].pid = -1;
	return 0;
}

int QOR_appinfo_check_app(const char *text)
{
	char name[QOR_APP_NAME_SIZE] = "";
	if (QOR_get_appname_from_str(name, text) != 0) {
		// Only a missing name (":" followed by "[") falls back to the pid's application.
		const char *colon = strchr(text, ':');
		if (!colon || colon[1] != '[')
			return -1;
		int pid;
		if (QOR_get_pid_from_str(&pid, text) != 0 || QOR_get_appname_from_pid(name, pid) != 0)
			return -1;
	}
	return QOR_get_app_index(name) >= 0 ? 0 : -1;
}

int QOR_appinfo_set_Lock(int index)
{
	if (!valid_app(index))
		return -1;
	const qor_app &a = app_list_table[index];
	int id = app_lock_id(index);
	int ret = QOR_set_cpufreq_max(id, a.cpufreq_max);
	if (ret == 0)
		ret = QOR_set_cpufreq_min(id, a.cpufreq_min);
	if (ret != 0) {
		QOR_LOG("fail err=%d", ret);
		return -1;
	}
	return 0;
}

int QOR_appinfo_set_Unlock(int index)
{
	if (!valid_app(index))
		return -1;
	const qor_app &a = app_list_table[index];
	int id = app_lock_id(index);
	int ret = 0;
	if (a.cpufreq_max != -2)
		ret = QOR_set_cpufreq_max(id, -1);
	if (ret == 0 && a.cpufreq_min != -2)
		ret = QOR_set_cpufreq_min(id, -1);
	if (ret != 0) {
		QOR_LOG("fail err=%d", ret);
		return -1;
	}
	return 0;
}

int QOR_appinfo_Manager(const char *text)
{
	if (!text)
		return -1;
	int type = QOR_get_appinfo_type(text);
	int pid = 0;

	if (type == QOR_APPINFO_TERMINATED) {
		if (QOR_get_pid_from_str(&pid, text) != 0)
			return -1;
		qor_scenario_release_pid(pid);
	}
	if (QOR_appinfo_check_app(text) != 0)
		return -1;

	char name[QOR_APP_NAME_SIZE] = "";
	char appinfo_for_vorn[256] = "";
	int index;
	switch (type) {
	case QOR_APPINFO_LAUNCH:
		if (QOR_get_appname_from_str(name, text) != 0 || QOR_get_pid_from_str(&pid, text) != 0 ||
		    QOR_store_appname_pid(name, pid) != 0 || (index = QOR_get_app_index(name)) < 0)
			return -1;
		QOR_appinfo_set_Lock(index);
		break;
	case QOR_APPINFO_TERMINATED:
	case QOR_APPINFO_PAUSE:
	case QOR_APPINFO_RESUME:
		if (QOR_get_pid_from_str(&pid, text) != 0 || QOR_get_appname_from_pid(name, pid) != 0 ||
		    (index = QOR_get_app_index(name)) < 0)
			return -1;
		if (type == QOR_APPINFO_RESUME)
			QOR_appinfo_set_Lock(index);
		else
			QOR_appinfo_set_Unlock(index);
		break;
	default:
		break;
	}
	if (type != QOR_APPINFO_NONE)
		QOR_FORMAT(appinfo_for_vorn, "%s%s", appinfo_prefixes[type], name);
	if (type == QOR_APPINFO_TERMINATED)
		QOR_clear_app_pid(name);

	QOR_LOG("appinfo_for_vorn = %s\n", appinfo_for_vorn);
	vorn_send_event(appinfo_for_vorn);
	return 0;
}
