// Fixture for the request side: a temporary root with the kernel nodes the engine writes and a
// listener on the thermal event socket that collects forwarded texts.
#pragma once
#include "test_support.h"

#include <string>
#include <vector>

struct qor_test_root {
	qor_test_root();
	~qor_test_root();
	// Node path under the root, e.g. "/sys/power/gpufreq_min_limit".
	std::string node(const std::string &dev_path) const;
	std::string pmqos(const std::string &name) const;
	// Empties every node so each write can be read back alone.
	void clear_nodes();
	// Texts forwarded to the thermal socket since the last call (one per connection).
	std::vector<std::string> forwarded();

	test_tmpdir dir;
	int vorn_fd = -1;
};
