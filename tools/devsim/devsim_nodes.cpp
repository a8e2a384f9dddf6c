// The emulated kernel nodes: start values, write grammars and the texts reads return.
#include "devsim_nodes.h"

#include "qor_text.h"

#include <cerrno>
#include <climits>
#include <cstring>

namespace {

struct devsim_row {
	const char *path;
	devsim_kind kind;
	int initial;
};

constexpr const char DEVSIM_CAP_SOURCE[] = "/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_max";

constexpr devsim_row devsim_rows[] = {
	{"/sys/devices/system/cpu/cpufreq/pmqos/cpufreq_min", DEVSIM_PMQOS_MAX, 0},
	{DEVSIM_CAP_SOURCE, DEVSIM_PMQOS_MIN, INT_MAX},
	{"/sys/devices/system/cpu/cpufreq/pmqos/cpu_online_min", DEVSIM_PMQOS_MAX, 1},
	{"/sys/devices/system/cpu/cpufreq/pmqos/cpu_online_max", DEVSIM_PMQOS_MIN, 4},
	{"/sys/devices/system/cpu/cpufreq/pmqos/bus_mif_freq_min", DEVSIM_PMQOS_MAX, 0},
	{"/sys/devices/system/cpu/cpufreq/pmqos/cpu_freq_up_threshold", DEVSIM_PMQOS_MAX, 0},
	{"/sys/devices/system/cpu/cpu0/cpufreq/scaling_max_freq", DEVSIM_FREQ_CAP, 1400000},
	{"/sys/power/gpufreq_min_limit", DEVSIM_INT, 0},
	{"/sys/power/gpufreq_max_limit", DEVSIM_INT, 0},
	{"/sys/class/power_supply/battery/vorn_level", DEVSIM_INT, 100},
	{"/sys/class/power_supply/battery/capacity", DEVSIM_INT, 80},
	{"/sys/class/xun/temperature/ap_therm", DEVSIM_SENSOR_XUN, 40},
	{"/sys/class/xun/temperature/batt_therm", DEVSIM_SENSOR_XUN, 35},
	{"/sys/class/xun/temperature/xo_therm", DEVSIM_SENSOR_XUN, 38},
	{"/sys/class/thermal/thermal_zone1/temp", DEVSIM_SENSOR_ZONE, 45000},
	{"/sys/kernel/debug/wakeup_sources_active", DEVSIM_TEXT, 0},
	{"/sys/kernel/debug/wakeup_sources", DEVSIM_TEXT, 0},
	{"/sys/kernel/debug/sleep_history", DEVSIM_TEXT, 0},
};

constexpr std::string_view DEVSIM_ROOT_PATH = "/sys";

bool is_blank(char c)
{
	return c == ' ' || c == '\t';
}

bool is_trailer(char c)
{
	return is_blank(c) || c == '\n';
}

// Reads an optionally signed decimal at text[*i], advancing *i; false without digits or on overflow.
bool take_number(std::string_view text, size_t *i, long long lo, long long hi, long long *out)
{
	size_t p = *i;
	bool negative = false;
	if (p < text.size() && (text[p] == '+' || text[p] == '-'))
		negative = text[p++] == '-';
	size_t digits = p;
	long long v = 0;
	for (; p < text.size() && text[p] >= '0' && text[p] <= '9'; p++) {
		v = v * 10 + (text[p] - '0');
		if (v > hi - lo) // bounds the magnitude before it can overflow
			return false;
	}
	if (p == digits)
		return false;
	v = negative ? -v : v;
	if (v < lo || v > hi)
		return false;
	*i = p;
	*out = v;
	return true;
}

bool only_trailers(std::string_view text, size_t i)
{
	for (; i < text.size(); i++)
		if (!is_trailer(text[i]))
			return false;
	return true;
}

devsim_entry *entry_at(devsim_model *m, int ino)
{
	return ino >= 1 && ino <= m->count ? &m->entry[ino - 1] : nullptr;
}

int add_entry(devsim_model *m, int parent, std::string_view name, std::string_view path, devsim_kind kind)
{
	if (m->count >= DEVSIM_ENTRY_MAX)
		return -ENOSPC;
	devsim_entry *e = &m->entry[m->count++];
	memset(e, 0, sizeof *e);
	QOR_COPY(e->name, name);
	QOR_COPY(e->path, path);
	e->parent = parent;
	e->kind = kind;
	return m->count;
}

// Returns the inode of the directory holding path's last component, creating directories on the way.
int make_parents(devsim_model *m, std::string_view path)
{
	int dir = DEVSIM_ROOT_INO;
	size_t start = DEVSIM_ROOT_PATH.size() + 1;
	for (size_t slash = path.find('/', start); slash != std::string_view::npos;
	     start = slash + 1, slash = path.find('/', start)) {
		std::string_view name = path.substr(start, slash - start);
		int child = devsim_lookup(m, dir, name);
		if (!child)
			child = add_entry(m, dir, name, path.substr(0, slash), DEVSIM_DIR);
		if (child < 0)
			return child;
		dir = child;
	}
	return dir;
}

// Per-kind behaviour: what a read shows and what a write does.
struct devsim_node_ops {
	int (*show)(const devsim_model *m, const devsim_entry *e, char *buf, size_t size);
	int (*store)(devsim_entry *e, std::string_view text); // null: read-only
};

int show_int(const devsim_model *, const devsim_entry *e, char *buf, size_t size)
{
	return static_cast<int>(qor_format(buf, size, "%d\n", e->value));
}

int show_pmqos(const devsim_model *, const devsim_entry *e, char *buf, size_t size)
{
	return static_cast<int>(qor_format(buf, size, "%d\n", devsim_pmqos_effective(e)));
}

int show_freq_cap(const devsim_model *m, const devsim_entry *e, char *buf, size_t size)
{
	const devsim_entry *source = devsim_get(m, m->cap_source);
	int cap = source ? devsim_pmqos_effective(source) : INT_MAX;
	return static_cast<int>(qor_format(buf, size, "%d\n", cap < e->value ? cap : e->value));
}

int show_verbatim(const devsim_entry *e, char *buf, size_t size)
{
	size_t n = e->len < size ? e->len : size;
	memcpy(buf, e->text, n);
	return static_cast<int>(n);
}

int show_text(const devsim_model *, const devsim_entry *e, char *buf, size_t size)
{
	return show_verbatim(e, buf, size);
}

int show_sensor(const devsim_model *, const devsim_entry *e, char *buf, size_t size)
{
	switch (e->state) {
	case DEVSIM_SENSOR_FAIL:
		return -EIO;
	case DEVSIM_SENSOR_VERBATIM:
		return show_verbatim(e, buf, size);
	case DEVSIM_SENSOR_NUMBER:
		break;
	}
	const char *fmt = e->kind == DEVSIM_SENSOR_XUN ? "temp: %d\n" : "%d\n";
	return static_cast<int>(qor_format(buf, size, fmt, e->value));
}

int store_int(devsim_entry *e, std::string_view text)
{
	int v;
	if (!devsim_parse_int(text, &v))
		return -EINVAL;
	e->value = v;
	return 0;
}

int store_pmqos(devsim_entry *e, std::string_view text)
{
	int value, id;
	if (!devsim_parse_pmqos(text, &value, &id))
		return -EINVAL;
	int slot = 0;
	while (slot < e->nreq && e->req[slot].id != id)
		slot++;
	if (value == -1) {
		if (slot < e->nreq)
			e->req[slot] = e->req[--e->nreq];
		return 0;
	}
	if (slot == e->nreq) {
		if (e->nreq == DEVSIM_PMQOS_SLOTS)
			return -ENOSPC;
		e->nreq++;
	}
	e->req[slot] = {id, value};
	return 0;
}

int store_text(devsim_entry *e, std::string_view text)
{
	memcpy(e->text, text.data(), text.size());
	e->len = text.size();
	return 0;
}

int store_sensor(devsim_entry *e, std::string_view text)
{
	int v;
	if (devsim_parse_int(text, &v)) {
		e->value = v;
		e->state = DEVSIM_SENSOR_NUMBER;
	} else if (text.starts_with("fail") && only_trailers(text, 4)) {
		e->state = DEVSIM_SENSOR_FAIL;
	} else {
		store_text(e, text);
		e->state = DEVSIM_SENSOR_VERBATIM;
	}
	return 0;
}

const devsim_node_ops *ops_of(devsim_kind kind)
{
	static constexpr devsim_node_ops pmqos_ops = {show_pmqos, store_pmqos};
	static constexpr devsim_node_ops int_ops = {show_int, store_int};
	static constexpr devsim_node_ops sensor_ops = {show_sensor, store_sensor};
	static constexpr devsim_node_ops cap_ops = {show_freq_cap, nullptr};
	static constexpr devsim_node_ops text_ops = {show_text, store_text};
	switch (kind) {
	case DEVSIM_PMQOS_MAX:
	case DEVSIM_PMQOS_MIN:
		return &pmqos_ops;
	case DEVSIM_INT:
		return &int_ops;
	case DEVSIM_SENSOR_XUN:
	case DEVSIM_SENSOR_ZONE:
		return &sensor_ops;
	case DEVSIM_FREQ_CAP:
		return &cap_ops;
	case DEVSIM_TEXT:
		return &text_ops;
	case DEVSIM_DIR:
		break;
	}
	return nullptr;
}

} // namespace

int devsim_model_init(devsim_model *m)
{
	m->count = 0;
	m->cap_source = 0;
	add_entry(m, DEVSIM_ROOT_INO, DEVSIM_ROOT_PATH.substr(1), DEVSIM_ROOT_PATH, DEVSIM_DIR);
	for (const devsim_row &row : devsim_rows) {
		std::string_view path = row.path;
		int dir = make_parents(m, path);
		if (dir < 0)
			return dir;
		int ino = add_entry(m, dir, path.substr(path.rfind('/') + 1), path, row.kind);
		if (ino < 0)
			return ino;
		m->entry[ino - 1].value = row.initial;
		if (path == DEVSIM_CAP_SOURCE)
			m->cap_source = ino;
	}
	return 0;
}

const devsim_entry *devsim_get(const devsim_model *m, int ino)
{
	return ino >= 1 && ino <= m->count ? &m->entry[ino - 1] : nullptr;
}

int devsim_lookup(const devsim_model *m, int parent, std::string_view name)
{
	for (int i = 1; i < m->count; i++) // entry 0 is the root, nobody's child
		if (m->entry[i].parent == parent && name == m->entry[i].name)
			return i + 1;
	return 0;
}

int devsim_find(const devsim_model *m, std::string_view path)
{
	for (int i = 0; i < m->count; i++)
		if (path == m->entry[i].path)
			return i + 1;
	return 0;
}

int devsim_next_child(const devsim_model *m, int dir, int after)
{
	for (int i = after < 1 ? 1 : after; i < m->count; i++)
		if (m->entry[i].parent == dir)
			return i + 1;
	return 0;
}

bool devsim_writable(const devsim_entry *e)
{
	const devsim_node_ops *ops = ops_of(e->kind);
	return ops && ops->store;
}

int devsim_show(const devsim_model *m, int ino, char *buf, size_t size)
{
	const devsim_entry *e = devsim_get(m, ino);
	if (!e)
		return -ENOENT;
	const devsim_node_ops *ops = ops_of(e->kind);
	if (!ops)
		return -EISDIR;
	return ops->show(m, e, buf, size);
}

int devsim_store(devsim_model *m, int ino, std::string_view text)
{
	devsim_entry *e = entry_at(m, ino);
	if (!e)
		return -ENOENT;
	const devsim_node_ops *ops = ops_of(e->kind);
	if (!ops)
		return -EISDIR;
	if (!ops->store)
		return -EACCES;
	if (text.size() > DEVSIM_TEXT_MAX)
		return -EINVAL;
	return ops->store(e, text);
}

int devsim_pmqos_effective(const devsim_entry *e)
{
	if (e->nreq == 0)
		return e->value;
	int v = e->req[0].value;
	for (int i = 1; i < e->nreq; i++) {
		int r = e->req[i].value;
		if (e->kind == DEVSIM_PMQOS_MIN ? r < v : r > v)
			v = r;
	}
	return v;
}

bool devsim_parse_int(std::string_view text, int *out)
{
	size_t i = 0;
	while (i < text.size() && is_blank(text[i]))
		i++;
	long long v;
	if (!take_number(text, &i, INT_MIN, INT_MAX, &v) || !only_trailers(text, i))
		return false;
	*out = static_cast<int>(v);
	return true;
}

bool devsim_parse_pmqos(std::string_view text, int *value, int *id)
{
	size_t i = 0;
	while (i < text.size() && is_blank(text[i]))
		i++;
	long long v, n;
	if (!take_number(text, &i, INT_MIN, INT_MAX, &v))
		return false;
	size_t gap = i;
	while (i < text.size() && is_blank(text[i]))
		i++;
	if (i == gap || text.substr(i, 2) != "id")
		return false;
	i += 2;
	if (i < text.size() && (text[i] == '+' || text[i] == '-'))
		return false;
	if (!take_number(text, &i, 0, INT_MAX, &n) || !only_trailers(text, i))
		return false;
	*value = static_cast<int>(v);
	*id = static_cast<int>(n);
	return true;
}
