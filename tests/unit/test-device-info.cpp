// Sysfs primitives: result codes and texts against a temporary root.
#include "device_info.h"
#include "fake_jotlog.h"
#include "test_support.h"

#include <cstdlib>
#include <gtest/gtest.h>
#include <unistd.h>

namespace {

class SysfsPrimitives : public ::testing::Test {
protected:
	test_tmpdir dir;
	void SetUp() override
	{
		setenv("QOR_SYSROOT", dir.path.c_str(), 1);
		test_mkdirs(dir.path + "/sys");
		fake_jotlog_clear();
	}
	void TearDown() override { unsetenv("QOR_SYSROOT"); }
	std::string real(const std::string &p) { return dir.path + p; }
};

TEST_F(SysfsPrimitives, WritesGoUnderTheRootWithoutCreatingOrTruncating)
{
	test_write_file(real("/sys/node"), "XXXXXXXX");
	EXPECT_EQ(sys_set_int("/sys/node", -1), 0);
	EXPECT_EQ(test_read_file(real("/sys/node")), "-1XXXXXX"); // one write, no truncation
	EXPECT_EQ(fake_jotlog_count(real("/sys/node") + " -1"), 1);

	EXPECT_EQ(sys_write_buf("/sys/missing", "1"), -1);
	EXPECT_EQ(access(real("/sys/missing").c_str(), F_OK), -1);
	EXPECT_EQ(fake_jotlog_count("sys_write_buf: file:" + real("/sys/missing") + ", No such file or directory."), 1);
	EXPECT_EQ(sys_set_str("/sys/node", nullptr), -1);
	EXPECT_EQ(sys_write_buf("/sys/node", nullptr), -1);
	EXPECT_EQ(sys_set_str("/sys/node", "abc"), 0);
}

TEST_F(SysfsPrimitives, ReadsAndTheirLimits)
{
	char buf[SYS_BUF_SIZE];
	int v = 5;
	test_write_file(real("/sys/int"), "1200000\n");
	EXPECT_EQ(sys_get_int("/sys/int", &v), 0);
	EXPECT_EQ(v, 1200000);
	test_write_file(real("/sys/empty"), "");
	EXPECT_EQ(sys_read_buf("/sys/empty", buf), 0);
	EXPECT_STREQ(buf, "");
	EXPECT_EQ(sys_get_int("/sys/empty", &v), 0);
	EXPECT_EQ(v, 0);
	test_write_file(real("/sys/254"), std::string(254, 'x'));
	EXPECT_EQ(sys_read_buf("/sys/254", buf), 0);
	EXPECT_EQ(strlen(buf), 254u);
	test_write_file(real("/sys/255"), std::string(255, 'x'));
	EXPECT_EQ(sys_read_buf("/sys/255", buf), -5);
	v = 5;
	EXPECT_EQ(sys_get_int("/sys/255", &v), -1);
	EXPECT_EQ(v, -1);
	EXPECT_EQ(sys_read_buf("/sys/none", buf), -2);
	char keep[SYS_BUF_SIZE] = "keep";
	EXPECT_EQ(sys_get_str("/sys/none", keep), -1); // the caller's buffer stays as it was
	EXPECT_STREQ(keep, "keep");
	EXPECT_EQ(sys_read_buf("/sys", buf), -5);        // opens, cannot be read
	EXPECT_EQ(fake_jotlog_count("sys_read_buf: file:"), 2);
}

} // namespace
