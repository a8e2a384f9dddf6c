// Scenario table and lock engine: request texts become PM-QoS and GPU node writes under each
// scenario's lock identity, and every request is forwarded to the thermal side.
#include "qor_main.h"

#include "device_info.h"
#include "qor_appinfo.h"
#include "qor_log.h"
#include "qor_text.h"
#include "sysroot.h"
#include "vorn/vorn_client.h"

#include <cstring>
#include <mutex>

namespace {

constexpr int NO = -2; // the scenario leaves this limit alone

constexpr qor_scenario row(const char *name, int cpufreq_min, int cpufreq_max, int cpu_online_min)
{
	qor_scenario s{};
	for (int i = 0; name[i] && i < QOR_NAME_SIZE - 1; i++)
		s.name[i] = name[i];
	s.lock_level = 1;
	s.cpufreq_min = cpufreq_min;
	s.cpufreq_max = cpufreq_max;
	s.cpu_online_min = cpu_online_min;
	s.cpu_online_max = NO;
	s.cpu_freq_up_threshold = NO;
	s.bus_mif_freq_min = NO;
	s.gpu_min_level = NO;
	s.gpu_max_level = NO;
	s.pid = -1;
	s.locked = 0;
	return s;
}

// Row order is the lock identity towards the kernel: never reorder.
constexpr qor_scenario scenario_defaults[QOR_SCENARIO_ROWS] = {
	row("Reserved00", NO, NO, NO),
	row("Reserved01", NO, NO, NO),
	row("AppLaunch", 1200000, NO, 2),
	row("AppLaunchHome", 1200000, NO, 2),
	row("UgLaunch", 1200000, NO, 2),
	row("PowerSaving", NO, 1000000, NO),
	row("UltraPowerSaving", NO, 1000000, NO),
	row("MtpSendFile", 1000000, NO, NO),
	row("HomeScreen", 1000000, NO, 2),
	row("BrowserJavaScript", 1200000, NO, NO),
	row("ImageViewer", 1000000, NO, 2),
	row("MusicScroll", NO, NO, 2),
	row("FileScroll", NO, NO, 2),
	row("VideoScroll", NO, NO, 2),
	row("BrowserScroll", NO, NO, 2),
	row("GalleryScroll", 1000000, NO, 2),
	row("EmailScroll", 1200000, NO, 2),
	row("ContactScroll", NO, NO, 2),
	row("VexelStoreScroll", 1200000, NO, 2),
	row("CallLogScroll", 1200000, NO, 2),
	row("MyfilesScroll", 1200000, NO, 2),
	row("IMEInput", NO, NO, 2),
	row("ReservedMode", NO, NO, NO),
	// The thermal side's caps; filled in through QOR_set_scenario_value.
	row("VORN", NO, NO, NO),
};

qor_scenario scenario_list_table[QOR_SCENARIO_ROWS];
const int current_level = 6;
int gpu_min_freq_node_value;
int gpu_max_freq_node_value;

// The engine is entered from the scenario, application and thermal threads. Recursive so the
// public operations can take it whether they are called directly or from the manager.
std::recursive_mutex engine_lock;
using engine_guard = std::lock_guard<std::recursive_mutex>;

constexpr const char PMQOS_CPU_ONLINE_MAX[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpu_online_max";
constexpr const char PMQOS_CPU_ONLINE_MIN[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpu_online_min";
constexpr const char PMQOS_CPUFREQ_MAX[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max";
constexpr const char PMQOS_CPUFREQ_MIN[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min";
constexpr const char PMQOS_BUS_MIF_FREQ_MIN[] = "/sys/devices/system/cpu/cpufreq/pmqos/bus_mif_freq_min";
constexpr const char PMQOS_CPU_FREQ_UP_THRESHOLD[] =
	"/sys/devices/system/cpu/cpufreq/pmqos/cpu_freq_up_threshold";
constexpr const char GPUFREQ_MIN_LIMIT[] = "/sys/power/gpufreq_min_limit";
constexpr const char GPUFREQ_MAX_LIMIT[] = "/sys/power/gpufreq_max_limit";

// One PM-QoS field of a row and its writer, in the order locks and unlocks touch them.
struct qor_node_field {
	int qor_scenario::*field;
	int (*writer)(int id, int value);
};
constexpr qor_node_field node_fields[] = {
	{&qor_scenario::cpu_online_max, QOR_set_cpu_online_max},
	{&qor_scenario::cpu_online_min, QOR_set_cpu_online_min},
	{&qor_scenario::cpufreq_max, QOR_set_cpufreq_max},
	{&qor_scenario::cpufreq_min, QOR_set_cpufreq_min},
	{&qor_scenario::bus_mif_freq_min, QOR_set_bus_mif_freq_min},
	{&qor_scenario::cpu_freq_up_threshold, QOR_set_cpu_freq_up_threshold},
};

bool valid_index(int index)
{
	return index >= 0 && index < QOR_SCENARIO_ROWS;
}

bool has_gpu_levels(const qor_scenario &s)
{
	return s.gpu_min_level != NO || s.gpu_max_level != NO;
}

int QOR_get_gpu_min_level(void)
{
	int level = 6;
	for (const auto &s : scenario_list_table)
		if (s.locked == 1 && s.gpu_min_level != NO && s.gpu_min_level < level)
			level = s.gpu_min_level;
	return level;
}

int QOR_get_gpu_max_level(void)
{
	int level = 0;
	for (const auto &s : scenario_list_table)
		if (s.locked == 1 && s.gpu_max_level != NO && s.gpu_max_level > level)
			level = s.gpu_max_level;
	return level;
}

int write_pmqos(const char *path, int id, int value)
{
	if (value == NO)
		return 0;
	return QOR_set_id_sysfs(path, id, value);
}

// Forwarding connects to the thermal socket, whose reader may itself be waiting for the engine:
// it always happens after the engine lock is released.
void forward_unless_vorn(const char *name, const char *text)
{
	if (strcmp(name, "VORN") != 0)
		vorn_send_event(text);
}

} // namespace

void qor_main_init(void)
{
	engine_guard g(engine_lock);
	memcpy(scenario_list_table, scenario_defaults, sizeof scenario_list_table);
	gpu_min_freq_node_value = 0;
	gpu_max_freq_node_value = 0;
}

// Static initialisation: the table is usable before anyone calls the init.
static const bool scenario_table_ready = (qor_main_init(), true);

int QOR_get_scenario_count(void)
{
	return QOR_SCENARIO_COUNT;
}

int qor_scenario_lock_id(int index)
{
	if (index == QOR_VORN_INDEX)
		return QOR_get_scenario_count() + QOR_get_app_count();
	return index;
}

int QOR_get_scenario_index(const char *name)
{
	if (!name)
		return -1;
	engine_guard g(engine_lock);
	for (int i = 0; i < QOR_SCENARIO_ROWS; i++)
		if (strcmp(scenario_list_table[i].name, name) == 0)
			return i;
	return -1;
}

int qor_scenario_get(int index, qor_scenario *out)
{
	if (!valid_index(index) || !out)
		return -1;
	engine_guard g(engine_lock);
	*out = scenario_list_table[index];
	return 0;
}

int QOR_set_scenario_value(const char *name, int which, int value)
{
	engine_guard g(engine_lock);
	int index = QOR_get_scenario_index(name);
	if (index < 0)
		return -1;
	qor_scenario &s = scenario_list_table[index];
	switch (which) {
	case 0: s.cpufreq_min = value; break;
	case 1: s.cpufreq_max = value; break;
	case 2: s.cpu_online_min = value; break;
	case 3: s.cpu_online_max = value; break;
	case 4: s.bus_mif_freq_min = value; break;
	case 6: s.gpu_min_level = value; break;
	case 7: s.gpu_max_level = value; break;
	default: break;
	}
	return 0;
}

int QOR_make_id_lock_format(int id, const char *value, char *output, int output_size)
{
	if (!value || !output || !*value || output_size <= 0) {
		QOR_LOG("[FAIL]");
		return -1;
	}
	qor_format(output, static_cast<size_t>(output_size), "%s id%d", value, id);
	return 0;
}

int QOR_set_id_sysfs(const char *path, int id, int value)
{
	char value_text[16];
	char output[QOR_NAME_SIZE];
	QOR_FORMAT(value_text, "%d", value);
	int ret = QOR_make_id_lock_format(id, value_text, output, sizeof output);
	if (ret == 0) {
		char real[QOR_PATH_MAX];
		qor_path(path, real);
		QOR_LOG("%s %s", real, output);
		ret = sys_set_str(path, output);
	}
	if (ret != 0) {
		QOR_LOG("fail err=%d", -1);
		return -1;
	}
	return 0;
}

int QOR_set_cpu_online_max(int id, int value)
{
	return write_pmqos(PMQOS_CPU_ONLINE_MAX, id, value);
}

int QOR_set_cpu_online_min(int id, int value)
{
	return write_pmqos(PMQOS_CPU_ONLINE_MIN, id, value);
}

int QOR_set_cpufreq_max(int id, int value)
{
	return write_pmqos(PMQOS_CPUFREQ_MAX, id, value);
}

int QOR_set_cpufreq_min(int id, int value)
{
	return write_pmqos(PMQOS_CPUFREQ_MIN, id, value);
}

int QOR_set_bus_mif_freq_min(int id, int value)
{
	return write_pmqos(PMQOS_BUS_MIF_FREQ_MIN, id, value);
}

int QOR_set_cpu_freq_up_threshold(int id, int value)
{
	return write_pmqos(PMQOS_CPU_FREQ_UP_THRESHOLD, id, value);
}

void QOR_apply_gpufreq_value(void)
{
	engine_guard g(engine_lock);
	int enabled_gpu_min_level = QOR_get_gpu_min_level();
	int enabled_gpu_max_level = QOR_get_gpu_max_level();
	QOR_LOG("enabled_gpu_min_level=%d enabled_gpu_max_level=%d", enabled_gpu_min_level, enabled_gpu_max_level);
	// The lower limit never asks for a faster step than the upper limit allows.
	int min_value = enabled_gpu_min_level > enabled_gpu_max_level ? enabled_gpu_min_level : enabled_gpu_max_level;
	int max_value = enabled_gpu_max_level;
	QOR_LOG("gpu_min_freq_node_value=%d gpu_max_freq_node_value=%d", min_value, max_value);
	if (min_value != gpu_min_freq_node_value) {
		gpu_min_freq_node_value = min_value;
		sys_set_int(GPUFREQ_MIN_LIMIT, min_value);
	}
	if (max_value != gpu_max_freq_node_value) {
		gpu_max_freq_node_value = max_value;
		sys_set_int(GPUFREQ_MAX_LIMIT, max_value);
	}
}

int QOR_set_Lock(int index)
{
	if (!valid_index(index))
		return -1;
	engine_guard g(engine_lock);
	qor_scenario &s = scenario_list_table[index];
	if (s.lock_level > current_level)
		return 0;
	s.locked = 1;
	int id = qor_scenario_lock_id(index);
	for (const auto &f : node_fields) {
		int ret = f.writer(id, s.*f.field);
		if (ret != 0) {
			QOR_LOG("fail err=%d\n", ret);
			return -1;
		}
	}
	if (has_gpu_levels(s))
		QOR_apply_gpufreq_value();
	return 0;
}

int QOR_set_Unlock(int index)
{
	if (!valid_index(index))
		return -1;
	engine_guard g(engine_lock);
	qor_scenario &s = scenario_list_table[index];
	s.locked = 0;
	int id = qor_scenario_lock_id(index);
	for (const auto &f : node_fields) {
		if (s.*f.field == NO)
			continue;
		int ret = f.writer(id, -1);
		if (ret != 0) {
			QOR_LOG("fail err=%d\n", ret);
			return -1;
		}
	}
	if (has_gpu_levels(s))
		QOR_apply_gpufreq_value();
	return 0;
}

int qor_scenario_release_pid(int pid)
{
	engine_guard g(engine_lock);
	for (int i = 0; i < QOR_SCENARIO_ROWS; i++) {
		if (scenario_list_table[i].pid == pid) {
			QOR_set_Unlock(i);
			return 0;
		}
	}
	return -1;
}

int QOR_split_pid(const char *request, char *work, int *pid)
{
	qor_copy(work, QOR_NAME_SIZE, request ? request : "");
	char *tag = strstr(work, "[PID]");
	if (!tag)
		return 0;
	*pid = qor_leading_int(tag + 5);
	*tag = '\0';
	return 1;
}

int QOR_get_request_type(const char *text)
{
	if (strstr(text, "Unlock"))
		return QOR_REQUEST_UNLOCK;
	if (strstr(text, "Lock"))
		return QOR_REQUEST_LOCK;
	return QOR_REQUEST_NONE;
}

int Vexel_Resource_Manager(const char *request)
{
	if (!request)
		return -1;
	if (!strstr(request, "GpuWakeup"))
		QOR_LOG("%s\n", request);

	char work[QOR_NAME_SIZE];
	int pid = 0;
	bool has_pid = QOR_split_pid(request, work, &pid) == 1;
	int type = QOR_get_request_type(work);

	char name[QOR_NAME_SIZE] = "";
	if (type != QOR_REQUEST_NONE) {
		// The word is assumed to end the text; a shorter text leaves an empty name.
		size_t cut = type == QOR_REQUEST_LOCK ? 4 : 6;
		size_t len = strlen(work);
		qor_copy(name, sizeof name, std::string_view(work, len > cut ? len - cut : 0));
	}

	int ret = -1;
	if (type != QOR_REQUEST_NONE) {
		engine_guard g(engine_lock);
		if (strcmp(name, "UltraPowerSaving") == 0)
			sys_set_int(GPUFREQ_MAX_LIMIT, type == QOR_REQUEST_LOCK ? 256000 : -1);
		int index = QOR_get_scenario_index(name);
		if (index >= 0) {
			if (type == QOR_REQUEST_LOCK)
				QOR_set_Lock(index);
			else
				QOR_set_Unlock(index);
			if (has_pid && pid != 0)
				scenario_list_table[index].pid = pid;
			ret = 0;
		}
	}
	forward_unless_vorn(name, work);
	if (ret != 0)
		QOR_LOG("Vexel_Resource_Manager fail\n");
	return ret;
}
