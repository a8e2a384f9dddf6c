// Tuning file: the loader, the section scan and the table parsers, and the start-up load that
// keeps the built-in tables whole when a file is refused.
#include "vorn_tuning.h"

#include "qor_log.h"
#include "qor_text.h"

#include <Eina.h>
#include <cerrno>
#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// Where the problems of the parse in progress go; idle outside vorn_tuning_parse_text.
struct parse_context {
	const char *text;
	vorn_tuning_report *report;
	const char *section;	 // name of the section being parsed
	const char *section_pos; // its "["
};
parse_context ctx;

bool is_blank(char c)
{
	return c == ' ' || c == '\t' || c == '\r' || c == '\n';
}

bool ends_token(char c)
{
	return c == '\0' || c == ' ' || c == '\t' || c == '\r' || c == '\n';
}

// Lines before pos: the scan stops at the text's first NUL, so every NUL before a reported
// position is a newline that a table parser cut.
int line_of(const char *pos)
{
	int line = 1;
	for (const char *p = ctx.text; p < pos; p++)
		if (*p == '\n' || *p == '\0')
			line++;
	return line;
}

void problem(const char *pos, const char *fmt, ...) __attribute__((format(printf, 2, 3)));
void problem(const char *pos, const char *fmt, ...)
{
	vorn_tuning_report *r = ctx.report;
	if (!r || !ctx.text)
		return;
	if (r->count < VORN_TUNING_PROBLEM_MAX) {
		vorn_tuning_problem &p = r->problems[r->count];
		p.line = line_of(pos);
		va_list ap;
		va_start(ap, fmt);
		int n = vsnprintf(p.message, sizeof p.message, fmt, ap);
		va_end(ap);
		if (n < 0)
			p.message[0] = '\0';
		// One problem, one output line: names may hold any byte.
		for (char *c = p.message; *c; c++)
			if (static_cast<unsigned char>(*c) < 0x20 || *c == 0x7f)
				*c = '?';
	}
	r->count++;
}

const char *section_name(void)
{
	return ctx.section ? ctx.section : "?";
}

// Walks a section body line by line into rows of width values (level first). A level outside
// 0..4 refuses the table. Returns false on a refused table.
bool parse_rows(char *start, char *end, int width, int *rows, bool limit)
{
	char *cur = vorn_skip_space(start);
	int lines = 0;
	while (cur && cur < end && *cur) {
		char *nl = cur;
		while (nl < end && *nl && *nl != '\n')
			nl++;
		if (nl == end || *nl != '\n') {
			if (limit)
				VORN_LOGE("Err: find idx");
			problem(cur, "table of \"%s\" refused: line runs into the next section", section_name());
			return false;
		}
		*nl = '\0';
		int level = -1;
		if (vorn_parse_value(&cur, &level) < 0 || level < 0 || level >= VORN_LEVEL_COUNT) {
			if (limit)
				VORN_LOGE("Err: parse level");
			problem(nl, "table of \"%s\" refused: level must be 0 to 4", section_name());
			return false;
		}
		int *row = rows + level * width;
		for (int i = 0; i < width; i++)
			row[i] = 0; // the last line of a level wins whole
		for (int i = 0; i < width; i++) {
			if (vorn_parse_value(&cur, &row[i]) < 0) {
				if (!limit)
					return false;
				VORN_LOGE("Err: parse item value");
				break;
			}
		}
		if (++lines == VORN_LEVEL_COUNT)
			break;
		cur = vorn_skip_space(nl + 1);
	}
	return true;
}

// Saturating conversion of a token's leading digits, like atoi without its overflow.
int token_int(const char *p)
{
	while (!ends_token(*p) && (*p == '\v' || *p == '\f'))
		p++;
	if (*p == '+')
		p++;
	long long v = 0;
	for (; *p >= '0' && *p <= '9'; p++) {
		v = v * 10 + (*p - '0');
		if (v > INT_MAX)
			return INT_MAX;
	}
	return static_cast<int>(v);
}

} // namespace

char *vorn_skip_space(char *cursor)
{
	while (cursor && is_blank(*cursor))
		cursor++;
	return cursor;
}

void vorn_strip_comment(char *text)
{
	bool in_comment = false;
	for (char *p = text; p && *p; p++) {
		if (*p == '\n')
			in_comment = false;
		else if (*p == '#')
			in_comment = true;
		if (in_comment)
			*p = ' ';
	}
}

int vorn_parse_value(char **cursor, int *value)
{
	if (!cursor || !*cursor || !value)
		return -22;
	char *p = *cursor;
	while (*p == ' ' || *p == '\t' || *p == '\r')
		p++;
	if (*p == '\0' || *p == '\n') {
		*cursor = p;
		return 0;
	}
	*value = *p == '-' ? -2 : *p == '/' ? -1 : token_int(p);
	while (!ends_token(*p))
		p++;
	while (*p == ' ' || *p == '\t' || *p == '\r')
		p++;
	*cursor = p;
	return 0;
}

int vorn_parse_temp(vorn_sensor *sensor, char *start, char *end)
{
	if (!sensor || !start || !end) {
		VORN_LOGE("Invalid argument");
		return -22;
	}
	int table[VORN_LEVEL_COUNT] = {};
	bool ok;
	if (!sensor->temp_table || sensor->temp_table_count < 1) {
		problem(ctx.section_pos, "table of \"%s\" refused: the sensor has no thresholds", section_name());
		ok = false;
	} else {
		ok = parse_rows(start, end, 1, table, false);
	}
	if (!ok) {
		VORN_LOGE("temp table parsing error");
		return -14;
	}
	for (int lev = 0; lev < VORN_LEVEL_COUNT; lev++)
		VORN_LOGI("lev:%d temp:%d\n", lev, table[lev]);
	int count = sensor->temp_table_count < VORN_LEVEL_COUNT ? sensor->temp_table_count : VORN_LEVEL_COUNT;
	memcpy(sensor->temp_table, table, sizeof(int) * static_cast<size_t>(count));
	return 0;
}

int vorn_parse_limit(int mode_id, char *start, char *end)
{
	vorn_info_t *info = vorn_get_info();
	vorn_limit table[VORN_LEVEL_COUNT] = {};
	static_assert(sizeof(vorn_limit) == sizeof(int) * VORN_LIMIT_COUNT);
	if (!info->modes || mode_id < 0 || mode_id >= info->mode_count || !start || !end ||
	    !parse_rows(start, end, VORN_LIMIT_COUNT, &table[0].cpu_freq, true)) {
		VORN_LOGE("limit table parsing error");
		return -14;
	}
	for (const vorn_limit &l : table)
		VORN_LOGI("mode: %d limit {%7d, %d, %d, %3d, %3d, %d %d}\n", mode_id, l.cpu_freq, l.cpu_enable, l.gpu,
			  l.brightness, l.chg_current, l.auto_screen_tone, l.dynamic_fps);
	memcpy(info->modes[mode_id].limit, table, sizeof table);
	return 0;
}

int vorn_parse_section(const char *name, char *start, char *end)
{
	if (!name || !start || !end) {
		VORN_LOGE("Invalid argument");
		return -22;
	}
	vorn_info_t *info = vorn_get_info();
	for (int i = 0; info->sensors && i < info->sensor_count && info->sensors[i].id != -1; i++) {
		vorn_sensor &s = info->sensors[i];
		if (s.name && strcasecmp(s.name, name) == 0) {
			vorn_parse_temp(&s, start, end);
			return 0;
		}
	}
	int id = vorn_get_mode_by_name(info->mode_name_map, name);
	if (id < 0 || id >= info->mode_count || !info->modes) {
		VORN_LOGE("Failed to find mode by name(%s): %d", name, id);
		problem(ctx.section_pos, "unknown section name \"%s\" (neither a sensor nor a mode)", name);
		return -22;
	}
	char *mode_name = info->modes[id].name;
	size_t n = strnlen(name, VORN_STATE_NAME_SIZE - 2);
	memcpy(mode_name, name, n);
	mode_name[n] = '\0';
	return vorn_parse_limit(id, start, end);
}

int vorn_tuning_parse_text(char *text, int len, vorn_tuning_report *report)
{
	if (report)
		*report = {};
	if (!text || len < 0)
		return -22;
	char *const end = text + len;
	vorn_strip_comment(text);
	ctx = {text, report, nullptr, nullptr};
	int code = 0;
	char *cur = text;
	while (cur < end && *cur) {
		if (is_blank(*cur)) {
			cur = vorn_skip_space(cur);
			continue;
		}
		if (*cur != '[') {
			VORN_LOGE("Text outside a section");
			problem(cur, "text outside any section");
			code = -22;
			break;
		}
		char *close = static_cast<char *>(memchr(cur + 1, ']', static_cast<size_t>(end - cur - 1)));
		char *nul = static_cast<char *>(memchr(cur + 1, '\0', static_cast<size_t>(end - cur - 1)));
		if (!close || (nul && nul < close)) {
			VORN_LOGE("Not found end of section']'");
			problem(cur, "no ']' closing the section");
			code = 1;
			break;
		}
		char name[VORN_STATE_NAME_SIZE];
		size_t n = static_cast<size_t>(close - cur - 1);
		if (n > VORN_STATE_NAME_SIZE - 1)
			n = VORN_STATE_NAME_SIZE - 1;
		memcpy(name, cur + 1, n);
		name[n] = '\0';
		char *body = close + 1;
		char *body_end = static_cast<char *>(memchr(body, '[', static_cast<size_t>(end - body)));
		if (!body_end)
			body_end = end;
		ctx.section = name;
		ctx.section_pos = cur;
		int ret = vorn_parse_section(name, body, body_end);
		ctx.section = nullptr;
		if (ret != 0) {
			VORN_LOGE("Failed to parse section: %d", ret);
			code = ret;
			break;
		}
		cur = body_end;
	}
	ctx = {};
	if (code == 0)
		return 0;
	VORN_LOGE("conf parsing error1: %d", code);
	return -22;
}

int vorn_tuning_load(const char *path, vorn_tuning_report *report)
{
	if (report)
		*report = {};
	if (!path) {
		VORN_LOGE("Invalid argument");
		return -22;
	}
	VORN_LOGI("Init from %s", path);
	// Non-blocking: a FIFO in place of the file must not hold up the thermal start-up.
	int fd = open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK);
	if (fd < 0)
		return -2;
	char buf[VORN_TUNING_BUF_SIZE] = {};
	ssize_t n = read(fd, buf, VORN_TUNING_READ_MAX);
	struct stat st;
	bool cut = n == VORN_TUNING_READ_MAX && fstat(fd, &st) == 0 && st.st_size > VORN_TUNING_READ_MAX;
	close(fd);
	if (n < 0) {
		VORN_LOGE("Failed to read config file");
		return -5;
	}
	buf[n] = '\n';
	buf[n + 1] = '\0';
	VORN_LOGI("Config file read (%d bytes)", static_cast<int>(n));
	int ret = vorn_tuning_parse_text(buf, static_cast<int>(n) + 1, report);
	if (cut && report) {
		ctx = {buf, report, nullptr, nullptr};
		problem(buf + n, "file cut at %d bytes: the rest is not read", VORN_TUNING_READ_MAX);
		ctx = {};
	}
	return ret;
}

int vorn_init_device_info_from_conf(const char *path)
{
	return vorn_tuning_load(path, nullptr);
}

void vorn_tuning_save(const vorn_info_t *info, vorn_tuning_snapshot *snap)
{
	*snap = {};
	for (int i = 0; info->sensors && i < info->sensor_count && i < VORN_SENSOR_SLOTS; i++) {
		const vorn_sensor &s = info->sensors[i];
		for (int lev = 0; s.temp_table && lev < s.temp_table_count && lev < VORN_LEVEL_COUNT; lev++)
			snap->thresholds[i][lev] = s.temp_table[lev];
	}
	for (int m = 0; info->modes && m < info->mode_count && m < VORN_MODE_COUNT; m++)
		snap->modes[m] = info->modes[m];
}

void vorn_tuning_restore(vorn_info_t *info, const vorn_tuning_snapshot *snap)
{
	for (int i = 0; info->sensors && i < info->sensor_count && i < VORN_SENSOR_SLOTS; i++) {
		vorn_sensor &s = info->sensors[i];
		for (int lev = 0; s.temp_table && lev < s.temp_table_count && lev < VORN_LEVEL_COUNT; lev++)
			s.temp_table[lev] = snap->thresholds[i][lev];
	}
	for (int m = 0; info->modes && m < info->mode_count && m < VORN_MODE_COUNT; m++)
		info->modes[m] = snap->modes[m];
}

int vorn_tuning_load_env(vorn_info_t *info)
{
	const char *path = getenv(VORN_TUNING_ENV);
	if (!info || !path || !*path)
		return 0;
	vorn_tuning_snapshot snap;
	vorn_tuning_save(info, &snap);
	vorn_tuning_report report;
	int ret = vorn_tuning_load(path, &report);
	for (int i = 0; i < report.count && i < VORN_TUNING_PROBLEM_MAX; i++)
		VORN_LOGE("Tuning file %s:%d: %s", path, report.problems[i].line, report.problems[i].message);
	if (ret == 0) {
		VORN_LOGI("Tuning file %s applied", path);
		return 0;
	}
	vorn_tuning_restore(info, &snap);
	if (report.count > 0)
		VORN_LOGE("Tuning file %s refused (%d) at line %d: %s; built-in tables kept", path, ret,
			  report.problems[0].line, report.problems[0].message);
	else
		VORN_LOGE("Tuning file %s refused (%d): %s; built-in tables kept", path, ret,
			  ret == -2 ? "cannot open" : ret == -5 ? "cannot read" : "invalid");
	return ret;
}
