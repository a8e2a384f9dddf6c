// Diagnostics writers: kernel-log and gate lines, wakeup sources, commands, file append and rotation.
#include "test-vorn-root.h"
#include "vorn_util.h"

#include <unistd.h>

namespace {

using VornUtil = VornTest;

TEST_F(VornUtil, KernelLogAndGateLines)
{
	VORN_KMSG_LOG("Board Rev:%d\n", 3);
	EXPECT_EQ(kmsg_take(), "[thermal] Board Rev:3\n");
	auto line = fake_jotlog_lines().at(0);
	EXPECT_EQ(std::tuple(line.buffer, line.priority, line.tag), std::tuple(JOTLOG_SYSTEM, JOTLOG_INFO, "VORN"));
	EXPECT_EQ(line.text.rfind("test-vorn-util.cpp: TestBody(", 0), 0u) << line.text;

	VORN_KMSG_LOG_WARN("%s", std::string(300, 'm').c_str());
	EXPECT_EQ(kmsg_take(), "[thermal] " + std::string(244, 'm')); // cut at 254 characters in all

	VORN_GATE_LOG("DEVICETEMP_%d/%d", 40, 35);
	line = fake_jotlog_lines().back();
	EXPECT_EQ(std::tuple(line.buffer, line.tag, line.text),
		  std::tuple(JOTLOG_MAIN, "GATE", "<GATE-M>DEVICETEMP_40/35</GATE-M>\n"));
}

TEST_F(VornUtil, WakeupSourceRecords)
{
	put("/sys/kernel/debug/wakeup_sources_active",
	    "ws_a 1500 20\n" + std::string(300, 'n') + " 10 20\nws_c 7\nws_d 1 2");
	vorn_log_wakeup_sources();
	EXPECT_EQ(jot("> [WS:0] ws_a: 1.50 (0.02)"), 1);
	// An over-long name is cut at 255 characters; its tail is no record of its own.
	EXPECT_EQ(jot("> [WS:1] " + std::string(255, 'n') + ": 0.01 (0.02)"), 1);
	// A partial record keeps the integers of the record before.
	EXPECT_EQ(jot("> [WS:2] ws_c: 0.01 (0.02)"), 1);
	EXPECT_EQ(fake_jotlog_lines().size(), 4u);
}

TEST_F(VornUtil, OverLongCommandIsRefused)
{
	std::string out = real("/ran"), pad(VORN_CMD_SIZE, ' ');
	vorn_run_system_cmd("touch %s%s", out.c_str(), pad.c_str());
	EXPECT_EQ(jot("> Command too long"), 1);
	EXPECT_NE(access(out.c_str(), F_OK), 0);
	vorn_run_system_cmd("touch %s", out.c_str());
	EXPECT_EQ(access(out.c_str(), F_OK), 0);
}

TEST_F(VornUtil, SaveAndRotate)
{
	std::string big;
	while (big.size() < 20000) // more than one chunk
		big += "line " + std::to_string(big.size()) + "\n";
	put("/sys/kernel/debug/sleep_history", big);
	put("/var/log/ws.0", "zero");
	EXPECT_EQ(vorn_save_to_file("/sys/kernel/debug/sleep_history", "/var/log/ws"), 0);
	EXPECT_EQ(test_read_file(real("/var/log/ws")), big + "\n\n");
	EXPECT_EQ(vorn_save_to_file("/var/log/none", "/var/log/ws"), -22);

	vorn_rotate_file("/var/log/ws", 7, 3);
	EXPECT_EQ(access(real("/var/log/ws").c_str(), F_OK), -1);
	EXPECT_EQ(test_read_file(real("/var/log/ws.0")), big + "\n\n");
	EXPECT_EQ(test_read_file(real("/var/log/ws.1")), "zero");

	std::string path = "/var/log/" + std::string(117, 'r'); // path.3 would need 129 bytes
	put(path, "data");
	vorn_rotate_file(path.c_str(), 1, 3);
	EXPECT_EQ(test_read_file(real(path)), "data");
	EXPECT_EQ(jot("> Invalid rotation of"), 1);
}

} // namespace
