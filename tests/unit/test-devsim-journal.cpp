// Event journal lines: only backslash and newline escaped, and never beyond the buffer.
#include "devsim_journal.h"

#include <cstring>
#include <gtest/gtest.h>
#include <string>

namespace {

std::string format(unsigned long seq, std::string_view what, std::string_view text, size_t size = 256)
{
	char out[DEVSIM_JOURNAL_LINE_MAX];
	size_t n = devsim_journal_format(out, size, seq, what, text);
	EXPECT_LT(n, size);
	EXPECT_EQ(out[n], '\0');
	return std::string(out, n);
}

TEST(DevsimJournal, EscapesBackslashAndNewlineOnlyAndCutsToTheBuffer)
{
	EXPECT_EQ(format(4, "/dev/kmsg", ""), "4 /dev/kmsg \n");
	EXPECT_EQ(format(6, "x", std::string_view("a\tb\0c\r\\\n", 8)), std::string("6 x a\tb\0c\r\\\\\\n\n", 15));
	// The longest node text, every byte escaped, fits the journal's line.
	std::string what = "/sys/devices/system/cpu/cpufreq/pmqos/cpu_freq_up_threshold";
	std::string line = format(4000000000UL, what, std::string(DEVSIM_TEXT_MAX, '\n'), DEVSIM_JOURNAL_LINE_MAX);
	EXPECT_EQ(line.size(), strlen("4000000000  ") + what.size() + 2 * DEVSIM_TEXT_MAX + 1);
	EXPECT_EQ(line.back(), '\n');
	EXPECT_EQ(format(7, "/dev/kmsg", "\\\\\\\\", 12), "7 /dev/kmsg");
	EXPECT_EQ(format(7, "/dev/kmsg", "abc", 1), "");
}

} // namespace
