// Scenario resource control: the scenario table and the lock engine.
#pragma once

constexpr int QOR_NAME_SIZE = 64;  // scenario names and request texts
constexpr int QOR_SCENARIO_COUNT = 23; // built-in scenarios, lock identities 0..22

struct qor_scenario {
	char name[QOR_NAME_SIZE];
	int lock_level;
	int cpufreq_min;
	int cpufreq_max;
	int cpu_online_min;
	int cpu_online_max;
	int cpu_freq_up_threshold;
	int bus_mif_freq_min;
	int gpu_min_level;
	int gpu_max_level;
	int pid;
	int locked;
};

// Built-in rows plus the "VORN" row through which the thermal side reaches the kernel.
constexpr int QOR_SCENARIO_ROWS = QOR_SCENARIO_COUNT + 1;
constexpr int QOR_VORN_INDEX = QOR_SCENARIO_COUNT;

// Restores the build-time table and engine state (start-up, and a clean slate for tests).
void qor_main_init(void);

// Scenario table.
int QOR_get_scenario_count(void);
int QOR_get_scenario_index(const char *name);
int QOR_set_scenario_value(const char *name, int which, int value);
// Lock identity of a row: its index for the built-in rows; "VORN" follows the application identities.
int qor_scenario_lock_id(int index);
// Copy of a row taken under the engine lock; -1 for an index out of range.
int qor_scenario_get(int index, qor_scenario *out);

// Lock engine.
int Vexel_Resource_Manager(const char *request);
int QOR_set_Lock(int index);
int QOR_set_Unlock(int index);
// Releases the first scenario whose last requester was pid; 0 when one was released, -1 otherwise.
int qor_scenario_release_pid(int pid);

int QOR_set_cpu_online_max(int id, int value);
int QOR_set_cpu_online_min(int id, int value);
int QOR_set_cpufreq_max(int id, int value);
int QOR_set_cpufreq_min(int id, int value);
int QOR_set_bus_mif_freq_min(int id, int value);
int QOR_set_cpu_freq_up_threshold(int id, int value);
int QOR_set_id_sysfs(const char *path, int id, int value);
int QOR_make_id_lock_format(int id, const char *value, char *output, int output_size);
void QOR_apply_gpufreq_value(void);

// Request parsing, exposed for the request threads' callers and tests.
enum qor_request_type { QOR_REQUEST_NONE = 0, QOR_REQUEST_LOCK = 1, QOR_REQUEST_UNLOCK = 2 };
// Copies request into work (QOR_NAME_SIZE bytes) and cuts it at "[PID]"; *pid gets the number after it.
// Returns 1 when a "[PID]" was present, else 0.
int QOR_split_pid(const char *request, char *work, int *pid);
int QOR_get_request_type(const char *text);
