// Tuning files: the lexer, section dispatch, table parsing, and the start-up load that keeps the
// built-in tables when a file is refused.
#include "test-vorn-root.h"
#include "vorn_device.h"
#include "vorn_tuning.h"

#include <cstdlib>
#include <cstring>

namespace {

class VornTuning : public VornTest {
protected:
	void TearDown() override
	{
		unsetenv(VORN_TUNING_ENV);
		VornTest::TearDown();
	}
	static int parse(std::string text, vorn_tuning_report *report = nullptr)
	{
		text.push_back('\0');
		return vorn_tuning_parse_text(text.data(), static_cast<int>(text.size()) - 1, report);
	}
	static int *ap() { return vorn_sensor_at(0)->temp_table; }
	static const vorn_limit &lim(int mode, int level) { return vorn_get_info()->modes[mode].limit[level]; }
	static int mode(const char *name) { return vorn_get_mode_by_name(vorn_get_info()->mode_name_map, name); }
};

TEST_F(VornTuning, ValueTokens)
{
	struct {
		const char *text;
		int ret, value;
		char next; // character under the cursor afterwards
	} cases[] = {
		{"-5 x", 0, -2, 'x'}, {"- x", 0, -2, 'x'},	{"/abc 7", 0, -1, '7'},	     {"/", 0, -1, '\0'},
		{"12ab\t3", 0, 12, '3'}, {"abc", 0, 0, '\0'},	{"99999999999", 0, INT_MAX, '\0'}, {"  \n1", 0, 42, '\n'},
	};
	for (auto &c : cases) {
		std::string s = c.text;
		char *cur = s.data();
		int v = 42;
		EXPECT_EQ(vorn_parse_value(&cur, &v), c.ret) << c.text;
		EXPECT_EQ(v, c.value) << c.text;
		EXPECT_EQ(*cur, c.next) << c.text;
	}
	char *null = nullptr;
	int v;
	EXPECT_EQ(vorn_parse_value(&null, &v), -22);
	std::string s = "a # b [x]\n#\nc";
	vorn_strip_comment(s.data());
	EXPECT_EQ(s, "a        \n \nc");
}

TEST_F(VornTuning, SectionsAndTables)
{
	int heavy = mode("HeavyLoad");
	ASSERT_GT(heavy, 0);
	// Sensor names in any case; levels not named become 0; the last row of a level wins; the sixth
	// line is ignored; short rows leave zeros; comments anywhere.
	EXPECT_EQ(parse("[AP] # c\n0 50\n1 55\n1 56\n2 60\n3 70\n4 99\n[HeavyLoad]\n2 1000000 2 320\n"
			"[batt]\n"),
		  0);
	EXPECT_EQ(std::vector<int>(ap(), ap() + 5), (std::vector<int>{50, 56, 60, 70, 0}));
	EXPECT_EQ(std::vector<int>(vorn_sensor_at(1)->temp_table, vorn_sensor_at(1)->temp_table + 5),
		  (std::vector<int>(5, 0)));
	EXPECT_EQ(lim(heavy, 2).cpu_freq, 1000000);
	EXPECT_EQ(lim(heavy, 2).gpu, 320);
	EXPECT_EQ(lim(heavy, 2).brightness, 0);
	EXPECT_EQ(lim(heavy, 0).cpu_freq, 0);
	// "default..." renames mode 0.
	EXPECT_EQ(parse("[defaultX]\n0 / - 1 2 3 4 5\n"), 0);
	EXPECT_STREQ(vorn_get_info()->modes[0].name, "defaultX");
	EXPECT_EQ(lim(0, 0).cpu_freq, -1);
	EXPECT_EQ(lim(0, 0).cpu_enable, -2);
	EXPECT_EQ(lim(0, 0).dynamic_fps, 5);
}

TEST_F(VornTuning, RefusedInput)
{
	vorn_tuning_report r;
	struct {
		const char *text;
		int ret;
		int line; // of the first problem, 0 for none
		const char *log;
	} cases[] = {
		{"[browser]\n0 1\n", -22, 1, "Failed to find mode by name(browser): -1"},
		{"\n[ap\n0 1\n", -22, 2, "Not found end of section']'"},
		{"junk\n[ap]\n0 1\n", -22, 1, "conf parsing error1: -22"},
		{"[ap]\n7 1\n[HeavyLoad]\n0 1\n", 0, 2, "temp table parsing error"},
		{"[cpu0]\n0 1\n", 0, 1, "temp table parsing error"},
		{"[HeavyLoad]\n0 1\n- 1\n", -22, 3, "limit table parsing error"},
	};
	for (auto &c : cases) {
		fake_jotlog_clear();
		EXPECT_EQ(parse(c.text, &r), c.ret) << c.text;
		EXPECT_EQ(r.count > 0 ? r.problems[0].line : 0, c.line) << c.text;
		EXPECT_EQ(jot(c.log), 1) << c.text;
	}
	// A refused temperature table changes nothing; the next section still applies.
	EXPECT_EQ(ap()[0], 60);
	EXPECT_EQ(lim(mode("HeavyLoad"), 0).cpu_freq, 1);
}

TEST_F(VornTuning, StartUpLoadIsWholeOrNothing)
{
	std::string good = dir.path + "/good.conf", bad = dir.path + "/bad.conf", big = dir.path + "/big.conf";
	test_write_file(good, "[ap]\n0 40\n1 45\n2 50\n3 55\n4 65\n");
	test_write_file(bad, "[ap]\n0 40\n[HeavyLoad]\n0 1\n[nope]\n");
	test_write_file(big, "[ap]\n0 41\n" + std::string(6000, ' ') + "[ap]\n0 1\n");
	int heavy = mode("HeavyLoad");
	vorn_limit before = lim(heavy, 0);

	setenv(VORN_TUNING_ENV, bad.c_str(), 1);
	EXPECT_EQ(vorn_init_device_info(vorn_get_info()), 0);
	EXPECT_EQ(ap()[0], 60);
	EXPECT_EQ(memcmp(&lim(heavy, 0), &before, sizeof before), 0);
	EXPECT_EQ(jot("refused (-22) at line 5"), 1);

	setenv(VORN_TUNING_ENV, (dir.path + "/missing").c_str(), 1);
	EXPECT_EQ(vorn_init_device_info(vorn_get_info()), 0);
	EXPECT_EQ(jot("refused (-2): cannot open"), 1);

	vorn_tuning_report r;
	EXPECT_EQ(vorn_tuning_load(big.c_str(), &r), 0);
	ASSERT_EQ(r.count, 1);
	EXPECT_NE(std::string(r.problems[0].message).find("cut at 5118"), std::string::npos);
	EXPECT_EQ(ap()[0], 41);

	// Tuned thresholds are installed before the offsets, so a re-init starts from the file again.
	setenv(VORN_TUNING_ENV, good.c_str(), 1);
	for (int i = 0; i < 2; i++) {
		EXPECT_EQ(vorn_init_device_info(vorn_get_info()), 0);
		int expect = vorn_get_info()->board_rev > VORN_OLD_HW_REV ? 40 : 40 + VORN_OLD_HW_OFFSET;
		EXPECT_EQ(ap()[0], expect);
	}
}

} // namespace
