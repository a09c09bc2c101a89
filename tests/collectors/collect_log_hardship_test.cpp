// The log collector on a device in trouble. docs/collection.md lists each of these outcomes.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "model/collector_files.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"
#include "support/xz.h"

using namespace quendel::test;
using testing::Contains;
using testing::ElementsAreArray;
using testing::IsEmpty;
using testing::Key;
using testing::Pair;
using testing::UnorderedElementsAre;

namespace {

namespace fs = std::filesystem;

constexpr char kLog[] = "/volume1/messages";
const std::string kOutput = std::string(kRunFolder) + "/m";
const std::string kConf = std::string(kConfFolder) + "/quendel.log.m";

const std::string kCopyFailed =
    std::string("Failed to copy log '") + kLog + "' to '" + kOutput + "'";
const std::string kWholeFailed = std::string("Failed to collect whole log '") + kLog + "'";
const std::string kDiffFailed = std::string("Failed to collect diff log '") + kLog + "'";
const std::string kMismatch = kDiffFailed + " because of hash not match";
const std::string kOpenFailed = std::string("Failed to open file '") + kLog + "'";
const std::string kLogFailed = "Failed to collect log in conf '" + kConf + "'";

template <typename... Messages>
testing::Matcher<std::vector<LogLine>> LoggedInOrder(const Messages&... messages) {
  return ElementsAreArray(std::vector<testing::Matcher<LogLine>>{
      Logged("quendel_collect_log", std::string(messages))...});
}

void InstallCollected(const std::string& text) {
  InstallLog("m", kLog);
  WriteFile(kLog, text);
  CollectAndCommit();
}

// Collects with what is mounted or made in the run folder left there.
int CollectAsItIs() {
  return QUENDELCollectLog(kRunFolder);
}

// Lets a small file system stand where the run writes.
void FillRunFolder() {
  RemoveFile(kRunFolder);
  fs::create_directories(kRunFolder);
  fs::create_directories("/tmp/quendel");
  ASSERT_EQ(mount("small", kRunFolder, "tmpfs", 0, "size=16k"), 0);
}

void EmptyRunFolder() {
  ASSERT_EQ(umount(kRunFolder), 0);
}

std::string Lines(int count) {
  std::string text;
  for (int i = 0; i < count; ++i) {
    text += "line " + std::to_string(i) + "\n";
  }
  return text;
}

// Runs a step with the rights of nobody, and gives the rights back.
template <typename Step>
void AsNobody(const Step& step) {
  constexpr uid_t kNobody = 65534;
  fs::remove_all(kRunFolder);
  fs::create_directories(kRunFolder);
  fs::create_directories("/tmp/quendel");
  ASSERT_EQ(chown(kRunFolder, kNobody, kNobody), 0);
  ASSERT_EQ(chown("/tmp/quendel", kNobody, kNobody), 0);
  ASSERT_EQ(seteuid(kNobody), 0);
  step();
  ASSERT_EQ(seteuid(0), 0);
  ASSERT_EQ(chown("/tmp/quendel", 0, 0), 0);
}

// The most memory, in KiB, that this process has held at one time.
long PeakMemory() {
  std::ifstream status("/proc/self/status");
  for (std::string word; status >> word;) {
    if (word == "VmHWM:") {
      long kibibytes = 0;
      status >> kibibytes;
      return kibibytes;
    }
  }
  return -1;
}

}  // namespace

// ---- A full disk ----

TEST(CollectLogTest, KeepsTheStateOfALogThatFillsTheDisk) {
  InstallLog("m", kLog);
  const std::string before = ReadFile(kConf);
  WriteFile(kLog, Lines(10000));
  FillRunFolder();
  EXPECT_EQ(CollectAsItIs(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(kCopyFailed, kWholeFailed, kLogFailed));
  EXPECT_FALSE(Exists(kLogUpdateFile));
  EmptyRunFolder();
  EXPECT_EQ(ReadFile(kConf), before);
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], Lines(10000));
}

TEST(CollectLogTest, KeepsTheStateOfALogWhoseNewLinesFillTheDisk) {
  InstallCollected("first\n");
  AppendFile(kLog, Lines(10000));
  FillRunFolder();
  EXPECT_EQ(CollectAsItIs(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(kDiffFailed, kLogFailed));
  EXPECT_FALSE(Exists(kLogUpdateFile));
  EmptyRunFolder();
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], Lines(10000));
}

TEST(CollectLogTest, KeepsTheStateOfALogWhoseSectionFindsNoRoom) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  fs::create_directories("/tmp/quendel");
  ASSERT_EQ(mount("small", "/tmp/quendel", "tmpfs", 0, "nr_inodes=1"), 0);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(),
              LoggedInOrder(std::string("Failed to add new section to '") + kLogUpdateFile + "'"));
  Commit();
  ASSERT_EQ(umount("/tmp/quendel"), 0);
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "second\n");
}

TEST(CollectLogTest, GoesOnToALogThatFindsRoomOnAFullDisk) {
  InstallLog("m", kLog);
  WriteFile(kLog, Lines(10000));
  InstallLog("small", "/volume1/small");
  WriteFile("/volume1/small", "a\n");
  FillRunFolder();
  EXPECT_EQ(CollectAsItIs(), 0);
  EXPECT_EQ(Delivered()["small"], "a\n");
  EmptyRunFolder();
}

// ---- A log that cannot be read ----

TEST(CollectLogTest, FailsALogThatMayNotBeRead) {
  InstallLog("m", kLog);
  WriteFile(kLog, "secret\n");
  ASSERT_EQ(chmod(kLog, 0), 0);
  AsNobody([] {
    EXPECT_EQ(CollectAsItIs(), 0);
    EXPECT_THAT(Log(), LoggedInOrder(kCopyFailed, kWholeFailed, kLogFailed));
  });
}

TEST(CollectLogTest, FailsToContinueALogThatMayNoLongerBeRead) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  ASSERT_EQ(chmod(kLog, 0), 0);
  AsNobody([] {
    EXPECT_EQ(CollectAsItIs(), 0);
    EXPECT_THAT(Log(), LoggedInOrder(kOpenFailed, kDiffFailed, kLogFailed));
  });
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "second\n");
}

TEST(CollectLogTest, KeepsTheStateOfALogOnABadDisk) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  On("pread").Return(-1, EIO);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to read hash line in log '") + kLog + "'",
                                   kDiffFailed, kLogFailed));
  Restore("pread");
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "second\n");
}

// ---- Not a log at all ----

TEST(CollectLogTest, FailsALogThatIsADirectory) {
  InstallLog("m", kLog);
  fs::create_directory(kLog);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(kCopyFailed, kWholeFailed, kLogFailed));
  EXPECT_THAT(Delivered(), IsEmpty());
}

TEST(CollectLogTest, DoesNotWaitForAFifo) {
  InstallLog("m", kLog);
  ASSERT_EQ(mkfifo(kLog, 0600), 0);
  alarm(20);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(kCopyFailed, kWholeFailed, kLogFailed));
}

TEST(CollectLogTest, DoesNotWaitForAFifoThatBearsTheRecordedInode) {
  InstallLog("m", kLog);
  ASSERT_EQ(mkfifo(kLog, 0600), 0);
  struct stat status = {};
  ASSERT_EQ(stat(kLog, &status), 0);
  WriteFile(kConf, std::string("name=m\npath=") + kLog +
                       "\nlast_hash=h\ntar_log_inode=0\nlast_byte=1\ntotal_byte=1\ninode=" +
                       std::to_string(status.st_ino) + "\n");
  alarm(20);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(kOpenFailed, kDiffFailed, kLogFailed));
}

TEST(CollectLogTest, DoesNotWaitForAFifoInThePlaceOfAnArchive) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  ASSERT_EQ(mkfifo(ArchiveOf(kLog, 1).c_str(), 0600), 0);
  alarm(20);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to copy '" + ArchiveOf(kLog, 1) + "' to '" + kOutput +
                                   ".1.xz'"));
  EXPECT_EQ(Delivered()["m"], "second\n");
}

TEST(CollectLogTest, PassesOverADirectoryInThePlaceOfTheOldestNewArchive) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  fs::create_directory(ArchiveOf(kLog, 1));
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to copy '" + ArchiveOf(kLog, 1) + "' to '" + kOutput +
                                   ".1.xz'"));
  EXPECT_EQ(Delivered()["m"], "second\n");
}

TEST(CollectLogTest, FailsALogOfWhichANewerArchiveIsNoFile) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  Rotate(kLog);
  Rotate(kLog);
  const std::string archive = ArchiveOf(kLog, 1);
  for (const bool isFifo : {true, false}) {
    RemoveFile(archive);
    if (isFifo) {
      ASSERT_EQ(mkfifo(archive.c_str(), 0600), 0);
    } else {
      fs::create_directory(archive);
    }
    ClearLog();
    alarm(20);
    EXPECT_EQ(Collect(), 0);
    EXPECT_THAT(Log(), LoggedInOrder("Failed to copy '" + archive + "' to '" + kOutput + ".1.xz'",
                                     "Failed to collect tared log of '" + kConf + "'", kLogFailed));
    EXPECT_FALSE(Exists(kLogUpdateFile));
  }
}

TEST(CollectLogTest, TakesALoopOfLinksForAMissingLog) {
  InstallLog("m", kLog);
  fs::create_symlink("/volume1/other", kLog);
  fs::create_symlink(kLog, "/volume1/other");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), IsEmpty());
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, TakesALinkToNothingForAMissingLog) {
  InstallLog("m", kLog);
  fs::create_symlink("/volume1/nothing", kLog);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), IsEmpty());
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, FollowsALinkToALog) {
  InstallLog("m", kLog);
  WriteFile("/volume1/real", "first\n");
  fs::create_symlink("/volume1/real", kLog);
  CollectAndCommit();
  AppendFile("/volume1/real", "second\n");
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "second\n");
}

TEST(CollectLogTest, IgnoresADirectoryAmongTheConfigurations) {
  fs::create_directory(std::string(kConfFolder) + "/quendel.log.folder");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), IsEmpty());
}

// ---- A log that changes while it is collected ----

TEST(CollectLogTest, RecordsWhatItGotOfALogThatShrinks) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\nthird\n");
  On("sendfile").Nth(1).Before([] { fs::resize_file(kLog, 10); });
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "seco\n");
  EXPECT_EQ(ReadPairs(kConf)["total_byte"], "10");
  // What comes afterwards is not passed over: the log is sent whole.
  AppendFile(kLog, "nd again\n");
  Collect();
  EXPECT_EQ(Delivered()["m"], "first\nsecond again\n");
}

TEST(CollectLogTest, LeavesLinesThatArriveMeanwhileToTheNextRun) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  On("sendfile").Nth(1).Before([] { AppendFile(kLog, "third\n"); });
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "second\n");
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "third\n");
}

// The size that the log had when the run came to it bounds what is copied, not that of the file
// that is then opened.
TEST(CollectLogTest, LeavesLinesThatArriveBeforeTheLogIsOpenedToTheNextRun) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  OnceMeasured(kLog, [] { AppendFile(kLog, "third\n"); });
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "second\n");
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "third\n");
}

TEST(CollectLogTest, LosesNothingOfALogThatIsRotatedWhileItIsCopied) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  On("sendfile").Nth(1).Before([] {
    AppendFile(kLog, "third\n");
    Rotate(kLog);
    AppendFile(kLog, "fourth\n");
  });
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "second\n");
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "third\nfourth\n");
}

// The archives were looked for before the rotation, the live log after it.
TEST(CollectLogTest, LosesNothingOfALogThatIsRotatedBeforeItIsOpened) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  On("stat").Anywhere().With(kLog).Nth(1).Before([] {
    Rotate(kLog);
    AppendFile(kLog, "third\n");
  });
  CollectAndCommit();
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "third\n")));
  // The archive does not continue what was recorded of the new log, so it is sent whole.
  CollectAndCommit();
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m.1.xz", "first\nsecond\n")));
}

// ---- Damaged archives ----

TEST(CollectLogTest, PassesOverTheOldestNewArchiveWhenItIsDamaged) {
  const std::string whole = Xz("first\nsecond\n");
  for (const std::string& bytes :
       {whole.substr(0, whole.size() - 9), std::string("not xz"), std::string(), whole + "tail"}) {
    InstallCollected("first\n");
    WriteFile(ArchiveOf(kLog, 1), bytes);
    AppendFile(kLog, "third\n");
    ClearLog();
    EXPECT_EQ(Collect(), 0);
    EXPECT_THAT(Log(), LoggedInOrder("Failed to untar '" + kOutput + ".1.xz'"));
    EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "third\n")));
    RemoveFile(kLog);
    RemoveFile(ArchiveOf(kLog, 1));
  }
}

TEST(CollectLogTest, SendsADamagedNewerArchiveAsItIs) {
  InstallCollected("first\n");
  AppendFile(kLog, "second\n");
  Rotate(kLog);
  Rotate(kLog);
  WriteFile(ArchiveOf(kLog, 1), "not xz");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(ReadFile(kOutput + ".1.xz"), "not xz");
  EXPECT_THAT(Log(), IsEmpty());
}

// ---- Two collectors of one name ----

TEST(CollectLogTest, PutsTheWholeLogsOfOneNameBehindEachOther) {
  const std::string first = InstallLog("m", kLog);
  WriteFile(std::string(kConfFolder) + "/quendel.log.n",
            "name=m\npath=/volume1/n\nlast_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\n"
            "total_byte=\"\"\ninode=\"\"\n");
  WriteFile(kLog, "of m\n");
  WriteFile("/volume1/n", "of n\n");
  CollectAndCommit();
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "of m\nof n\n")));

  // Only a whole log is added: the new lines of the second take the place of the first's.
  AppendFile(kLog, "more of m\n");
  AppendFile("/volume1/n", "more of n\n");
  CollectAndCommit();
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "more of n\n")));
  EXPECT_EQ(ReadPairs(first)["total_byte"], "15");
}

// ---- Size ----

TEST(CollectLogTest, HoldsNoLineInMemory) {
  InstallCollected("first\n");
  constexpr size_t kLineBytes = 48 << 20;
  {
    std::ofstream out(kLog, std::ios::binary | std::ios::app);
    const std::string block(1 << 20, 'x');
    for (size_t written = 0; written < kLineBytes; written += block.size()) {
      out << block;
    }
    out << "\nlast\n";
  }
  fs::create_directories(kRunFolder);
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    const long before = PeakMemory();
    const bool collected = QUENDELCollectLog(kRunFolder) == 0;
    _exit(collected && before > 0 && PeakMemory() - before < 4096 ? 0 : 1);
  }
  int status = -1;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0) << "failed, or took more than 4 MiB";
  EXPECT_EQ(fs::file_size(kOutput), kLineBytes + 6);
}
