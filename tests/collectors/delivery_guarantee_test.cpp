// The situations in which a line of a log is never delivered, one by one;
// docs/delivery-guarantee.md lists them under the same names. Each test loses a line on purpose,
// and shows what prevents it.
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <filesystem>
#include <utility>

#include "model/collector_files.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/xz.h"

using namespace quendel::test;

namespace {

namespace fs = std::filesystem;

constexpr char kLog[] = "/volume1/messages";
const std::string kConf = std::string(kConfFolder) + "/quendel.log.m";

// Everything that was delivered since the start of the test.
std::string& Arrived() {
  static std::string arrived;
  return arrived;
}

void Deliver() {
  EXPECT_EQ(Collect(), 0);
  for (const auto& [name, text] : Delivered()) {
    Arrived() += text;
  }
  Commit();
}

bool HasArrived(const std::string& text) {
  return Arrived().find(text) != std::string::npos;
}

// Whether a text arrives at last, when the log is used and collected for some time.
bool ArrivesLater(const std::string& text) {
  for (int i = 0; i < 4 && !HasArrived(text); ++i) {
    AppendFile(kLog, "later " + std::to_string(i) + "\n");
    Deliver();
  }
  return HasArrived(text);
}

void InstallCollected(const std::string& text) {
  InstallLog("m", kLog);
  WriteFile(kLog, text);
  Deliver();
}

// Writes over the log without making a new file.
void Rewrite(const std::string& text) {
  fs::resize_file(kLog, 0);
  AppendFile(kLog, text);
}

}  // namespace

// What a well rotated log loses is nothing; the tests below depart from it one by one.
TEST(DeliveryGuaranteeTest, EverythingArrivesOfALogThatIsRotatedWell) {
  InstallCollected("one\n");
  for (const std::string line : {"two", "three", "four", "five"}) {
    AppendFile(kLog, line + "\n");
    Rotate(kLog);
    if (line == "three") {
      Deliver();
    }
  }
  for (const char* line : {"one", "two", "three", "four", "five"}) {
    EXPECT_TRUE(ArrivesLater(line)) << line;
  }
}

// ---- Gone before it was collected ----

TEST(DeliveryGuaranteeTest, LinesAreLostThatAreRemovedBetweenTwoRuns) {
  InstallCollected("one\n");
  AppendFile(kLog, "lost\n");
  Rewrite("two\n");
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostThatAreRotatedAwayBetweenTwoRuns) {
  InstallCollected("one\n");
  AppendFile(kLog, "lost\n");
  Rotate(kLog);
  AppendFile(kLog, "two\n");
  Rotate(kLog);
  RemoveFile(ArchiveOf(kLog, 2));  // one archive is kept
  EXPECT_FALSE(ArrivesLater("lost"));
  EXPECT_TRUE(HasArrived("two"));
}

// ---- Not where archives are looked for ----

TEST(DeliveryGuaranteeTest, LinesAreLostInArchivesOfAnotherName) {
  for (const std::string name : {".1.gz", "-20240305.xz", ".1", ".01.xz", ".0.xz"}) {
    RemoveFile(kLog);
    InstallCollected("one\n");
    AppendFile(kLog, "lost in " + name + "\n");
    Rotate(kLog);
    fs::rename(ArchiveOf(kLog, 1), kLog + name);
    EXPECT_FALSE(ArrivesLater("lost in " + name));
    RemoveFile(kLog + name);
  }
}

TEST(DeliveryGuaranteeTest, LinesAreLostWhenCompressionIsDelayed) {
  InstallCollected("one\n");
  AppendFile(kLog, "lost\n");
  Rotate(kLog);
  WriteFile(std::string(kLog) + ".1", *Unxz(ReadFile(ArchiveOf(kLog, 1))));
  RemoveFile(ArchiveOf(kLog, 1));
  EXPECT_FALSE(ArrivesLater("lost"));
  // The next rotation compresses it, under the number 2. There is still no number 1.
  WriteFile(ArchiveOf(kLog, 2), Xz(ReadFile(std::string(kLog) + ".1")));
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostInArchivesBehindAGap) {
  InstallCollected("one\n");
  AppendFile(kLog, "lost\n");
  Rotate(kLog);
  Rotate(kLog);
  RemoveFile(ArchiveOf(kLog, 1));
  EXPECT_FALSE(ArrivesLater("lost"));
  WriteFile(ArchiveOf(kLog, 1), Xz(""));
  EXPECT_TRUE(ArrivesLater("lost")) << "closing the gap helps";
}

TEST(DeliveryGuaranteeTest, LinesAreLostInArchivesOfALogWithALongPath) {
  const std::string folder = "/volume1/" + std::string(200, 'd') + "/";
  const std::string log = folder + std::string(251 - folder.size(), 'l');
  InstallLog("m", log);
  WriteFile(log, "one\n");
  Deliver();
  AppendFile(log, "lost\n");
  Rotate(log);
  AppendFile(log, "two\n");
  Deliver();
  Deliver();
  EXPECT_FALSE(HasArrived("lost"));
  EXPECT_TRUE(HasArrived("two"));
}

// The higher an archive's number, the longer its ending.
TEST(DeliveryGuaranteeTest, LinesAreLostInArchiveTenOfALogWithALongPath) {
  for (const size_t length : {size_t{249}, size_t{250}}) {
    const std::string folder = "/volume1/" + std::string(200, 'd') + "/";
    const std::string log = folder + std::string(length - folder.size(), 'l');
    RemoveFile(folder);
    InstallLog("m", log);
    WriteFile(log, "one\n");
    Deliver();
    const std::string line = "in ten of " + std::to_string(length);
    AppendFile(log, line + "\n");
    for (int i = 0; i < 10; ++i) {
      Rotate(log);
      AppendFile(log, "two " + std::to_string(i) + "\n");
    }
    Deliver();
    Deliver();
    EXPECT_EQ(HasArrived(line), length == 249) << length;
    EXPECT_TRUE(HasArrived("two 0"));
  }
}

// ---- Taken for collected ----

TEST(DeliveryGuaranteeTest, LinesAreLostInAnArchiveThatBearsTheInodeOfAnEarlierOne) {
  ShowInode(ArchiveOf(kLog, 1), 77);
  InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  Rotate(kLog);
  Deliver();
  RemoveFile(ArchiveOf(kLog, 1));
  AppendFile(kLog, "lost\n");
  Rotate(kLog);
  EXPECT_FALSE(ArrivesLater("lost"));
  QUENDELResetLogConf(kConf.c_str());
  EXPECT_TRUE(ArrivesLater("lost")) << "a reset helps while the archive is there";
}

// The record holds 255 bytes of the list.
TEST(DeliveryGuaranteeTest, LinesAreLostInAnArchiveWhoseInodeIsWhereTheListIsCut) {
  InstallCollected("one\n");
  std::string list;
  while (list.size() < 252) {
    list += "7,";
  }
  ASSERT_EQ(list.size(), 252u);
  const std::string text = ReadFile(kConf);
  WriteFile(kConf, text.substr(0, text.find("tar_log_inode")) + "tar_log_inode=" + list +
                       "12345678\n" + text.substr(text.find("last_byte")));
  AppendFile(kLog, "lost\n");
  Rotate(kLog);
  ShowInode(ArchiveOf(kLog, 1), 123);
  EXPECT_FALSE(ArrivesLater("lost"));
}

// ---- Could not be used ----

TEST(DeliveryGuaranteeTest, LinesAreLostInTheOldestNewArchiveWhenItCannotBePrepared) {
  struct {
    const char* call;
    int nth;
  } const failures[] = {{"ARVOFileCopy", 1}, {"ALIBCExec", 1}, {"ALIBCFileStat", 2}};
  for (const auto& failure : failures) {
    const std::string line = std::string("lost at ") + failure.call;
    RemoveFile(kLog);
    RemoveFile(ArchiveOf(kLog, 1));
    InstallCollected("one\n");
    AppendFile(kLog, line + "\n");
    Rotate(kLog);
    ResetCalls();
    On(failure.call).Nth(failure.nth).Return(-1);
    EXPECT_FALSE(ArrivesLater(line));
  }
}

TEST(DeliveryGuaranteeTest, LinesAreLostInAnArchiveThatIsStillBeingWritten) {
  InstallCollected("one\n");
  AppendFile(kLog, "lost\n");
  Rotate(kLog);
  const std::string finished = ReadFile(ArchiveOf(kLog, 1));
  AppendFile(ArchiveOf(kLog, 1), "");
  fs::resize_file(ArchiveOf(kLog, 1), finished.size() / 2);
  Deliver();
  AppendFile(ArchiveOf(kLog, 1), finished.substr(finished.size() / 2));  // the same file
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostInANewerArchiveThatIsStillBeingWritten) {
  InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  Rotate(kLog);
  AppendFile(kLog, "lost\n");
  Rotate(kLog);
  const std::string finished = ReadFile(ArchiveOf(kLog, 1));
  fs::resize_file(ArchiveOf(kLog, 1), finished.size() / 2);
  Deliver();
  AppendFile(ArchiveOf(kLog, 1), finished.substr(finished.size() / 2));
  EXPECT_FALSE(ArrivesLater("lost"));
  EXPECT_TRUE(HasArrived("two"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostInAnArchiveThatIsRenumberedInTheRun) {
  InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  Rotate(kLog);
  AppendFile(kLog, "three\n");
  Deliver();
  AppendFile(kLog, "lost\n");
  Rotate(kLog);
  AppendFile(kLog, "four\n");
  // The inode of the last archive ends the look at them.
  OnceMeasured(ArchiveOf(kLog, 2), [] {
    Rotate(kLog);
    AppendFile(kLog, "five\n");
  });
  Deliver();
  EXPECT_FALSE(ArrivesLater("lost"));
  EXPECT_TRUE(HasArrived("four")) << "it is sent instead";
}

// ---- Taken for a continuation ----

TEST(DeliveryGuaranteeTest, LinesAreLostBeforeALastLineThatRecursAtItsPlace) {
  InstallCollected("one\nsame\n");
  Rewrite("los\nsame\nnew\n");
  Deliver();
  EXPECT_TRUE(HasArrived("new"));
  EXPECT_FALSE(ArrivesLater("los\n"));
  QUENDELResetLogConf(kConf.c_str());
  EXPECT_TRUE(ArrivesLater("los\n")) << "a reset helps while the lines are there";
}

// Of an empty last line, any newline at its place is the same.
TEST(DeliveryGuaranteeTest, LinesAreLostBeforeANewlineAtThePlaceOfAnEmptyLastLine) {
  InstallCollected("one\n\n");
  Rewrite("lost\nnew\n");
  Deliver();
  EXPECT_TRUE(HasArrived("new"));
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostOfALogThatIsRewrittenToItsSizeAndGoesAgain) {
  InstallCollected("one\n");
  Rewrite("los\n");
  Deliver();
  EXPECT_FALSE(HasArrived("los"));
  Rewrite("other\n");
  EXPECT_FALSE(ArrivesLater("los"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostOfANewLogThatBearsTheOldInodeAndSize) {
  InstallCollected("one\n");
  ShowInode(kLog, InodeOf(kLog));
  RemoveFile(kLog);
  WriteFile(kLog, "los\n");
  Deliver();
  Rewrite("other\n");
  EXPECT_FALSE(ArrivesLater("los"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostWhenInodesAgreeInTheirLow32Bits) {
  InstallLog("m", kLog);
  WriteFile(kLog, "one\n");
  ShowInode(kLog, 4294967296 + 77);
  Deliver();
  RemoveFile(kLog);
  WriteFile(kLog, "los\n");
  ShowInode(kLog, 77);
  Deliver();
  Rewrite("other\n");
  EXPECT_FALSE(ArrivesLater("los"));
}

// ---- Overwritten in the run ----

TEST(DeliveryGuaranteeTest, LinesAreLostOfAnArchiveWhenTheLiveLogContinues) {
  InstallCollected("one\n");
  WriteFile(ArchiveOf(kLog, 1), Xz("one\nlost\n"));  // comes from elsewhere; the log goes on
  AppendFile(kLog, "two\n");
  Deliver();
  EXPECT_TRUE(HasArrived("two"));
  EXPECT_FALSE(ArrivesLater("lost"));
}

// The archives were looked for before the rotation, the live log after it.
TEST(DeliveryGuaranteeTest, LinesAreLostOfAnArchiveThatBeginsLikeTheLiveLog) {
  InstallCollected("header\nA\n");
  AppendFile(kLog, "lost\n");
  On("stat").Anywhere().With(kLog).Nth(1).Before([] {
    Rotate(kLog);
    AppendFile(kLog, "header\n");
  });
  Deliver();
  AppendFile(kLog, "two\n");
  Deliver();
  EXPECT_TRUE(HasArrived("two"));
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostOfTwoLogsWithOneName) {
  InstallCollected("one\n");
  const std::string other = InstallLog("n", "/volume1/n");
  WriteFile("/volume1/n", "first of n\n");
  const std::string text = ReadFile(other);
  WriteFile(other, "name=m" + text.substr(text.find('\n')));
  Deliver();
  AppendFile(kLog, "lost\n");
  AppendFile("/volume1/n", "second of n\n");
  Deliver();
  EXPECT_TRUE(HasArrived("second of n"));
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostOfALogWhoseNameIsAnothersScratchFile) {
  InstallCollected("one\n");
  const std::string other = InstallLog("l", "/volume1/l");  // comes before "m"
  const std::string text = ReadFile(other);
  WriteFile(other, "name=m.1" + text.substr(text.find('\n')));
  WriteFile("/volume1/l", "lost\n");
  AppendFile(kLog, "two\n");
  Rotate(kLog);
  Deliver();
  AppendFile("/volume1/l", "kept\n");
  Deliver();
  EXPECT_TRUE(HasArrived("kept"));
  EXPECT_FALSE(ArrivesLater("lost"));
}

// ---- Committed, but not delivered ----

TEST(DeliveryGuaranteeTest, LinesAreLostThatACallerCommitsWithoutDeliveringThem) {
  InstallCollected("one\n");
  AppendFile(kLog, "lost\n");
  EXPECT_EQ(Collect(), 0);
  Commit();  // and the run's folder is thrown away
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostThatACallerCommitsAfterARunThatFailed) {
  InstallCollected("one\n");
  AppendFile(kLog, "lost\n");
  EXPECT_EQ(Collect(), 0);  // not delivered, and not committed
  On("ALIBCSzListAlloc").Nth(1).Return(nullptr);
  EXPECT_EQ(Collect(), -1);
  Commit();  // what is committed is the state of the run before
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostOfASecondRunThatTheFirstOneCommits) {
  InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  EXPECT_EQ(Collect(), 0);
  const std::string ofTheFirst = Delivered()["m"];
  AppendFile(kLog, "lost\n");
  EXPECT_EQ(Collect(), 0);  // the second, which is never delivered
  Arrived() += ofTheFirst;
  Commit();
  EXPECT_TRUE(HasArrived("two"));
  EXPECT_FALSE(ArrivesLater("lost"));
}

// ---- Taken for a continuation, by a part of a line ----

TEST(DeliveryGuaranteeTest, LinesAreLostBeforeALineThatEndsInTheLastLine) {
  InstallCollected("one\ntwo\n");
  Rewrite("los:two\nthree\n");
  EXPECT_FALSE(ArrivesLater("los:two"));
  EXPECT_TRUE(HasArrived("three"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostOfACopyTruncatedLogThatBeginsWithItsFirstLineAgain) {
  InstallCollected("banner\n");
  AppendFile(kLog, "lost\n");
  CopyTruncate(kLog);
  AppendFile(kLog, "banner\nnext\n");
  EXPECT_FALSE(ArrivesLater("lost"));
  EXPECT_TRUE(HasArrived("next"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostOfALogWhosePathDoesNotFit) {
  const std::string folder = "/tmp/" + std::string(200, 'f');
  const std::string log = folder + "/" + std::string(60, 'n');
  fs::create_directories(folder);
  InstallLog("m", log);
  WriteFile(log, "lost\n");
  Deliver();
  EXPECT_FALSE(HasArrived("lost"));
}

// ---- Late, but not lost ----

TEST(DeliveryGuaranteeTest, LinesAreLostOfALateLogThatIsEmptied) {
  InstallCollected("");
  AppendFile(kLog, "lost\n");
  Deliver();
  EXPECT_FALSE(HasArrived("lost"));
  Rewrite("two\n");
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLostOfALateLogWhoseArchiveIsRemoved) {
  InstallCollected("");
  AppendFile(kLog, "lost\n");
  Deliver();
  EXPECT_FALSE(HasArrived("lost"));
  Rotate(kLog);
  RemoveFile(std::string(kLog) + ".1.xz");
  EXPECT_FALSE(ArrivesLater("lost"));
}

TEST(DeliveryGuaranteeTest, LinesAreLateAfterAnInterruptedReset) {
  InstallCollected("one\n");
  On("ALIBCFileSetKeyValue").Nth(5).Return(-1);  // the inode number stays
  EXPECT_EQ(QUENDELResetLogConf(kConf.c_str()), -1);
  ResetCalls();
  EXPECT_FALSE(ArrivesLater("later 3"));
  EXPECT_EQ(QUENDELResetLogConf(kConf.c_str()), 0);
  EXPECT_TRUE(ArrivesLater("later 3"));
}

TEST(DeliveryGuaranteeTest, LinesAreLateOfALogThatWasFirstCollectedEmpty) {
  InstallCollected("");
  EXPECT_FALSE(ArrivesLater("later 3"));
  Rotate(kLog);
  EXPECT_TRUE(ArrivesLater("later 3")) << "they come with the archive";
}

TEST(DeliveryGuaranteeTest, AResetBringsALateLogAtOnce) {
  InstallCollected("unfin");
  AppendFile(kLog, "ished\n");
  EXPECT_FALSE(ArrivesLater("later 3"));
  QUENDELResetLogConf(kConf.c_str());
  EXPECT_TRUE(ArrivesLater("unfinished"));
}

TEST(DeliveryGuaranteeTest, LinesComeAgainAndAgainWhileTheLiveLogIsMissing) {
  InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  Rotate(kLog);
  RemoveFile(kLog);
  Deliver();
  EXPECT_TRUE(HasArrived("two"));
  Arrived().clear();
  Deliver();
  EXPECT_TRUE(HasArrived("two"));
}
