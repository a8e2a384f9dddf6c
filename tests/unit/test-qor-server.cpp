// Scenario message grammar: token cutting and request building.
#include "qor_main.h"
#include "qor_server.h"

#include <gtest/gtest.h>
#include <string>

namespace {

TEST(CutToken, WorkedExamplesAndNastyInputs)
{
	struct {
		const char *src;
		const char *token;
		bool want_number;
		int ret;
		const char *dst;
		int number;
	} cases[] = {
		{"AppLaunch[START][PID]1234", "[START]", false, 0, "AppLaunch[PID]1234", 0},
		{"AppLaunch[PID]1234", "[PID]", true, 0, "AppLaunch", 1234},
		{"AppLaunch[PID]99[START]", "[START]", false, 0, "AppLaunch[PID]99", 0},
		{"AppLaunch[PID]", "[PID]", true, 0, "AppLaunch", -1},
		{"AppLaunch[PID]12x[END]", "[PID]", true, 0, "AppLaunch[END]", 12},
		{"AppLaunch[PID]-7", "[PID]", true, 0, "AppLaunch", -7},
		{"AppLaunch[PID]abc", "[PID]", true, 0, "AppLaunch", 0},
		{"[PID]5", "[PID]", true, 0, "", 5},
		{"AppLaunch", "[PID]", true, -1, "unchanged", 0},
		{"AppLaunch", "", true, -2, "unchanged", 0},
		{"", "[PID]", true, -1, "unchanged", 0},
		{"A[PID]99999999999999", "[PID]", true, 0, "A", 2147483647},
		{"x]y", "]", false, 0, "x", 0},
	};
	for (const auto &c : cases) {
		SCOPED_TRACE(std::string(c.src) + " / " + c.token);
		char dst[QOR_NAME_SIZE] = "unchanged";
		int number = 0;
		EXPECT_EQ(QOR_cut_token(dst, c.src, c.token, c.want_number ? &number : nullptr), c.ret);
		EXPECT_STREQ(dst, c.dst);
		EXPECT_EQ(number, c.number);
	}
}

TEST(CutToken, NeverOverrunsTheDestination)
{
	std::string src(63, 'a');
	src.replace(1, 7, "[START]");
	char dst[QOR_NAME_SIZE + 8];
	memset(dst, '#', sizeof dst);
	EXPECT_EQ(QOR_cut_token(dst, src.c_str(), "[START]", nullptr), 0);
	EXPECT_EQ(strlen(dst), 1u);
	EXPECT_EQ(dst[QOR_NAME_SIZE], '#');

	// Source longer than a request buffer (not reachable from the socket, but the cut stays bounded).
	std::string big = "N[START][" + std::string(300, 'b');
	memset(dst, '#', sizeof dst);
	EXPECT_EQ(QOR_cut_token(dst, big.c_str(), "[START]", nullptr), 0);
	EXPECT_EQ(strlen(dst), 63u);
	EXPECT_EQ(dst[QOR_NAME_SIZE], '#');
}

TEST(BuildRequest, StartEndAndPassThrough)
{
	struct {
		const char *received;
		int ret;
		const char *request;
	} cases[] = {
		{"AppLaunch[START][PID]1234", 0, "AppLaunchLock[PID]1234"},
		{"AppLaunch[END][PID]1234", 0, "AppLaunchUnlock"},
		{"AppLaunch[PID]99[START]", 0, "AppLaunchLock[PID]99"},
		{"AppLaunch[START][PID]", 0, "AppLaunchLock[PID]-1"},
		{"AppLaunch[START][END][PID]5", 0, "AppLaunch[END]Lock[PID]5"}, // a start; [END] stays in the name
		{"AppLaunchLock[PID]1234", 0, "AppLaunchLock[PID]1234"},
		{"AppLaunch[START]", -1, ""},
		{"AppLaunch[END]", -1, ""},
	};
	for (const auto &c : cases) {
		SCOPED_TRACE(c.received);
		char cut1[QOR_NAME_SIZE], cut2[QOR_NAME_SIZE], request[QOR_NAME_SIZE] = "";
		EXPECT_EQ(qor_build_request(c.received, cut1, cut2, request), c.ret);
		EXPECT_STREQ(request, c.request);
	}
}

TEST(BuildRequest, RequestIsCutTo63Characters)
{
	// A 55-character name plus "Lock[PID]" and a pid runs past 63.
	std::string received = std::string(55, 'N') + "[START][PID]123456";
	char cut1[QOR_NAME_SIZE], cut2[QOR_NAME_SIZE], request[QOR_NAME_SIZE];
	ASSERT_EQ(qor_build_request(received.c_str(), cut1, cut2, request), 0);
	EXPECT_EQ(std::string(request), (std::string(55, 'N') + "Lock[PID]123456").substr(0, 63));
}

} // namespace
