// The emulated phone's kernel nodes: a fixed tree under /sys whose files act like the drivers.
// Pure state and text handling, no I/O; the FUSE layer maps inodes onto it.
#pragma once
#include <cstddef>
#include <string_view>

// Longest text a node takes in one write or serves.
constexpr size_t DEVSIM_TEXT_MAX = 4096;
// Identities a PM-QoS node keeps requests for at once.
constexpr int DEVSIM_PMQOS_SLOTS = 64;
// Directories and files of the tree, root included.
constexpr int DEVSIM_ENTRY_MAX = 48;
// Inode of the tree's root, the directory mounted as /sys.
constexpr int DEVSIM_ROOT_INO = 1;

enum devsim_kind {
	DEVSIM_DIR,
	DEVSIM_PMQOS_MAX, // effective value: the largest request
	DEVSIM_PMQOS_MIN, // effective value: the smallest request
	DEVSIM_INT,	  // the last integer written
	DEVSIM_SENSOR_XUN,  // "temp: N\n"
	DEVSIM_SENSOR_ZONE, // "N\n"
	DEVSIM_FREQ_CAP,    // hardware maximum capped by the effective PM-QoS cpufreq_max
	DEVSIM_TEXT,	    // any text, served as written
};

enum devsim_sensor_state {
	DEVSIM_SENSOR_NUMBER,
	DEVSIM_SENSOR_FAIL, // reads fail with EIO
	DEVSIM_SENSOR_VERBATIM,
};

struct devsim_pmqos_req {
	int id;
	int value;
};

struct devsim_entry {
	char name[64];	 // last path component
	char path[128];	 // path under the emulated root, e.g. /sys/power/gpufreq_min_limit
	int parent;	 // inode of the directory holding it (the root holds itself)
	devsim_kind kind;
	int value;	 // integer nodes and sensor temperature; PM-QoS default; frequency cap
	int nreq;	 // PM-QoS requests standing, in req[0..nreq)
	devsim_pmqos_req req[DEVSIM_PMQOS_SLOTS];
	devsim_sensor_state state;
	size_t len;	 // verbatim text in text[0..len)
	char text[DEVSIM_TEXT_MAX];
};

// The whole tree; inode n is entry[n - 1].
struct devsim_model {
	int count;
	int cap_source; // inode of the node that caps DEVSIM_FREQ_CAP nodes
	devsim_entry entry[DEVSIM_ENTRY_MAX];
};

// Builds the tree with every node at its start value. 0, or -ENOSPC when the table outgrows it.
int devsim_model_init(devsim_model *m);

const devsim_entry *devsim_get(const devsim_model *m, int ino);
// Inode of the child called name in directory parent, or 0.
int devsim_lookup(const devsim_model *m, int parent, std::string_view name);
// Inode of a path under the emulated root ("/sys/..."), or 0.
int devsim_find(const devsim_model *m, std::string_view path);
// The next child of directory dir after inode after (0: the first), or 0 at the end.
int devsim_next_child(const devsim_model *m, int dir, int after);
bool devsim_writable(const devsim_entry *e);

// Renders the node's current text into buf; its length, or -errno (-EIO for a failing sensor).
int devsim_show(const devsim_model *m, int ino, char *buf, size_t size);
// Applies one write: the text is the node's whole new value. 0 or -errno.
int devsim_store(devsim_model *m, int ino, std::string_view text);

// Effective value of a PM-QoS node.
int devsim_pmqos_effective(const devsim_entry *e);

// Number text: optional blanks, optional sign, digits, optional trailing blanks or newlines.
bool devsim_parse_int(std::string_view text, int *out);
// PM-QoS request: a number, blanks, "id" and a non-negative identity, optional trailing blanks.
bool devsim_parse_pmqos(std::string_view text, int *value, int *id);
