// Fixture of the thermal unit tests: a temporary root with the sensor and status nodes and a plain
// file as kernel log, the log and bus fakes cleared, the thermal record and device tables reset.
#pragma once
#include "fake_jotlog.h"
#include "test_support.h"

#include <Ecore.h>
#include <gtest/gtest.h>

class VornTest : public ::testing::Test {
protected:
	void SetUp() override;
	void TearDown() override;
	std::string real(const std::string &dev_path) const { return dir.path + dev_path; }
	void put(const std::string &dev_path, const std::string &text);
	// Kernel-log text written since the last call (one write at a time: the file is emptied).
	std::string kmsg_take();
	static int jot(const std::string &needle) { return fake_jotlog_count(needle); }
	// Runs the Ecore loop until cond holds or timeout passes.
	static bool loop_until(const std::function<bool()> &cond, std::chrono::milliseconds timeout)
	{
		return test_wait_for([&] { return ecore_main_loop_iterate_may_block(0), cond(); }, timeout);
	}

	test_tmpdir dir;
};
