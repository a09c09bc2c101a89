// The key of the current remote session.
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "util";
constexpr char kTool[] = "/usr/arvo/sbin/arvocloudserviceauth";

}  // namespace

TEST(GetRemoteSessionKeyTest, AsksTheAuthenticationTool) {
  InstallTool(kTool, "printf 'key-1'");
  Record("ALIBCPopen");
  char key[32] = {};
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, sizeof key - 1), 0);
  EXPECT_STREQ(key, "key-1");
  EXPECT_THAT(Recorded(), ElementsAre(std::string(kTool) + "|-a|get|-f"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(GetRemoteSessionKeyTest, GivesTheBytesAsTheyCome) {
  InstallTool(kTool, R"(printf ' k\000\377\n\n')");
  char key[8];
  std::fill(std::begin(key), std::end(key), '#');
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, sizeof key), 0);
  EXPECT_EQ(std::string(key, sizeof key), std::string(" k\0\377\n\n##", 8));  // no NUL is added
}

TEST(GetRemoteSessionKeyTest, CutsALongerKeyAtTheSize) {
  InstallTool(kTool, "printf 'abcdefgh'");
  char key[8];
  std::fill(std::begin(key), std::end(key), '#');
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, 4), 0);
  EXPECT_EQ(std::string(key, sizeof key), "abcd####");
}

TEST(GetRemoteSessionKeyTest, WaitsForAToolThatWritesInPieces) {
  InstallTool(kTool, "printf 'ab'; /bin/sleep 0.1; printf 'cd'");
  char key[8] = {};
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, sizeof key - 1), 0);
  EXPECT_STREQ(key, "abcd");
}

TEST(GetRemoteSessionKeyTest, DoesNotLookAtTheExitStatus) {
  InstallTool(kTool, "printf 'key'; exit 9");
  char key[8] = {};
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, sizeof key - 1), 0);
  EXPECT_STREQ(key, "key");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(GetRemoteSessionKeyTest, FailsWithoutTheTool) {
  On("ALIBCPopen").Nth(1).Return(nullptr, EACCES);
  char key[8] = {};
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, sizeof key - 1), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "ALIBCPopen failed(Permission denied)\n")));
  EXPECT_EQ(Calls("ALIBCPclose"), 0);
}

TEST(GetRemoteSessionKeyTest, FailsWhenTheToolPrintsNothing) {
  InstallTool(kTool, "exit 0");
  char key[8] = "before";
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, sizeof key - 1), -1);
  EXPECT_STREQ(key, "before");
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to read relay status (before)\n")));
  EXPECT_EQ(Calls("ALIBCPclose"), 1);
}

TEST(GetRemoteSessionKeyTest, LogsNoMoreOfTheBufferThanItHolds) {
  InstallTool(kTool, "exit 0");
  char key[8];
  std::fill(std::begin(key), std::end(key), '#');
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, 4), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to read relay status (####)\n")));
}

TEST(GetRemoteSessionKeyTest, ReadsNothingIntoABufferWithoutRoom) {
  InstallTool(kTool, "printf 'key'");
  char key[4] = {'#', '#', '#', '#'};
  for (const int size : {0, -1}) {
    ClearLog();
    EXPECT_EQ(QUENDELGetRemoteSessionKey(key, size), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to read relay status ()\n")));
  }
  EXPECT_EQ(std::string(key, sizeof key), "####");
}

TEST(GetRemoteSessionKeyTest, ClosesTheToolInEveryCase) {
  InstallTool(kTool, "printf 'key'");
  char key[8] = {};
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, sizeof key - 1), 0);
  EXPECT_EQ(Calls("ALIBCPclose"), 1);
}
