// The log collector: what it delivers and stages, and what it does when a step fails.
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "model/collector_files.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/log.h"
#include "support/xz.h"

using namespace quendel::test;
using testing::Contains;
using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;
using testing::Key;
using testing::Not;
using testing::Pair;
using testing::StartsWith;
using testing::UnorderedElementsAre;

namespace {

namespace fs = std::filesystem;

constexpr char kLog[] = "/volume1/messages";
const std::string kOutput = std::string(kRunFolder) + "/m";
constexpr char kEmptyMd5[] = "d41d8cd98f00b204e9800998ecf8427e";

std::string Inode(const std::string& path) {
  return std::to_string(InodeOf(path));
}

// The log collector "m" of kLog.
std::string Install() {
  return InstallLog("m", kLog);
}

// A log of these lines that was collected and committed; nothing has happened to it since.
std::string InstallCollected(const std::string& text) {
  const std::string conf = Install();
  WriteFile(kLog, text);
  CollectAndCommit();
  return conf;
}

// As above, and afterwards the log gains lines and is rotated, as often as there are texts. The
// last text stays in the live log.
std::string InstallRotated(const std::string& first, const std::vector<std::string>& gained) {
  const std::string conf = InstallCollected(first);
  for (size_t i = 0; i < gained.size(); ++i) {
    if (i > 0) {
      Rotate(kLog);
    }
    AppendFile(kLog, gained[i]);
  }
  return conf;
}

// Matches what the collector has logged, message by message.
template <typename... Messages>
testing::Matcher<std::vector<LogLine>> LoggedInOrder(const Messages&... messages) {
  return ElementsAreArray(std::vector<testing::Matcher<LogLine>>{
      Logged("quendel_collect_log", std::string(messages))...});
}

std::string FailedIn(const std::string& conf) {
  return "Failed to collect log in conf '" + conf + "'";
}

std::string FailedTared(const std::string& conf) {
  return "Failed to collect tared log of '" + conf + "'";
}

std::string Quoted(const std::string& text) {
  return "'" + text + "'";
}

std::string FailedPair(const std::string& key, const std::string& value, const std::string& conf) {
  return "Failed to set key-value pair (" + key + ", " + value + ") of conf " + Quoted(conf);
}

const std::string kAddFailed = std::string("Failed to add new section to '") + kLogUpdateFile + "'";

Pairs StagedOf(const std::string& conf) {
  const Sections staged = ReadStaged();
  EXPECT_THAT(staged, ElementsAre(Key(conf)));
  return staged.empty() ? Pairs() : staged.front().second;
}

Pairs LineState(const std::string& line, size_t total) {
  return {{"last_hash", Md5Of(line)},
          {"last_byte", std::to_string(line.size())},
          {"total_byte", std::to_string(total)}};
}

Pairs With(Pairs pairs, const std::string& key, const std::string& value) {
  pairs[key] = value;
  return pairs;
}

// Its last bytes are lost.
int CloseWithLoss(int file) {
  close(file);
  errno = EIO;
  return -1;
}

bool ThereIsASnapshot() {
  return Exists(kOutput + ".tmp") && !fs::is_empty(kOutput + ".tmp");
}

// Collects, which must fail to copy the log's new lines and must not count them as collected.
void ExpectFailedDiff(const std::string& conf) {
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to collect diff log '") + kLog + "'",
                                   FailedIn(conf)));
  EXPECT_FALSE(Exists(kLogUpdateFile));
}

}  // namespace

// ---- The run ----

TEST(CollectLogTest, NeedsTheConfigurationDirectory) {
  RemoveFile(kConfFolder);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Dir '/usr/arvo/etc/quendel' dose not exist"));
}

TEST(CollectLogTest, GoesOnWhenTheDirectoryCannotBeTold) {
  Install();
  WriteFile(kLog, "a\n");
  On("ALIBCFileCheckDir").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "a\n")));
}

TEST(CollectLogTest, FailsWithoutMemoryForTheNames) {
  On("ALIBCSzListAlloc").Nth(1).Return(nullptr);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to allocate memory for list"));
}

TEST(CollectLogTest, FailsWhenTheConfigurationsCannotBeListed) {
  Install();
  WriteFile(kLogUpdateFile, "[/x]\nlast_hash=old\n");
  On("ALIBCFileEnumDir").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to enum dir '/usr/arvo/etc/quendel'"));
  EXPECT_FALSE(Exists(kLogUpdateFile)) << "what an earlier run staged goes first";
}

TEST(CollectLogTest, DoesNothingWithoutACollector) {
  WriteFile(std::string(kConfFolder) + "/quendel.udc.raid", "name=raid\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), IsEmpty());
  EXPECT_FALSE(Exists(kLogUpdateFile));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, AsksForItsContainersInTheirSizes) {
  Install();
  WriteFile(kLog, "a\n");
  for (const char* call : {"ALIBCSzListAlloc", "ALIBCSzHashAlloc", "ALIBCFileEnumDir"}) {
    Record(call);
  }
  Collect();
  EXPECT_THAT(Recorded(),
              ElementsAre("512", "/usr/arvo/etc/quendel|quendel.log.|130", "256", "512", "512"));
}

TEST(CollectLogTest, RemovesWhatAnEarlierRunStaged) {
  InstallCollected("a\n");
  WriteFile(kLogUpdateFile, "[/x]\nlast_hash=old\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_FALSE(Exists(kLogUpdateFile));
}

TEST(CollectLogTest, GoesOnWhenWhatWasStagedCannotBeRemoved) {
  Install();
  WriteFile(kLog, "a\n");
  WriteFile(kLogUpdateFile, "");
  On("remove").With(kLogUpdateFile).Return(-1, EPERM);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to remove ") + kLogUpdateFile +
                                   " [errno=" + std::to_string(EPERM) + "]"));
  EXPECT_THAT(Delivered(), Contains(Key("m")));
}

TEST(CollectLogTest, GoesOnToTheNextLogAfterAFailure) {
  const std::string incomplete = InstallLog("a", "/volume1/a");
  WriteFile(incomplete, "name=a\n");
  InstallLog("b", kLog);
  WriteFile(kLog, "line\n");
  EXPECT_EQ(Collect(), 0);
  ASSERT_EQ(Log().size(), 3u);
  EXPECT_THAT(Log()[0],
              Logged("quendel_get_log_conf", StartsWith("Failed to find log path in conf '")));
  EXPECT_THAT(Log()[1],
              Logged("quendel_collect_log", "Failed to get config of " + Quoted(incomplete)));
  EXPECT_THAT(Log()[2], Logged("quendel_collect_log", FailedIn(incomplete)));
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("b", "line\n")));
  EXPECT_THAT(ReadStaged(), ElementsAre(Key(std::string(kConfFolder) + "/quendel.log.b")));
}

TEST(CollectLogTest, FailsALogWithoutMemoryForItsRecord) {
  const std::string conf = Install();
  On("calloc").Nth(1).Return(nullptr);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to allocate memory for pLogConf", FailedIn(conf)));
}

TEST(CollectLogTest, FailsALogWithoutMemoryForItsState) {
  const std::string conf = Install();
  On("ALIBCSzHashAlloc").Nth(1).Return(nullptr);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to allocate memory for log hash", FailedIn(conf)));
}

TEST(CollectLogTest, LeavesTheConfigurationFilesAlone) {
  const std::string conf = InstallRotated("a\n", {"b\n", "c\n"});
  const std::string before = ReadFile(conf);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(ReadFile(conf), before);
}

TEST(CollectLogTest, CountsAReplacedLogAsFailedWhenItsStateCannotBeStaged) {
  for (const long answer : {0L, -1L}) {
    ClearLog();
    const std::string conf = Install();
    WriteFile(kLog, "a\n");
    On("ALIBCFileAddSection").Nth(1).Return(answer);
    EXPECT_EQ(Collect(), 0);
    EXPECT_THAT(Log(), LoggedInOrder(kAddFailed, FailedIn(conf)));
  }
}

TEST(CollectLogTest, CountsAContinuedLogAsCollectedWhenItsStateCannotBeStaged) {
  InstallCollected("a\n");
  AppendFile(kLog, "b\n");
  On("ALIBCFileAddSection").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(kAddFailed));
}

TEST(CollectLogTest, CountsARewrittenLogAsCollectedWhenItsStateCannotBeStaged) {
  InstallCollected("a\n");
  AppendFile(kLog, "b\n");
  fs::resize_file(kLog, 0);
  AppendFile(kLog, "c\n123\n");
  On("ALIBCFileAddSection").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to collect diff log '") + kLog +
                                       "' because of hash not match",
                                   kAddFailed));
}

// ---- The live log ----

TEST(CollectLogTest, SendsAnUnknownLogWhole) {
  const std::string conf = Install();
  WriteFile(kLog, "one\ntwo\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "one\ntwo\n")));
  EXPECT_EQ(StagedOf(conf), With(LineState("two", 8), "inode", Inode(kLog)));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, SendsNothingOfALogThatHasNotGrown) {
  InstallCollected("one\ntwo\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), IsEmpty());
  EXPECT_FALSE(Exists(kLogUpdateFile));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, SendsOnlyTheNewLines) {
  const std::string conf = InstallCollected("one\ntwo\n");
  AppendFile(kLog, "three\n\nfour\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "three\n\nfour\n")));
  EXPECT_EQ(StagedOf(conf), LineState("four", 20));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, GoesOnFromWhatWasCommitted) {
  InstallCollected("one\n");
  for (const std::string line : {"two\n", "\n", "three\n", "\n\n", "four\n"}) {
    AppendFile(kLog, line);
    CollectAndCommit();
    EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", line)));
  }
}

TEST(CollectLogTest, SendsAgainWhatWasNotCommitted) {
  InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  Collect();
  AppendFile(kLog, "three\n");
  Collect();
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "two\nthree\n")));
}

TEST(CollectLogTest, SendsAnUnfinishedLineWithANewline) {
  const std::string conf = InstallCollected("one\n");
  AppendFile(kLog, "unfin");
  CollectAndCommit();
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "unfin\n")));
  EXPECT_EQ(StagedOf(conf), LineState("unfin", 9));
}

TEST(CollectLogTest, SendsNothingWhileALineStaysUnfinished) {
  InstallCollected("one\n");
  AppendFile(kLog, "unfin");
  CollectAndCommit();
  CollectAndCommit();
  EXPECT_THAT(Delivered(), IsEmpty());
}

// The recorded line ends where the file ended, so it is looked for one byte too early.
TEST(CollectLogTest, SendsTheWholeLogOnceAnUnfinishedLineIsFinished) {
  InstallCollected("one\n");
  AppendFile(kLog, "unfin");
  CollectAndCommit();
  AppendFile(kLog, "ished\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "one\nunfinished\n")));
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to collect diff log '") + kLog +
                                   "' because of hash not match"));
}

TEST(CollectLogTest, SendsALogThatBecameShorterWhole) {
  const std::string conf = InstallCollected("one\ntwo\nthree\n");
  fs::resize_file(kLog, 0);
  AppendFile(kLog, "new\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "new\n")));
  EXPECT_EQ(StagedOf(conf), With(LineState("new", 4), "inode", Inode(kLog)));
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to collect diff log '") + kLog +
                                   "' because of hash not match"));
}

TEST(CollectLogTest, SendsALogWhoseLastLineChangedWhole) {
  InstallCollected("one\ntwo\n");
  WriteFile(kLog, "one\ntoo\nthree\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "one\ntoo\nthree\n")));
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to collect diff log '") + kLog +
                                   "' because of hash not match"));
}

TEST(CollectLogTest, SendsALogOfANewInodeWhole) {
  const std::string conf = InstallCollected("one\n");
  WriteFile("/volume1/other", "one\ntwo\n");
  fs::rename("/volume1/other", kLog);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "one\ntwo\n")));
  EXPECT_EQ(StagedOf(conf), With(LineState("two", 8), "inode", Inode(kLog)));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, KeepsTheLineEndOfAWholeLogAsItIs) {
  const std::string conf = Install();
  WriteFile(kLog, "one\nunfin");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "one\nunfin")));
  EXPECT_EQ(StagedOf(conf), With(LineState("unfin", 9), "inode", Inode(kLog)));
}

TEST(CollectLogTest, StagesAnEmptyLineForAnEmptyLog) {
  const std::string conf = Install();
  WriteFile(kLog, "");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "")));
  EXPECT_EQ(StagedOf(conf), With(LineState("", 0), "inode", Inode(kLog)));
}

TEST(CollectLogTest, TakesLinesOfAnyBytesAndAnyLength) {
  InstallCollected("one\n");
  const std::string lines =
      std::string("nul\0nul\n", 8) + "\xff\xfe\r\n" + std::string(300000, 'x') + "\n";
  AppendFile(kLog, lines);
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], lines);
  AppendFile(kLog, "after the long one\n");
  CollectAndCommit();
  EXPECT_EQ(Delivered()["m"], "after the long one\n");
}

// The hash tells the last line; the new line is missing only at the very end.
TEST(CollectLogTest, StagesTheEmptyLineBeforeTheEndWhenNoLineFollows) {
  const std::string conf = InstallCollected("one\ntwo\n");
  fs::resize_file(kLog, 7);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "")));
  EXPECT_EQ(StagedOf(conf), LineState("", 7));
  EXPECT_EQ(StagedOf(conf)["last_hash"], kEmptyMd5);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, StagesTheSizeItSawFirstWhenNoLineFollows) {
  const std::string conf = InstallCollected("one\ntwo\n");
  AppendFile(kLog, "x");
  On("pread").Nth(1).Before([] { fs::resize_file(kLog, 8); });
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(StagedOf(conf), LineState("", 9));
}

TEST(CollectLogTest, CollectsNothingOfALogThatIsMissing) {
  Install();
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), IsEmpty());
  EXPECT_FALSE(Exists(kLogUpdateFile));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, FailsALogThatCannotBeMeasured) {
  const std::string conf = Install();
  WriteFile(kLog, "one\n");
  On("ALIBCFileStat").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(),
              LoggedInOrder(std::string("Failed to stat file '") + kLog + "'", FailedIn(conf)));
}

TEST(CollectLogTest, SendsALogOfAWideInodeWholeEveryTime) {
  ShowInode(kLog, 4294967296 + 77);
  const std::string conf = InstallCollected("one\n");
  EXPECT_EQ(ReadPairs(conf)["inode"], "77");
  CollectAndCommit();
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "one\n")));
}

TEST(CollectLogTest, KeepsTheWideInodesOfArchives) {
  ShowInode(ArchiveOf(kLog, 1), 4294967296 + 77);
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  CollectAndCommit();
  EXPECT_EQ(ReadPairs(conf)["tar_log_inode"], "4294967373");
  CollectAndCommit();
  EXPECT_THAT(Delivered(), IsEmpty());
}

// ---- Continuing a log ----

TEST(CollectLogTest, FailsToContinueALogThatCannotBeOpened) {
  const std::string conf = Install();
  fs::create_directory(kLog);
  WriteFile(conf, std::string("name=m\npath=") + kLog +
                      "\nlast_hash=h\ntar_log_inode=0\nlast_byte=1\n" +
                      "total_byte=1\ninode=" + Inode(kLog) + "\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to open file '") + kLog + "'",
                                   std::string("Failed to collect diff log '") + kLog + "'",
                                   FailedIn(conf)));
}

TEST(CollectLogTest, FailsToContinueWhereTheOutputCannotBeOpened) {
  const std::string conf = InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  RemoveFile(kRunFolder);
  fs::create_directories(kOutput);
  EXPECT_EQ(QUENDELCollectLog(kRunFolder), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to open file " + Quoted(kOutput),
                                   std::string("Failed to collect diff log '") + kLog + "'",
                                   FailedIn(conf)));
}

TEST(CollectLogTest, FailsToContinueALogThatEndsWhereItsLastLineShouldBegin) {
  const std::string conf = InstallCollected("one\ntwo\n");
  fs::resize_file(kLog, 4);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to read hash line in log '") + kLog + "'",
                                   std::string("Failed to collect diff log '") + kLog + "'",
                                   FailedIn(conf)));
  EXPECT_FALSE(Exists(kLogUpdateFile));
}

// A log that was empty, or one unfinished line, has no line that could be looked for.
TEST(CollectLogTest, FailsToContinueALogThatHadNoWholeLine) {
  for (const std::string first : {"", "unfin"}) {
    RemoveFile(kLog);
    const std::string conf = InstallCollected(first);
    AppendFile(kLog, "ished\n");
    EXPECT_EQ(Collect(), 0);
    EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to read hash line in log '") + kLog + "'",
                                     std::string("Failed to collect diff log '") + kLog + "'",
                                     FailedIn(conf)));
  }
}

TEST(CollectLogTest, FailsWhenTheNewLinesCannotBeWritten) {
  const std::string conf = InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  On("sendfile").Return(-1, ENOSPC);
  On("write").Return(-1, ENOSPC);
  ExpectFailedDiff(conf);
}

TEST(CollectLogTest, FailsWhenTheNewLinesCannotBeReadBack) {
  const std::string conf = InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  // The output's last byte is read to complete the line, and again to find where it begins.
  On("pread").With(kOutput).With(1).Nth(2).Return(-1, EIO);
  ExpectFailedDiff(conf);
}

TEST(CollectLogTest, FailsWhenTheNewLinesAreLostAtTheEnd) {
  const std::string conf = InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  On("close").With(kOutput).Replace(CloseWithLoss);
  ExpectFailedDiff(conf);
}

TEST(CollectLogTest, FailsWhenTheStateOfAContinuedLogCannotBeStaged) {
  const std::string conf = InstallCollected("one\n");
  AppendFile(kLog, "two\n");
  const Pairs state = LineState("two", 8);
  int nth = 1;
  for (const std::string key : {"last_hash", "total_byte", "last_byte"}) {
    ClearLog();
    ResetCalls();
    On("ALIBCSzHashSetValue").Nth(nth++).Return(-1);
    EXPECT_EQ(Collect(), 0);
    EXPECT_THAT(Log(), LoggedInOrder(FailedPair(key, state.at(key), conf),
                                     std::string("Failed to update config of log '") + kLog + "'",
                                     std::string("Failed to collect diff log '") + kLog + "'",
                                     FailedIn(conf)));
    EXPECT_FALSE(Exists(kLogUpdateFile));
  }
}

// ---- Sending a log whole ----

TEST(CollectLogTest, FailsWhenTheWholeLogCannotBeCopied) {
  const std::string conf = Install();
  WriteFile(kLog, "one\n");
  On("ARVOFileCopy").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(
      Log(),
      LoggedInOrder(std::string("Failed to copy log '") + kLog + "' to " + Quoted(kOutput),
                    std::string("Failed to collect whole log '") + kLog + "'", FailedIn(conf)));
}

TEST(CollectLogTest, FailsWhenARewrittenLogCannotBeCopied) {
  const std::string conf = InstallCollected("one\ntwo\n");
  WriteFile(kLog, "x\n");
  On("ARVOFileCopy").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(
      Log(), LoggedInOrder(
                 std::string("Failed to collect diff log '") + kLog + "' because of hash not match",
                 std::string("Failed to copy log '") + kLog + "' to " + Quoted(kOutput),
                 std::string("Failed to collect whole log '") + kLog + "'", FailedIn(conf)));
}

TEST(CollectLogTest, FailsWhenTheStateOfAWholeLogCannotBeStaged) {
  const std::string conf = Install();
  WriteFile(kLog, "one\n");
  const Pairs state = With(LineState("one", 4), "inode", Inode(kLog));
  int nth = 1;
  for (const std::string key : {"inode", "last_hash", "total_byte", "last_byte"}) {
    ClearLog();
    ResetCalls();
    On("ALIBCSzHashSetValue").Nth(nth).Return(-1);
    EXPECT_EQ(Collect(), 0);
    const std::string pair = FailedPair(key, state.at(key), conf);
    const std::string whole = std::string("Failed to collect whole log '") + kLog + "'";
    if (nth++ == 1) {
      EXPECT_THAT(Log(), LoggedInOrder(pair, whole, FailedIn(conf)));
    } else {
      EXPECT_THAT(Log(),
                  LoggedInOrder(pair, std::string("Failed to update config of log '") + kLog + "'",
                                whole, FailedIn(conf)));
    }
    EXPECT_FALSE(Exists(kLogUpdateFile));
  }
}

TEST(CollectLogTest, FailsWhenTheCopyOfAWholeLogCannotBeOpened) {
  const std::string conf = Install();
  WriteFile(kLog, "one\n");
  On("ARVOFileCopy").Nth(1).Return(0);  // so that there is no copy
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to open file " + Quoted(kOutput),
                                   std::string("Failed to collect whole log '") + kLog + "'",
                                   FailedIn(conf)));
}

TEST(CollectLogTest, FailsWhenTheCopyOfAWholeLogCannotBeRead) {
  const std::string conf = Install();
  WriteFile(kLog, "one\n");
  On("pread").With(kOutput).Return(-1, EIO);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to open file " + Quoted(kOutput),
                                   std::string("Failed to collect whole log '") + kLog + "'",
                                   FailedIn(conf)));
}

// ---- A whole log behind an archive's lines ----

TEST(CollectLogTest, PutsAWholeLogBehindTheLinesOfTheOldestArchive) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\nfour\n"});
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "two\nthree\nfour\n")));
  EXPECT_EQ(StagedOf(conf), With(With(LineState("four", 11), "inode", Inode(kLog)), "tar_log_inode",
                                 Inode(ArchiveOf(kLog, 1))));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, LooksForTheLastLineInAllOfTheOutput) {
  const std::string conf = InstallRotated("one\n", {"two\n", ""});
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "two\n")));
  const Pairs staged = StagedOf(conf);
  EXPECT_EQ(staged.at("last_hash"), Md5Of("two"));
  EXPECT_EQ(staged.at("total_byte"), "0");
  EXPECT_EQ(staged.at("last_byte"), "3");
}

namespace {

// Rotates a collected log and lets `fail` spoil the copy of the live one behind the archive's line.
// Returns the configuration.
template <typename Fail>
std::string SpoilAppending(const Fail& fail) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  fail();
  EXPECT_EQ(Collect(), 0);
  EXPECT_FALSE(Exists(kOutput + ".tmp"));
  EXPECT_FALSE(Exists(kLogUpdateFile));
  return conf;
}

}  // namespace

TEST(CollectLogTest, FailsWhenTheOutputCannotBeMeasured) {
  const std::string conf = SpoilAppending([] {
    On("ALIBCFileStat").Nth(4).Return(-1);  // behind the archive, its plain copy and the live log
  });
  EXPECT_THAT(Log(), LoggedInOrder("Failed to stat file " + Quoted(kOutput),
                                   std::string("Failed to collect whole log '") + kLog + "'",
                                   FailedIn(conf)));
}

TEST(CollectLogTest, FailsWhenTheSnapshotCannotBeMade) {
  const std::string conf = SpoilAppending([] { On("ARVOFileCopy").Nth(2).Return(-1); });
  EXPECT_THAT(
      Log(),
      LoggedInOrder(std::string("Failed to copy log '") + kLog + "' to " + Quoted(kOutput + ".tmp"),
                    std::string("Failed to collect log '") + kLog + "'",
                    std::string("Failed to collect whole log '") + kLog + "'", FailedIn(conf)));
}

TEST(CollectLogTest, FailsWhenTheSnapshotCannotBeOpened) {
  const std::string conf = SpoilAppending([] { On("ARVOFileCopy").Nth(2).Return(0); });
  EXPECT_THAT(Log(), LoggedInOrder("Failed to open file " + Quoted(kOutput + ".tmp"),
                                   std::string("Failed to collect log '") + kLog + "'",
                                   std::string("Failed to collect whole log '") + kLog + "'",
                                   FailedIn(conf)));
}

TEST(CollectLogTest, NamesTheLogWhenTheOutputCannotBeAppendedTo) {
  const std::string conf = Install();
  WriteFile(kLog, "one\n");
  RemoveFile(kRunFolder);
  fs::create_directories(kOutput);
  EXPECT_EQ(QUENDELCollectLog(kRunFolder), 0);
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to open file '") + kLog + "'",
                                   std::string("Failed to collect log '") + kLog + "'",
                                   std::string("Failed to collect whole log '") + kLog + "'",
                                   FailedIn(conf)));
  EXPECT_FALSE(Exists(kOutput + ".tmp"));
}

TEST(CollectLogTest, FailsWhenTheSnapshotCannotBeAppended) {
  const std::string conf = SpoilAppending([] {
    for (const char* way : {"copy_file_range", "sendfile", "write"}) {
      On(way).When(ThereIsASnapshot).Return(-1, ENOSPC);
    }
  });
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to collect log '") + kLog + "'",
                                   std::string("Failed to collect whole log '") + kLog + "'",
                                   FailedIn(conf)));
}

TEST(CollectLogTest, FailsWhenTheEndOfTheSnapshotIsLost) {
  const std::string conf = SpoilAppending(
      [] { On("close").With(kOutput).When(ThereIsASnapshot).Replace(CloseWithLoss); });
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to collect log '") + kLog + "'",
                                   std::string("Failed to collect whole log '") + kLog + "'",
                                   FailedIn(conf)));
}

TEST(CollectLogTest, GoesOnWhenTheSnapshotCannotBeRemoved) {
  InstallRotated("one\n", {"two\n", "three\n"});
  On("remove").With(kOutput + ".tmp").Return(-1, EPERM);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to remove " + kOutput +
                                   ".tmp [errno=" + std::to_string(EPERM) + "]"));
  EXPECT_EQ(Delivered()["m"], "two\nthree\n");
}

// With ".tmp" behind it, an output's path of 251 bytes fills the buffer; longer ones are cut.
TEST(CollectLogTest, RefusesASnapshotNameThatDoesNotFit) {
  const std::string conf = Install();
  WriteFile(kLog, "one\n");
  fs::create_directories("/tmp/quendel");
  const struct {
    size_t length;
    const char* cut;
  } outputs[] = {{251, nullptr}, {252, ".tm"}, {253, ".t"}, {255, ""}};
  for (const auto& [length, cut] : outputs) {
    const std::string folder = "/tmp/" + std::string(length - 7, 'd');
    const std::string output = folder + "/m";
    ASSERT_EQ(output.size(), length);
    WriteFile(output, "before\n");
    ClearLog();
    EXPECT_EQ(QUENDELCollectLog(folder.c_str()), 0);
    if (cut == nullptr) {
      EXPECT_EQ(ReadFile(output), "before\none\n");
      EXPECT_THAT(Log(), IsEmpty());
      continue;
    }
    EXPECT_EQ(ReadFile(output), "before\n");
    EXPECT_THAT(
        Log(),
        LoggedInOrder(std::string("Failed to copy log '") + kLog + "' to " + Quoted(output + cut),
                      std::string("Failed to collect log '") + kLog + "'",
                      std::string("Failed to collect whole log '") + kLog + "'", FailedIn(conf)));
  }
}

// ---- Archives ----

TEST(CollectLogTest, SendsNewerArchivesWhole) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n", "four\n", "five\n"});
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "two\nfive\n"), Pair("m.2.xz", "three\n"),
                                                Pair("m.1.xz", "four\n")));
  EXPECT_EQ(StagedOf(conf)["tar_log_inode"], Inode(ArchiveOf(kLog, 1)) + "," +
                                                 Inode(ArchiveOf(kLog, 2)) + "," +
                                                 Inode(ArchiveOf(kLog, 3)));
  EXPECT_EQ(ReadFile(kOutput + ".1.xz"), ReadFile(ArchiveOf(kLog, 1)));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, SendsAnArchiveOnce) {
  InstallRotated("one\n", {"two\n", "three\n"});
  CollectAndCommit();
  CollectAndCommit();
  EXPECT_THAT(Delivered(), IsEmpty());
  AppendFile(kLog, "four\n");
  CollectAndCommit();
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "four\n")));
}

TEST(CollectLogTest, StagesNoArchivesWhenNoneIsNew) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  CollectAndCommit();
  AppendFile(kLog, "four\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(StagedOf(conf), Not(Contains(Key("tar_log_inode"))));
}

TEST(CollectLogTest, ListsKnownArchivesAgainWithANewOne) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  CollectAndCommit();
  Rotate(kLog);
  AppendFile(kLog, "four\n");
  CollectAndCommit();
  EXPECT_EQ(ReadPairs(conf)["tar_log_inode"],
            Inode(ArchiveOf(kLog, 1)) + "," + Inode(ArchiveOf(kLog, 2)));
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "four\n")));
}

TEST(CollectLogTest, SeesNoArchiveBehindAGap) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n", "four\n", "five\n"});
  RemoveFile(ArchiveOf(kLog, 2));
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(StagedOf(conf)["tar_log_inode"], Inode(ArchiveOf(kLog, 1)));
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "five\n"), Pair("m.1.xz", "four\n")));
}

TEST(CollectLogTest, SendsEverythingAfterAReset) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n", "four\n"});
  CollectAndCommit();
  ASSERT_EQ(QUENDELResetLogConf(conf.c_str()), 0);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "four\n"), Pair("m.1.xz", "three\n"),
                                                Pair("m.2.xz", "one\ntwo\n")));
  EXPECT_THAT(Log(), LoggedInOrder("Failed to read hash line in log " + Quoted(kOutput + ".2"),
                                   "Failed to collect diff log " + Quoted(kOutput + ".2")));
  EXPECT_FALSE(Exists(kOutput + ".2"));
}

TEST(CollectLogTest, DropsTheStateOfArchivesWhoseLogIsMissing) {
  InstallRotated("one\n", {"two\n", "three\n", ""});
  RemoveFile(kLog);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "two\n"), Pair("m.1.xz", "three\n")));
  EXPECT_FALSE(Exists(kLogUpdateFile));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, DropsTheStateOfArchivesWhoseLogHasNothingNew) {
  InstallCollected("one\n");
  WriteFile(ArchiveOf(kLog, 1), "no archive");
  ClearLog();
  EXPECT_EQ(Collect(), 0);
  EXPECT_FALSE(Exists(kLogUpdateFile));
}

// The log was not replaced, so its own new lines take the place of the archive's.
TEST(CollectLogTest, TruncatesAnArchivesLinesWhenTheLiveLogContinues) {
  const std::string conf = InstallCollected("one\n");
  WriteFile(ArchiveOf(kLog, 1), Xz("one\na long line of the archive\n"));
  AppendFile(kLog, "two\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "two\n")));
  EXPECT_EQ(StagedOf(conf)["tar_log_inode"], Inode(ArchiveOf(kLog, 1)));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, KeepsAnArchivesLinesWhenTheLiveLogIsSentWhole) {
  InstallCollected("one\ntwo\n");
  AppendFile(kLog, "three\n");
  CopyTruncate(kLog);
  AppendFile(kLog, "4\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "three\n4\n")));
}

TEST(CollectLogTest, SendsAnArchiveWholeThatDoesNotContinueTheLog) {
  InstallCollected("one\n");
  WriteFile(kLog, "something else\n");
  Rotate(kLog);
  AppendFile(kLog, "two\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(),
              UnorderedElementsAre(Pair("m", "two\n"), Pair("m.1.xz", "something else\n")));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectLogTest, MakesAnEmptyOutputOfAnArchiveWithoutNewLines) {
  const std::string conf = InstallRotated("one\n", {"", ""});
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "")));
  EXPECT_EQ(StagedOf(conf)["total_byte"], "0");
}

TEST(CollectLogTest, DecompressesACopyInPlace) {
  InstallRotated("one\n", {"two\n", "three\n"});
  Record("ALIBCExec");
  Record("ARVOFileCopy");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Recorded(), ElementsAre(StartsWith(ArchiveOf(kLog, 1) + "|" + kOutput + ".1.xz|"),
                                      "/bin/xz|-f|-d|" + kOutput + ".1.xz",
                                      StartsWith(std::string(kLog) + "|" + kOutput + ".tmp|")));
}

TEST(CollectLogTest, FailsWithoutMemoryForTheArchives) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  for (const int nth : {2, 3}) {
    ClearLog();
    ResetCalls();
    On("ALIBCSzListAlloc").Nth(nth).Return(nullptr);
    EXPECT_EQ(Collect(), 0);
    EXPECT_THAT(Log(), LoggedInOrder("Failed to allocate memory for list", FailedTared(conf),
                                     FailedIn(conf)));
    EXPECT_THAT(Delivered(), IsEmpty());
  }
}

TEST(CollectLogTest, FailsWhenAnArchiveCannotBeMeasured) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n", "four\n"});
  On("ALIBCFileStat").Nth(2).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(),
              LoggedInOrder("Failed to stat file " + Quoted(ArchiveOf(kLog, 2)),
                            std::string("Failed to get the inode of tared logs of '") + kLog + "'",
                            FailedTared(conf), FailedIn(conf)));
  EXPECT_THAT(Delivered(), IsEmpty());
}

TEST(CollectLogTest, FailsWithoutMemoryForAnArchivesInode) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  On("ALIBCSzListPush").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(
      Log(),
      LoggedInOrder("Failed to insert inode " + Quoted(Inode(ArchiveOf(kLog, 1))) + " into list",
                    std::string("Failed to get the inode of tared logs of '") + kLog + "'",
                    FailedTared(conf), FailedIn(conf)));
}

TEST(CollectLogTest, FailsWhenTheKnownArchivesCannotBeRead) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  On("ALIBCStrTok").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to parse tar log inode '\"\"'", FailedTared(conf),
                                   FailedIn(conf)));
}

TEST(CollectLogTest, DropsAnOldestArchiveThatCannotBeCopied) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n", "four\n"});
  On("ARVOFileCopy").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to copy " + Quoted(ArchiveOf(kLog, 2)) + " to " +
                                   Quoted(kOutput + ".2.xz")));
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "four\n"), Pair("m.1.xz", "three\n")));
  EXPECT_EQ(StagedOf(conf)["tar_log_inode"],
            Inode(ArchiveOf(kLog, 1)) + "," + Inode(ArchiveOf(kLog, 2)));
}

TEST(CollectLogTest, DropsAnOldestArchiveThatCannotBeDecompressed) {
  InstallRotated("one\n", {"two\n", "three\n"});
  for (const long answer : {-1L, 1L}) {
    ClearLog();
    ResetCalls();
    On("ALIBCExec").Nth(1).Return(answer);
    EXPECT_EQ(Collect(), 0);
    EXPECT_THAT(Log(), LoggedInOrder("Failed to untar " + Quoted(kOutput + ".1.xz")));
    EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "three\n")));
  }
}

TEST(CollectLogTest, DropsAnOldestArchiveWhosePlainCopyCannotBeMeasured) {
  InstallRotated("one\n", {"two\n", "three\n"});
  On("ALIBCFileStat").Nth(2).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to stat file " + Quoted(kOutput + ".1")));
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "three\n")));
}

TEST(CollectLogTest, SendsAnArchiveWholeWhosePlainCopyCannotBeOpened) {
  InstallRotated("one\n", {"two\n", "three\n"});
  On("ALIBCExec").Nth(1).Return(0);  // so that there is no plain copy
  On("ALIBCFileStat").Nth(2).Return(0);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to open file " + Quoted(kOutput + ".1"),
                                   "Failed to collect diff log " + Quoted(kOutput + ".1")));
  EXPECT_THAT(Delivered(),
              UnorderedElementsAre(Pair("m", "three\n"), Pair("m.1.xz", "one\ntwo\n")));
}

TEST(CollectLogTest, SendsAnArchiveWholeWhoseStateCannotBeStaged) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  On("ALIBCSzHashSetValue").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(FailedPair("last_hash", Md5Of("two"), conf),
                                   "Failed to update config of log " + Quoted(kOutput + ".1"),
                                   "Failed to collect diff log " + Quoted(kOutput + ".1")));
  EXPECT_THAT(Delivered(), Contains(Pair("m.1.xz", "one\ntwo\n")));
}

TEST(CollectLogTest, FailsWhenTheOldestArchiveCannotBeSentWholeEither) {
  const std::string conf = InstallCollected("one\n");
  WriteFile(kLog, "something else\n");
  Rotate(kLog);
  On("ARVOFileCopy").Nth(2).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to copy " + Quoted(ArchiveOf(kLog, 1)) + " to " +
                                       Quoted(kOutput + ".1.xz"),
                                   FailedTared(conf), FailedIn(conf)));
}

TEST(CollectLogTest, FailsAtTheFirstNewerArchiveThatCannotBeCopied) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n", "four\n", "five\n"});
  On("ARVOFileCopy").Nth(2).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to copy " + Quoted(ArchiveOf(kLog, 2)) + " to " +
                                       Quoted(kOutput + ".2.xz"),
                                   FailedTared(conf), FailedIn(conf)));
  EXPECT_THAT(Delivered(), UnorderedElementsAre(Pair("m", "two\n")));
  EXPECT_FALSE(Exists(kLogUpdateFile));
}

TEST(CollectLogTest, FailsWhenTheArchivesCannotBeStaged) {
  const std::string conf = InstallRotated("one\n", {"two\n", "three\n"});
  On("ALIBCSzHashSetValue").Nth(4).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(FailedPair("tar_log_inode", Inode(ArchiveOf(kLog, 1)), conf),
                                   FailedTared(conf), FailedIn(conf)));
}

TEST(CollectLogTest, GoesOnWhenScratchCopiesCannotBeRemoved) {
  InstallRotated("one\n", {"two\n", "three\n"});
  On("ALIBCExec").Nth(1).Return(1);
  On("remove").With(kOutput + ".1.xz").Return(-1, EPERM);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to untar " + Quoted(kOutput + ".1.xz"),
                                   "Failed to remove " + kOutput +
                                       ".1.xz [errno=" + std::to_string(EPERM) + "]"));
}

// A name of 250 bytes, with ".1.xz" behind it, fills the buffer exactly; of 251 it does not fit,
// and cut it would be taken for an archive for ever.
TEST(CollectLogTest, SeesNoArchivesOfALogWhoseNameIsTooLong) {
  for (const size_t length : {size_t{250}, size_t{251}, size_t{255}}) {
    const std::string folder = "/volume1/" + std::string(200, 'd') + "/";
    const std::string log = folder + std::string(length - folder.size(), 'l');
    ASSERT_EQ(log.size(), length);
    const std::string conf = InstallLog("m", log);
    WriteFile(log, "one\n");
    WriteFile(ArchiveOf(log, 1), "no archive");
    WriteFile(log + ".1.x", "no archive");  // what the name of 251 bytes would be cut to
    ClearLog();
    EXPECT_EQ(Collect(), 0);
    EXPECT_THAT(Delivered(), Contains(Pair("m", "one\n"))) << length;
    EXPECT_EQ(StagedOf(conf).count("tar_log_inode"), length == 250 ? 1u : 0u) << length;
    RemoveFile(folder);
  }
}

// The copy's name would be cut to that of the collected log itself.
TEST(CollectLogTest, DropsAnOldestArchiveWhoseCopyHasNoNameThatFits) {
  const std::string folder = "/tmp/" + std::string(248, 'd');
  const std::string output = folder + "/m";
  ASSERT_EQ(output.size(), 255u);
  Install();
  WriteFile(ArchiveOf(kLog, 1), Xz("one\n"));
  WriteFile(output, "before\n");
  EXPECT_EQ(QUENDELCollectLog(folder.c_str()), 0);
  ASSERT_TRUE(Exists(output));
  EXPECT_EQ(ReadFile(output), "before\n");
  EXPECT_THAT(Log(), LoggedInOrder("Failed to copy " + Quoted(ArchiveOf(kLog, 1)) + " to " +
                                   Quoted(output)));
}
