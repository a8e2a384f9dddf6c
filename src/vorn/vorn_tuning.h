// Tuning file: replaces sensor threshold tables and mode limit records of the device profile in
// place. The parser works on a text buffer; only the loader touches files.
#pragma once
#include "vorn_device.h"
#include "vorn_info.h"

constexpr int VORN_TUNING_READ_MAX = 5118; // bytes read from a tuning file; the rest is cut
constexpr int VORN_TUNING_BUF_SIZE = 5120; // read bytes, a newline and a NUL
constexpr int VORN_TUNING_PROBLEM_MAX = 16;
constexpr char VORN_TUNING_ENV[] = "VORN_TUNING_FILE";

// Problems found by one parse, with the 1-based line they are on.
struct vorn_tuning_problem {
	int line;
	char message[VORN_NAME_SIZE];
};
struct vorn_tuning_report {
	int count; // all problems; the first VORN_TUNING_PROBLEM_MAX are kept
	vorn_tuning_problem problems[VORN_TUNING_PROBLEM_MAX];
};

// The tables a tuning file can change, to put them back after a refused file.
struct vorn_tuning_snapshot {
	int thresholds[VORN_SENSOR_SLOTS][VORN_LEVEL_COUNT];
	vorn_mode modes[VORN_MODE_COUNT];
};
void vorn_tuning_save(const vorn_info_t *info, vorn_tuning_snapshot *snap);
void vorn_tuning_restore(vorn_info_t *info, const vorn_tuning_snapshot *snap);

// Reads the file and applies its sections: 0, -2 cannot open, -5 cannot read, -22 a section
// error (sections before it stay applied).
int vorn_init_device_info_from_conf(const char *path);
// The same, recording problems in report (may be null); a file longer than
// VORN_TUNING_READ_MAX bytes is reported as cut.
int vorn_tuning_load(const char *path, vorn_tuning_report *report);
// Applies the text of a tuning file: text[0..len) followed by a NUL, changed in place (comments
// blanked, lines cut). 0 or -22, as the loader.
int vorn_tuning_parse_text(char *text, int len, vorn_tuning_report *report);
// Start-up: loads the file named by VORN_TUNING_FILE, if any; a file not accepted whole leaves
// the tables as they were and is logged with its first problem's line. Returns the load result.
int vorn_tuning_load_env(vorn_info_t *info);

// name: the section's name; the body runs from start to end. 0, -22 (null argument, unknown
// name) or the limit table's result; a temperature section always gives 0.
int vorn_parse_section(const char *name, char *start, char *end);
// 0, -14 refused table (nothing is copied), -22 null argument.
int vorn_parse_temp(vorn_sensor *sensor, char *start, char *end);
// 0, or -14 refused table (nothing is copied).
int vorn_parse_limit(int mode_id, char *start, char *end);
// Cursor after the blanks (space, tab, CR, LF) at cursor; null stays null.
char *vorn_skip_space(char *cursor);
// Blanks out every '#' comment up to the text's NUL, newlines kept.
void vorn_strip_comment(char *text);
// Reads one token at *cursor into *value ("-..." -2, "/..." -1, else its leading digits) and
// leaves the cursor on the next token of the line or at its end; at a line's end stores nothing.
// 0, or -22 for a missing cursor or destination.
int vorn_parse_value(char **cursor, int *value);
