// The event journal: one line per node write, kernel-log record or display call, in order.
#pragma once
#include <cstddef>
#include <string_view>

#include "devsim_nodes.h"

// Room for the sequence number, a path and a node text with every byte escaped.
constexpr size_t DEVSIM_JOURNAL_LINE_MAX = 32 + 128 + 2 * DEVSIM_TEXT_MAX + 2;

struct devsim_journal {
	int fd;		    // -1: no journal
	unsigned long seq;  // number of the last event
	char line[DEVSIM_JOURNAL_LINE_MAX];
};

// Formats "<seq> <what> <text>\n" with a backslash as \\ and a newline as \n; returns the
// length stored (cut to size - 1, always terminated).
size_t devsim_journal_format(char *out, size_t size, unsigned long seq, std::string_view what,
			     std::string_view text);

// file null: no journal. Otherwise creates or truncates it. 0 or -errno.
int devsim_journal_open(devsim_journal *j, const char *file);
void devsim_journal_close(devsim_journal *j);
// Records one event with a single write; a failed write is reported on stderr and forgotten.
void devsim_journal_event(devsim_journal *j, std::string_view what, std::string_view text);
