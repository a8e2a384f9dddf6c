// Event journal: line format, escaping, numbering and write failures.
#include "devsim_journal.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <gtest/gtest.h>
#include <memory>
#include <sstream>
#include <string>
#include <unistd.h>

namespace {

std::string format(unsigned long seq, std::string_view what, std::string_view text, size_t size = 256)
{
	char out[DEVSIM_JOURNAL_LINE_MAX];
	size_t n = devsim_journal_format(out, size, seq, what, text);
	EXPECT_LT(n, size);
	EXPECT_EQ(out[n], '\0');
	return std::string(out, n);
}

TEST(DevsimJournal, EscapesBackslashAndNewlineOnly)
{
	EXPECT_EQ(format(1, "/sys/power/gpufreq_min_limit", "6"), "1 /sys/power/gpufreq_min_limit 6\n");
	EXPECT_EQ(format(12, "/dev/kmsg", "[thermal] a\\b\n"), "12 /dev/kmsg [thermal] a\\\\b\\n\n");
	EXPECT_EQ(format(3, "/dev/kmsg", "\n\n"), "3 /dev/kmsg \\n\\n\n");
	EXPECT_EQ(format(4, "/dev/kmsg", ""), "4 /dev/kmsg \n");
	EXPECT_EQ(format(5, "dbus", "SetMaxBrightness -1"), "5 dbus SetMaxBrightness -1\n");
	EXPECT_EQ(format(6, "x", std::string_view("a\tb\0c\r", 6)), std::string("6 x a\tb\0c\r\n", 11));
}

TEST(DevsimJournal, LongestTextFitsAndSmallBuffersAreCut)
{
	std::string text(DEVSIM_TEXT_MAX, '\n');
	std::string line = format(4000000000UL, "/sys/devices/system/cpu/cpufreq/pmqos/cpu_freq_up_threshold", text,
				  DEVSIM_JOURNAL_LINE_MAX);
	ASSERT_EQ(line.back(), '\n');
	EXPECT_EQ(line.size(), strlen("4000000000 /sys/devices/system/cpu/cpufreq/pmqos/cpu_freq_up_threshold ") +
				       2 * DEVSIM_TEXT_MAX + 1);
	EXPECT_EQ(format(7, "/dev/kmsg", "\\\\\\\\", 12), "7 /dev/kmsg");
	EXPECT_EQ(format(7, "/dev/kmsg", "abc", 1), "");
}

struct DevsimJournalFile : ::testing::Test {
	std::unique_ptr<devsim_journal> j = std::make_unique<devsim_journal>();
	char path[32] = "/tmp/qt.journal.XXXXXX";
	void SetUp() override
	{
		int fd = mkstemp(path);
		ASSERT_GE(fd, 0);
		close(fd);
	}
	void TearDown() override
	{
		devsim_journal_close(j.get());
		unlink(path);
	}
	std::string content()
	{
		std::ifstream in(path);
		std::stringstream ss;
		ss << in.rdbuf();
		return ss.str();
	}
};

TEST_F(DevsimJournalFile, NumbersEventsFromOneAndTruncatesAnOldJournal)
{
	ASSERT_EQ(devsim_journal_open(j.get(), path), 0);
	devsim_journal_event(j.get(), "/dev/kmsg", "old");
	devsim_journal_close(j.get());
	ASSERT_EQ(devsim_journal_open(j.get(), path), 0);
	devsim_journal_event(j.get(), "/sys/power/gpufreq_max_limit", "256000");
	devsim_journal_event(j.get(), "dbus", "SetAutoToneForce 1");
	EXPECT_EQ(content(), "1 /sys/power/gpufreq_max_limit 256000\n2 dbus SetAutoToneForce 1\n");
}

TEST(DevsimJournal, NoFileMeansNoJournal)
{
	auto j = std::make_unique<devsim_journal>();
	EXPECT_EQ(devsim_journal_open(j.get(), nullptr), 0);
	devsim_journal_event(j.get(), "/dev/kmsg", "x");
	EXPECT_EQ(devsim_journal_open(j.get(), "/nonexistent/dir/journal"), -ENOENT);
}

} // namespace
