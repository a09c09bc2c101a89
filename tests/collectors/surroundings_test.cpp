// What the collectors' surroundings must not cost: files that cannot be examined are there as far
// as anybody knows, so nothing may be overwritten, passed over or forgotten because of it; and a
// caller may ignore its children.
#include <gmock/gmock.h>

#include <cerrno>
#include <csignal>
#include <string>

#include "model/collector_files.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsSupersetOf;

namespace {

constexpr char kLog[] = "/volume1/logs/messages";
constexpr char kLogUnit[] = "quendel_collect_log";

void Deliver(std::string& arrived) {
  EXPECT_EQ(Collect(), 0);
  for (const auto& [name, text] : Delivered()) {
    arrived += text;
  }
  Commit();
}

// A log that was delivered and rotated: the next run takes "two" out of the archive and puts
// "three", the whole live log, behind it.
std::string InstallRotated() {
  RemoveFile(kConfFolder);
  RemoveFile("/volume1/logs");
  const std::string conf = InstallLog("m", kLog);
  WriteFile(kLog, "one\n");
  EXPECT_EQ(Collect(), 0);
  Commit();
  AppendFile(kLog, "two\n");
  Rotate(kLog);
  AppendFile(kLog, "three\n");
  return conf;
}

// What arrives when the nth look of a run gets this answer for an error, and a good run follows.
std::string ArrivedInSpiteOf(int nth, int answer) {
  InstallRotated();
  ResetCalls();
  On("ALIBCFileExist").Nth(nth).Return(answer, EIO);
  std::string arrived;
  Deliver(arrived);
  ResetCalls();
  AppendFile(kLog, "four\n");
  Deliver(arrived);
  return arrived;
}

int LooksInARun() {
  InstallRotated();
  ResetCalls();
  Collect();
  return Calls("ALIBCFileExist");
}

}  // namespace

TEST(CollectLogTest, LosesNoLineWhicheverFileCannotBeExamined) {
  const int looks = LooksInARun();
  ASSERT_GE(looks, 6);
  for (int nth = 1; nth <= looks; ++nth) {
    const std::string arrived = ArrivedInSpiteOf(nth, -1);
    for (const char* line : {"two\n", "three\n", "four\n"}) {
      EXPECT_THAT(arrived, HasSubstr(line)) << "look " << nth;
    }
  }
}

TEST(CollectLogTest, LosesNoLineOnAPlatformThatTakesAnErrorForAbsence) {
  const int looks = LooksInARun();
  for (int nth = 1; nth <= looks; ++nth) {
    const std::string arrived = ArrivedInSpiteOf(nth, 0);
    for (const char* line : {"two\n", "three\n", "four\n"}) {
      EXPECT_THAT(arrived, HasSubstr(line)) << "look " << nth;
    }
  }
}

TEST(CollectLogTest, FailsALogWithAFileThatCannotBeExamined) {
  const std::string conf = InstallRotated();
  ClearLog();
  On("ALIBCFileExist").Return(-1, EIO);
  On("ALIBCFileStat").Nth(1).Return(-1, EIO);
  EXPECT_EQ(QUENDELCollectLog(kRunFolder), 0);
  EXPECT_THAT(
      Log(),
      IsSupersetOf(
          {Logged(kLogUnit, "Failed to stat file '" + ArchiveOf(kLog, 1) + "'"),
           Logged(kLogUnit, "Failed to get the inode of tared logs of '/volume1/logs/messages'"),
           Logged(kLogUnit, "Failed to collect tared log of '" + conf + "'"),
           Logged(kLogUnit, "Failed to collect log in conf '" + conf + "'")}));
}

TEST(CollectLogTest, TakesTheLinesOfAnArchiveWhileItsCallerIgnoresItsChildren) {
  InstallRotated();
  signal(SIGCHLD, SIG_IGN);
  std::string arrived;
  Deliver(arrived);
  EXPECT_EQ(arrived, "two\nthree\n");
  EXPECT_EQ(signal(SIGCHLD, SIG_DFL), SIG_IGN);
}

TEST(ResetLogConfTest, FailsForAFileThatCannotBeExamined) {
  const std::string conf = InstallRotated();
  const std::string before = ReadFile(conf);
  On("ALIBCFileExist").Nth(1).Return(-1, EIO);
  On("ALIBCFileSetKeyValue").Nth(1).Return(-1, EIO);
  EXPECT_EQ(QUENDELResetLogConf(conf.c_str()), -1);
  On("ALIBCFileExist").Nth(1).Return(-1, EIO);
  EXPECT_EQ(QUENDELResetLogConf(conf.c_str()), 0);
  EXPECT_NE(ReadFile(conf), before);
}

TEST(ResetUDCConfTest, FailsForAFileThatCannotBeExamined) {
  constexpr char kConf[] = "/usr/arvo/etc/quendel/quendel.udc.a";
  WriteFile(kConf, "last_hash=h\n");
  On("ALIBCFileExist").Nth(1).Return(-1, EIO);
  On("ALIBCFileSetKeyValue").Nth(1).Return(-1, EIO);
  EXPECT_EQ(QUENDELResetUDCConf(kConf), -1);
  On("ALIBCFileExist").Nth(1).Return(-1, EIO);
  EXPECT_EQ(QUENDELResetUDCConf(kConf), 0);
  EXPECT_EQ(ReadFile(kConf), "last_hash=\"\"\n");
}

TEST(UpdateCollectConfTest, CommitsAFileThatCannotBeExamined) {
  const std::string conf = InstallRotated();
  EXPECT_EQ(Collect(), 0);
  On("ALIBCFileExist").Nth(1).Return(-1, EIO);
  EXPECT_EQ(QUENDELUpdateCollectConf(kLogUpdateFile), 0);
  EXPECT_EQ(ReadPairs(conf)["total_byte"], "6");
  On("ALIBCFileExist").Nth(1).Return(-1, EIO);
  On("ALIBCFileEnumSection").Nth(1).Return(-1, EIO);
  EXPECT_EQ(QUENDELUpdateCollectConf(kLogUpdateFile), -1);
}
