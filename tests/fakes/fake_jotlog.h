// Recording log service for unit tests: keeps every line in memory.
#pragma once
#include <string>
#include <vector>

struct fake_jotlog_line {
	int buffer;
	int priority;
	std::string tag;
	std::string text; // formatted message, prefix included
};

std::vector<fake_jotlog_line> fake_jotlog_lines(void);
void fake_jotlog_clear(void);
// Number of recorded lines whose text contains needle.
int fake_jotlog_count(const std::string &needle);
