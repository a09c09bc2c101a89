// The user-defined collectors: their results, their state, and what happens when they misbehave.
#include <gmock/gmock.h>
#include <json/value.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <regex>
#include <thread>

#include "base/json_text.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/log.h"

using namespace quendel::test;
using quendel::JsonFromText;
using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;

namespace {

namespace fs = std::filesystem;

constexpr char kUpdateFile[] = "/tmp/quendel/quendel.udc.update.conf";
constexpr char kRunFolder[] = "/tmp/quendel_run/udc";
const std::string kResult = std::string(kRunFolder) + "/udc.result";

std::string ConfOf(const std::string& name) {
  return std::string(kConfFolder) + "/quendel.udc." + name;
}

std::string PathOf(const std::string& name) {
  return "/volume1/" + name;
}

// Runs the collectors into an emptied folder.
int Collect() {
  fs::remove_all(kRunFolder);
  fs::create_directories(kRunFolder);
  fs::create_directories("/tmp/quendel");
  return QUENDELCollectUDC(kRunFolder);
}

void Commit() {
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
}

Json::Value Results() {
  Json::Value results = "no JSON";
  EXPECT_TRUE(JsonFromText(ReadFile(kResult), results));
  return results;
}

Json::Value Parsed(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(JsonFromText(text, value));
  return value;
}

// What was staged, without the comments.
std::string Staged() {
  const std::string text = Exists(kUpdateFile) ? ReadFile(kUpdateFile) : "";
  return std::regex_replace(text, std::regex("#.*\n"), "");
}

std::string Section(const std::string& name, const std::string& output) {
  return "[" + ConfOf(name) + "]\nlast_hash=" + Md5Of(output) + "\n";
}

template <typename... Messages>
testing::Matcher<std::vector<LogLine>> LoggedInOrder(const Messages&... messages) {
  return ElementsAreArray(std::vector<testing::Matcher<LogLine>>{
      Logged("quendel_collect_udc", std::string(messages))...});
}

std::string NoResultOf(const std::string& name) {
  return "Failed to get result of udc '" + PathOf(name) + "'";
}

}  // namespace

// ---- The run ----

TEST(CollectUDCTest, NeedsTheConfigurationDirectory) {
  RemoveFile(kConfFolder);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Dir '/usr/arvo/etc/quendel' dose not exist"));
  EXPECT_FALSE(Exists(kResult));
}

TEST(CollectUDCTest, GoesOnWhenTheDirectoryCannotBeTold) {
  On("ALIBCFileCheckDir").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
}

TEST(CollectUDCTest, FailsWithoutMemoryForTheNames) {
  On("ALIBCSzListAlloc").Nth(1).Return(nullptr);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to allocate memory for list"));
  EXPECT_FALSE(Exists(kResult));
}

TEST(CollectUDCTest, FailsWithoutMemoryForTheState) {
  WriteFile(kUpdateFile, "[/x]\nlast_hash=old\n");
  On("ALIBCSzHashAlloc").Nth(1).Return(nullptr);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to allocate memory for UDC hash"));
  EXPECT_FALSE(Exists(kResult));
  EXPECT_TRUE(Exists(kUpdateFile)) << "what an earlier run staged is not looked at yet";
}

TEST(CollectUDCTest, FailsWhenTheConfigurationsCannotBeListed) {
  WriteFile(kUpdateFile, "[/x]\nlast_hash=old\n");
  On("ALIBCFileEnumDir").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to enum dir '/usr/arvo/etc/quendel'"));
  EXPECT_FALSE(Exists(kResult));
  EXPECT_FALSE(Exists(kUpdateFile)) << "what an earlier run staged goes first";
}

TEST(CollectUDCTest, AsksForItsContainersInTheirSizes) {
  for (const char* call : {"ALIBCSzListAlloc", "ALIBCSzHashAlloc", "ALIBCFileEnumDir"}) {
    Record(call);
  }
  Collect();
  EXPECT_THAT(Recorded(), ElementsAre("512", "128", "/usr/arvo/etc/quendel|quendel.udc.|130"));
}

TEST(CollectUDCTest, WritesANullWithoutACollector) {
  WriteFile(std::string(kConfFolder) + "/quendel.log.m", "name=m\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(ReadFile(kResult), "null");
  EXPECT_EQ(Staged(), "");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectUDCTest, RemovesWhatAnEarlierRunStaged) {
  WriteFile(kUpdateFile, "[/x]\nlast_hash=old\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_FALSE(Exists(kUpdateFile));
}

TEST(CollectUDCTest, GoesOnWhenWhatWasStagedCannotBeRemoved) {
  InstallUdc("a", "echo 1");
  WriteFile(kUpdateFile, "");
  On("remove").With(kUpdateFile).Return(-1, EPERM);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder(std::string("Failed to remove ") + kUpdateFile +
                                   " [errno=" + std::to_string(EPERM) + "]"));
  EXPECT_EQ(Results(), Parsed(R"({"a": 1})"));
}

// ---- Results ----

TEST(CollectUDCTest, SendsNewOutputAndStagesItsHash) {
  InstallUdc("a", "echo '{\"disks\": [1, 2]}'");
  InstallUdc("b", "echo '\"text\"'");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": {"disks": [1, 2]}, "b": "text"})"));
  EXPECT_EQ(Staged(), Section("a", "{\"disks\": [1, 2]}\n") + Section("b", "\"text\"\n"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectUDCTest, SendsSameForOutputThatWasDelivered) {
  InstallUdc("a", "echo '{\"disks\": 2}'");
  Collect();
  Commit();
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Same"})"));
  EXPECT_EQ(Staged(), "");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectUDCTest, SendsOutputAgainThatWasNotCommitted) {
  InstallUdc("a", "echo 1");
  Collect();
  Collect();
  EXPECT_EQ(Results(), Parsed(R"({"a": 1})"));
}

TEST(CollectUDCTest, LeavesTheConfigurationFilesAlone) {
  InstallUdc("a", "echo 1");
  const std::string before = ReadFile(ConfOf("a"));
  Collect();
  EXPECT_EQ(ReadFile(ConfOf("a")), before);
}

TEST(CollectUDCTest, TellsOutputApartByEveryByte) {
  InstallUdc("a", "printf '1'");
  Collect();
  Commit();
  InstallUdc("a", "printf '1 '");
  WriteFile(ConfOf("a"), "name=a\npath=" + PathOf("a") + "\nlast_hash=" + Md5Of("1") + "\n");
  Collect();
  EXPECT_EQ(Results(), Parsed(R"({"a": 1})"));
}

TEST(CollectUDCTest, LeavesOutWhatPrintsNoJson) {
  InstallUdc("a", "echo no JSON");
  InstallUdc("b", "echo 2");
  for (int run = 0; run < 2; ++run) {
    ClearLog();
    EXPECT_EQ(Collect(), 0);
    Commit();
    EXPECT_THAT(Log(), LoggedInOrder("Failed to set json value of '" + PathOf("a") + "'"));
  }
  EXPECT_EQ(Results(), Parsed(R"({"b": "Same"})"));
}

TEST(CollectUDCTest, LeavesOutWhatPrintsNothing) {
  InstallUdc("a", "exit 0");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(ReadFile(kResult), "null");
  EXPECT_THAT(Log(), LoggedInOrder("Failed to set json value of '" + PathOf("a") + "'"));
}

TEST(CollectUDCTest, KnowsTheEmptyOutputByItsHash) {
  InstallUdc("a", "exit 0");
  WriteFile(ConfOf("a"), "name=a\npath=" + PathOf("a") + "\nlast_hash=" + Md5Of("") + "\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Same"})"));
}

TEST(CollectUDCTest, TakesOutputOfAnyLength) {
  InstallUdc(
      "a",
      "printf '['; i=0; while [ $i -lt 3000 ]; do printf '%d,' $i; i=$((i+1)); done; echo '0]'");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results()["a"].size(), 3001u);
}

TEST(CollectUDCTest, TakesOutputOfWholeChunks) {
  for (const int length : {1023, 1024, 1025, 2048}) {
    const std::string name = "a" + std::to_string(length);
    InstallUdc(name, "printf '\"%" + std::to_string(length - 2) + "s\"' x");
    EXPECT_EQ(Collect(), 0);
    EXPECT_EQ(Results()[name].asString().size(), static_cast<size_t>(length - 2));
  }
}

TEST(CollectUDCTest, LeavesOutJsonThatNestsTooDeeply) {
  InstallUdc("a", "printf '%02000d' 0 | tr 0 '['; printf '%02000d' 0 | tr 0 ']'");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to set json value of '" + PathOf("a") + "'"));
}

TEST(CollectUDCTest, IgnoresTheExitStatus) {
  InstallUdc("a", "echo 1; exit 3");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": 1})"));
}

TEST(CollectUDCTest, LetsTheLaterOfTwoWithOneNameWin) {
  InstallUdc("a", "echo 1");
  InstallUdc("b", "echo 2");
  WriteFile(ConfOf("b"), "name=a\npath=" + PathOf("b") + "\nlast_hash=\"\"\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": 2})"));
  EXPECT_EQ(Staged(), Section("a", "1\n") + Section("b", "2\n"));
}

TEST(CollectUDCTest, RunsTheProgramWithoutArguments) {
  InstallUdc("a", "echo $#");
  Record("ALIBCPopen");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": 0})"));
  EXPECT_THAT(Recorded(), ElementsAre(PathOf("a")));
}

// ---- Collectors that cannot be run ----

TEST(CollectUDCTest, FilesAnUnreadableNameUnderTheOneBefore) {
  InstallUdc("a", "echo 1");
  InstallUdc("b", "echo 2");
  WriteFile(ConfOf("b"), "path=" + PathOf("b") + "\nlast_hash=\"\"\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Error"})"));
  ASSERT_EQ(Log().size(), 2u);
  EXPECT_THAT(Log()[1],
              Logged("quendel_collect_udc", "Failed to get config of '" + ConfOf("b") + "'"));
}

TEST(CollectUDCTest, FilesAFirstUnreadableNameUnderAnEmptyOne) {
  WriteFile(ConfOf("a"), "path=/x\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"": "Error"})"));
}

TEST(CollectUDCTest, FilesAnUnreadablePathUnderItsOwnName) {
  InstallUdc("a", "echo 1");
  WriteFile(ConfOf("b"), "name=b\nlast_hash=\"\"\n");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": 1, "b": "Error"})"));
}

TEST(CollectUDCTest, SendsErrorForAMissingProgram) {
  InstallUdc("a", "");
  RemoveFile(PathOf("a"));
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Error"})"));
  EXPECT_THAT(Log(), LoggedInOrder("File '" + PathOf("a") + "' does not exist", NoResultOf("a")));
}

TEST(CollectUDCTest, SendsErrorForAProgramWithoutPermission) {
  InstallUdc("a", "echo 1");
  ASSERT_EQ(chmod(PathOf("a").c_str(), 0644), 0);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Error"})"));
  EXPECT_THAT(Log(),
              LoggedInOrder("File '" + PathOf("a") + "' cannot be executed", NoResultOf("a")));
}

TEST(CollectUDCTest, SendsErrorForAProgramThatDoesNotStart) {
  InstallUdc("a", "");
  WriteFile(PathOf("a"), "#!/no/such/interpreter\n");
  InstallUdc("b", "");
  RemoveFile(PathOf("b"));
  fs::create_directory(PathOf("b"));
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Error", "b": "Error"})"));
  EXPECT_THAT(Log(), LoggedInOrder("Failed to popen '" + PathOf("a") + "'", NoResultOf("a"),
                                   "Failed to popen '" + PathOf("b") + "'", NoResultOf("b")));
}

TEST(CollectUDCTest, SendsErrorForOutputThatCannotBeReadToItsEnd) {
  InstallUdc("a", "");
  // A stream that gives a valid result, and then an error where its end should be.
  cookie_io_functions_t functions = {};
  functions.read = [](void* calls, char* buffer, size_t) -> ssize_t {
    if (++*static_cast<int*>(calls) > 1) {
      errno = EIO;
      return -1;
    }
    buffer[0] = '1';
    return 1;
  };
  int calls = 0;
  FILE* stream = fopencookie(&calls, "r", functions);
  On("ALIBCPopen").Nth(1).Return(stream);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Error"})"));
  EXPECT_THAT(Log(), LoggedInOrder(NoResultOf("a")));
  fclose(stream);
}

TEST(CollectUDCTest, TakesALoopOfLinksForAMissingProgram) {
  InstallUdc("a", "");
  RemoveFile(PathOf("a"));
  fs::create_symlink(PathOf("a"), PathOf("a"));
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), LoggedInOrder("File '" + PathOf("a") + "' does not exist", NoResultOf("a")));
}

TEST(CollectUDCTest, GoesOnToTheNextCollectorAfterAFailure) {
  InstallUdc("a", "echo 1");
  RemoveFile(PathOf("a"));
  InstallUdc("b", "echo 2");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Error", "b": 2})"));
}

// ---- State that cannot be staged ----

TEST(CollectUDCTest, LeavesOutWhatCannotBeRemembered) {
  InstallUdc("a", "echo 1");
  On("ALIBCSzHashSetValue").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(ReadFile(kResult), "null");
  EXPECT_THAT(Log(), LoggedInOrder("Failed to set hash of conf '" + ConfOf("a") + "' to '" +
                                   Md5Of("1\n") + "'"));
}

TEST(CollectUDCTest, LeavesOutWhatCannotBeStaged) {
  for (const long answer : {0L, -1L}) {
    ClearLog();
    InstallUdc("a", "echo 1");
    On("ALIBCFileAddSection").Nth(1).Return(answer);
    EXPECT_EQ(Collect(), 0);
    EXPECT_EQ(ReadFile(kResult), "null");
    EXPECT_THAT(Log(),
                LoggedInOrder(std::string("Failed to add new section to '") + kUpdateFile + "'"));
  }
}

// ---- A result file that cannot be written ----

TEST(CollectUDCTest, FailsWhenTheResultFileCannotBeOpened) {
  InstallUdc("a", "echo 1");
  fs::create_directories("/tmp/quendel");
  EXPECT_EQ(QUENDELCollectUDC("/tmp/missing"), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to open file '/tmp/missing/udc.result'"));
  EXPECT_FALSE(Exists(kUpdateFile)) << "what was not delivered would count as delivered";
}

TEST(CollectUDCTest, FailsWhenTheResultFileCannotBeWrittenWhole) {
  InstallUdc("a", "printf '\"%20000s\"' x");
  fs::create_directories(kRunFolder);
  fs::create_directories("/tmp/quendel");
  ASSERT_EQ(mount("small", kRunFolder, "tmpfs", 0, "size=4k"), 0);
  EXPECT_EQ(QUENDELCollectUDC(kRunFolder), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to open file '" + kResult + "'"));
  EXPECT_FALSE(Exists(kUpdateFile));
  ASSERT_EQ(umount(kRunFolder), 0);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results()["a"].asString().size(), 20000u);
}

// So little text is not written before the file is closed.
TEST(CollectUDCTest, FailsWhenTheResultFileCannotBeClosed) {
  InstallUdc("a", "echo 1");
  fs::create_directories(kRunFolder);
  fs::create_directories("/tmp/quendel");
  ASSERT_EQ(mount("small", kRunFolder, "tmpfs", 0, "size=4k"), 0);
  WriteFile(std::string(kRunFolder) + "/other", std::string(4096, 'x'));
  EXPECT_EQ(QUENDELCollectUDC(kRunFolder), -1);
  EXPECT_THAT(Log(), LoggedInOrder("Failed to open file '" + kResult + "'"));
  EXPECT_FALSE(Exists(kUpdateFile));
  ASSERT_EQ(umount(kRunFolder), 0);
}

TEST(CollectUDCTest, ReplacesAnOldResultFile) {
  InstallUdc("a", "echo 1");
  fs::create_directories("/tmp/quendel");
  WriteFile(kResult, std::string(1000, 'x'));
  EXPECT_EQ(QUENDELCollectUDC(kRunFolder), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": 1})"));
}

// ---- Collectors that misbehave ----

TEST(CollectUDCTest, TakesWhatACollectorPrintedBeforeItDied) {
  InstallUdc("a", "echo 1; kill -KILL $$");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": 1})"));
}

TEST(CollectUDCTest, WaitsForACollectorThatClosedItsOutput) {
  InstallUdc("a", "echo 1; exec >&-; sleep 0.3; touch /volume1/ended");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": 1})"));
  EXPECT_TRUE(Exists("/volume1/ended"));
}

TEST(CollectUDCTest, WaitsForWhateverHoldsTheOutputOpen) {
  InstallUdc("a", "printf '[1'; (sleep 0.3; echo ',2]') & exit 0");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": [1, 2]})"));
}

TEST(CollectUDCTest, LeavesAProcessAloneThatACollectorStarted) {
  InstallUdc("a", "sleep 60 >/dev/null & echo $!");
  const auto start = std::chrono::steady_clock::now();
  EXPECT_EQ(Collect(), 0);
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(30));
  const int process = Results()["a"].asInt();
  EXPECT_EQ(kill(process, 0), 0);
  kill(process, SIGKILL);
}

TEST(CollectUDCTest, GivesTheCollectorNothingToRead) {
  InstallUdc("a", "cat; echo 1");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": 1})"));
}

// The driver ends the run's child after its time limit. Nothing is delivered or staged then.
TEST(CollectUDCTest, EndsWithTheSignalOfItsDriverWhileACollectorHangs) {
  InstallUdc("a", "touch /volume1/started; exec sleep 60");
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    Collect();
    _exit(0);
  }
  while (!Exists("/volume1/started")) {
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  ASSERT_EQ(kill(child, SIGTERM), 0);
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFSIGNALED(status));
  EXPECT_FALSE(Exists(kResult));
  EXPECT_EQ(Staged(), "");
}

TEST(CollectUDCTest, TakesAFloodThatFitsTheMemory) {
  InstallUdc("a", "printf '\"'; head -c 20000000 /dev/zero | tr '\\0' x; printf '\"'");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results()["a"].asString().size(), 20000000u);
}

#ifndef __SANITIZE_ADDRESS__  // which reserves more memory than the limit below allows
TEST(CollectUDCTest, SendsErrorForAFloodThatDoesNot) {
  InstallUdc("a", "ulimit -v unlimited; exec cat /dev/zero");
  InstallUdc("b", "ulimit -v unlimited; echo 2");
  size_t pages = 0;
  std::ifstream("/proc/self/statm") >> pages;
  rlimit limit = {};
  getrlimit(RLIMIT_AS, &limit);
  limit.rlim_cur = pages * static_cast<size_t>(getpagesize()) + (256 << 20);
  ASSERT_EQ(setrlimit(RLIMIT_AS, &limit), 0);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Results(), Parsed(R"({"a": "Error", "b": 2})"));
  EXPECT_THAT(Log(), LoggedInOrder(NoResultOf("a")));
}
#endif
