// Diagnostics writers: kernel-log and gate lines, wakeup sources, file append and rotation.
#include "fake_jotlog.h"
#include "test-vorn-root.h"
#include "vorn_util.h"

#include <unistd.h>

namespace {

using VornUtil = VornTest;

TEST_F(VornUtil, KernelLogLinesTheirCopiesAndTheCut)
{
	VORN_KMSG_LOG("Board Rev:%d\n", 3);
	EXPECT_EQ(kmsg_take(), "[thermal] Board Rev:3\n");
	auto line = fake_jotlog_lines().at(0);
	EXPECT_EQ(line.buffer, JOTLOG_SYSTEM);
	EXPECT_EQ(line.priority, JOTLOG_INFO);
	EXPECT_EQ(line.tag, "VORN");
	EXPECT_EQ(line.text.rfind("test-vorn-util.cpp: TestBody(", 0), 0u) << line.text;
	EXPECT_NE(line.text.find(") > [thermal] Board Rev:3\n"), std::string::npos);

	VORN_KMSG_LOG_WARN("%s", std::string(300, 'm').c_str());
	EXPECT_EQ(kmsg_take(), "[thermal] " + std::string(244, 'm')); // 254 characters in all
	EXPECT_EQ(fake_jotlog_lines().back().priority, JOTLOG_WARN);

	VORN_KMSG_LOG_DEBUG("[%d] status\n", 7);
	EXPECT_EQ(kmsg_take(), "[thermal] [7] status\n");
	EXPECT_EQ(fake_jotlog_lines().size(), 2u); // the debug copy goes nowhere

	VORN_GATE_LOG("DEVICETEMP_%d/%d", 40, 35);
	line = fake_jotlog_lines().back();
	EXPECT_EQ(line.buffer, JOTLOG_MAIN);
	EXPECT_EQ(line.tag, "GATE");
	EXPECT_EQ(line.text, "<GATE-M>DEVICETEMP_40/35</GATE-M>\n");
	EXPECT_EQ(kmsg_take(), "");
}

TEST_F(VornUtil, WakeupSourceRecords)
{
	vorn_log_wakeup_sources(); // no file: nothing
	EXPECT_TRUE(fake_jotlog_lines().empty());
	put("/sys/kernel/debug/wakeup_sources_active",
	    "ws_a 1500 20\nws_b\t3000 4000\n" + std::string(300, 'n') + " 10 20\nws_c 7\nws_d 1 2");
	vorn_log_wakeup_sources();
	EXPECT_EQ(jot("> [WS:0] ws_a: 1.50 (0.02)"), 1);
	EXPECT_EQ(jot("> [WS:1] ws_b: 3.00 (4.00)"), 1);
	// An over-long name is cut at 255 characters; its tail is no record of its own.
	EXPECT_EQ(jot("> [WS:2] " + std::string(255, 'n') + ": 0.01 (0.02)"), 1);
	// A partial record keeps the integers of the record before.
	EXPECT_EQ(jot("> [WS:3] ws_c: 0.01 (0.02)"), 1);
	EXPECT_EQ(jot("> [WS:4] ws_d: 0.00 (0.00)"), 1);
	EXPECT_EQ(fake_jotlog_lines().size(), 5u);
}

TEST_F(VornUtil, SaveAppendsTheSourceAndTwoLineEnds)
{
	put("/var/log/empty", "");
	EXPECT_EQ(vorn_save_to_file("/var/log/empty", "/var/log/out"), 0);
	EXPECT_EQ(test_read_file(real("/var/log/out")), "\n\n");
	std::string big;
	while (big.size() < 20000) // more than one chunk
		big += "line " + std::to_string(big.size()) + "\n";
	put("/sys/kernel/debug/sleep_history", big);
	EXPECT_EQ(vorn_save_to_file("/sys/kernel/debug/sleep_history", "/var/log/out"), 0);
	EXPECT_EQ(test_read_file(real("/var/log/out")), "\n\n" + big + "\n\n");
	EXPECT_EQ(vorn_save_to_file(nullptr, "/var/log/out"), -22);
	EXPECT_EQ(vorn_save_to_file("/var/log/none", "/var/log/out"), -22);
	EXPECT_EQ(jot("> Failed to open: " + real("/var/log/none")), 1);
}

TEST_F(VornUtil, RotationShiftsNumberedFiles)
{
	put("/var/log/ws", "current");
	put("/var/log/ws.0", "zero");
	put("/var/log/ws.1", "one");
	vorn_rotate_file("/var/log/ws", 8, 3); // below the limit
	EXPECT_EQ(test_read_file(real("/var/log/ws")), "current");
	vorn_rotate_file("/var/log/ws", 7, 3);
	EXPECT_EQ(access(real("/var/log/ws").c_str(), F_OK), -1);
	EXPECT_EQ(test_read_file(real("/var/log/ws.0")), "current");
	EXPECT_EQ(test_read_file(real("/var/log/ws.1")), "zero");
	EXPECT_EQ(test_read_file(real("/var/log/ws.2")), "one");
	EXPECT_EQ(access(real("/var/log/ws.3").c_str(), F_OK), -1);

	std::string path = "/var/log/" + std::string(117, 'r'); // path.3 would need 129 bytes
	put(path, "data");
	vorn_rotate_file(path.c_str(), 1, 3);
	EXPECT_EQ(test_read_file(real(path)), "data");
	EXPECT_EQ(jot("> Invalid rotation of"), 1);
}

} // namespace
