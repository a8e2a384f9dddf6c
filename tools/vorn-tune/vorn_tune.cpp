// vorn-tune: checks tuning files with the daemon's parser and shows the tables they give.
#include "vorn_device.h"
#include "vorn_info.h"
#include "vorn_tuning.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

constexpr char USAGE[] = "usage: vorn-tune check FILE...\n"
			 "       vorn-tune show FILE\n"
			 "check: one 'FILE:LINE: message' line per problem; exit 0 when every table would be\n"
			 "       applied, 1 otherwise.\n"
			 "show:  the sensor thresholds and the limit records of every mode and level the daemon\n"
			 "       would run with (before the device's old-hardware, booting and charging offsets).\n"
			 "Exit 2 on bad usage.\n";

// Loads path over the built-in tables; prints its problems. True when the daemon would apply it.
bool load(vorn_info_t *info, const vorn_tuning_snapshot &builtin, const char *path)
{
	vorn_tuning_restore(info, &builtin);
	vorn_tuning_report report;
	int ret = vorn_tuning_load(path, &report);
	for (int i = 0; i < report.count && i < VORN_TUNING_PROBLEM_MAX; i++)
		printf("%s:%d: %s\n", path, report.problems[i].line, report.problems[i].message);
	if (report.count > VORN_TUNING_PROBLEM_MAX)
		printf("%s: %d more problems\n", path, report.count - VORN_TUNING_PROBLEM_MAX);
	if (ret == -2 || ret == -5)
		printf("%s:0: %s\n", path, ret == -2 ? "cannot open" : "cannot read");
	else if (ret != 0 && report.count == 0)
		printf("%s:0: refused (%d)\n", path, ret);
	return ret == 0 && report.count == 0;
}

void show(const vorn_info_t *info)
{
	for (int i = 0; i < info->sensor_count && info->sensors[i].id != -1; i++) {
		const vorn_sensor &s = info->sensors[i];
		if (!s.temp_table)
			continue;
		printf("[%s]\n", s.name);
		for (int lev = 0; lev < s.temp_table_count && lev < VORN_LEVEL_COUNT; lev++)
			printf("lev:%d temp:%d\n", lev, s.temp_table[lev]);
	}
	for (int m = 0; m < info->mode_count; m++) {
		printf("[%s]\n", info->modes[m].name);
		for (const vorn_limit &l : info->modes[m].limit)
			printf("mode: %d limit {%7d, %d, %d, %3d, %3d, %d %d}\n", m, l.cpu_freq, l.cpu_enable, l.gpu,
			       l.brightness, l.chg_current, l.auto_screen_tone, l.dynamic_fps);
	}
}

} // namespace

int main(int argc, char **argv)
{
	if (argc >= 2 && (!strcmp(argv[1], "--help") || !strcmp(argv[1], "-h"))) {
		fputs(USAGE, stdout);
		return 0;
	}
	bool check = argc >= 3 && !strcmp(argv[1], "check");
	if (!check && !(argc == 3 && !strcmp(argv[1], "show"))) {
		fputs(USAGE, stderr);
		return 2;
	}
	// The parser's own log lines are the daemon's; the tool reports on standard output.
	setenv("JOTLOG_FILE", "/dev/null", 0);
	unsetenv(VORN_TUNING_ENV);
	vorn_info_t *info = vorn_get_info();
	if (vorn_init_device_info(info) != 0) {
		fputs("vorn-tune: cannot set up the built-in profile\n", stderr);
		return 1;
	}
	if (info->board_rev <= VORN_OLD_HW_REV)
		vorn_adjust_threshold(-VORN_OLD_HW_OFFSET); // the device's offset, not the file's
	vorn_tuning_snapshot builtin;
	vorn_tuning_save(info, &builtin);
	bool ok = true;
	for (int i = 2; i < argc; i++)
		ok = load(info, builtin, argv[i]) && ok;
	if (!check) {
		if (!ok)
			vorn_tuning_restore(info, &builtin); // what the daemon runs with after a refusal
		show(info);
	}
	return ok ? 0 : 1;
}
