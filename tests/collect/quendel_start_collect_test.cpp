// The collection run: what it does, in which order, and what it leaves behind.
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <filesystem>
#include <functional>
#include <stdexcept>

#include "base/paths.h"
#include "collect/archive_entries.h"
#include "collect/collection.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/json.h"
#include "support/log.h"

using namespace quendel::test;
using testing::_;
using testing::Contains;
using testing::Each;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;
using testing::UnorderedElementsAre;

namespace {

constexpr char kUnit[] = "quendel_start_collect";

// What a run's clean-up logs in a caller that SIGTERM does not end, when neither child was started.
testing::Matcher<LogLine> NothingToWaitFor(const std::string& kind) {
  return Logged(kUnit, "Failed to wait a child for " + kind + ", err=No child processes");
}

// Runs a collection that is not sent. Its children get the time they need.
int Collect(int removeAfter = 0) {
  On("sleep").Before(AwaitAnyChild);
  return QUENDELStartCollect(removeAfter, 0, PerfSeries());
}

void WaitLimit(const std::string& seconds) {
  WriteFile("/etc.defaults/arvoinfo.conf",
            "quendel_server=support.test\nquendel_wait_collect_timeout=" + seconds + "\n");
}

// Everything in /tmp that a run makes.
std::vector<std::string> LeftInTmp() {
  std::vector<std::string> left;
  for (const auto& entry : std::filesystem::directory_iterator("/tmp")) {
    const std::string name = entry.path().filename();
    if (name.compare(0, 7, "quendel") == 0) {
      left.push_back(name);
    }
  }
  std::sort(left.begin(), left.end());
  return left;
}

std::vector<std::string> LeftInWorkRoot() {
  std::vector<std::string> left;
  for (const auto& entry : std::filesystem::directory_iterator(quendel::kWorkRoot)) {
    left.push_back(entry.path().filename());
  }
  std::sort(left.begin(), left.end());
  return left;
}

// Runs what fails before both children were started, in a process that lives on after SIGTERM.
Ending RunIgnoringSigterm(const std::function<int()>& run) {
  return InAGroupOfItsOwn([&] {
    signal(SIGTERM, SIG_IGN);
    return run();
  });
}

void ExpectCollected(const std::string& name) {
  const auto entries = ArchiveEntries("/tmp/" + name + ".tar.xz");
  EXPECT_EQ(entries.at(name + "/log/messages"), "first\nsecond\n");
  EXPECT_EQ(JsonOf(entries.at(name + "/udc/udc.result")), JsonOf(R"({"raid":{"disks":4}})"));
  EXPECT_EQ(JsonOf(entries.at(name + "/perf/quendel.perf.Memory")),
            JsonOf(R"([{"time":1,"data":"Memory"}])"));
  EXPECT_EQ(entries.size(), 4U + 1 + 1 + 6);
}

}  // namespace

TEST(GetWaitPIDTimeoutTest, IsTenMinutesUnlessConfigured) {
  EXPECT_EQ(QUENDELGetWaitPIDTimeout(), 600);
}

TEST(GetWaitPIDTimeoutTest, IsTenMinutesWithoutTheSettingsFile) {
  RemoveFile("/etc.defaults/arvoinfo.conf");
  EXPECT_EQ(QUENDELGetWaitPIDTimeout(), 600);
}

TEST(GetWaitPIDTimeoutTest, IsTheConfiguredNumber) {
  WaitLimit("45");
  EXPECT_EQ(QUENDELGetWaitPIDTimeout(), 45);
}

TEST(GetWaitPIDTimeoutTest, IsReadOncePerProcess) {
  WaitLimit("45");
  EXPECT_EQ(QUENDELGetWaitPIDTimeout(), 45);
  WaitLimit("46");
  EXPECT_EQ(QUENDELGetWaitPIDTimeout(), 45);
  EXPECT_EQ(Calls("ALIBCFileGetKeyValue"), 1);
}

TEST(GetWaitPIDTimeoutTest, IsNotReadAgainAfterAFailedRead) {
  RemoveFile("/etc.defaults/arvoinfo.conf");
  EXPECT_EQ(QUENDELGetWaitPIDTimeout(), 600);
  WaitLimit("45");
  EXPECT_EQ(QUENDELGetWaitPIDTimeout(), 600);
  EXPECT_EQ(Calls("ALIBCFileGetKeyValue"), 1);
}

// Every value is read in a process of its own, which is what keeps it.
TEST(GetWaitPIDTimeoutTest, TakesTheDecimalNumberThatTheFirstSevenCharactersBeginWith) {
  const std::vector<std::pair<std::string, int>> limits = {
      {"1", 1},   {"0", 600},          {"-5", 600},           {"soon", 600}, {"", 600},
      {"+7", 7},  {"12 minutes", 12},  {"12345678", 1234567}, {"3.9", 3},    {"0x10", 600},
      {"007", 7}, {"0000000045", 600}, {"9999999", 9999999},
  };
  for (const auto& [text, seconds] : limits) {
    WaitLimit(text);
    EXPECT_EQ(InAGroupOfItsOwn([seconds = seconds] {
                return QUENDELGetWaitPIDTimeout() == seconds ? 0 : -1;
              }).result,
              0)
        << text;
  }
}

TEST(StartCollectTest, LeavesAnArchiveOfWhatIsNew) {
  StopTheClock();
  InstallCollectors();
  EXPECT_EQ(Collect(), 0);
  ExpectCollected(kRunName);
  EXPECT_THAT(LeftInTmp(), ElementsAre("quendel", kRunName, std::string(kRunName) + ".tar.xz"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(StartCollectTest, CommitsWhatItCollected) {
  InstallCollectors();
  EXPECT_EQ(Collect(1), 0);
  EXPECT_THAT(ReadFile("/usr/arvo/etc/quendel/quendel.log.messages"), HasSubstr("total_byte=13\n"));
  EXPECT_THAT(ReadFile("/usr/arvo/etc/quendel/quendel.udc.raid"), Not(HasSubstr("last_hash=\"\"")));
}

TEST(StartCollectTest, LeavesOutWhatAnEarlierRunCommitted) {
  StopTheClock();
  InstallCollectors();
  ASSERT_EQ(Collect(), 0);
  WriteFile("/volume1/messages", "first\nsecond\nthird\n");
  ASSERT_EQ(Collect(), 0);
  const std::string second = "quendel_20240305_070809_1";
  const auto entries = ArchiveEntries("/tmp/" + second + ".tar.xz");
  EXPECT_EQ(entries.at(second + "/log/messages"), "third\n");
  EXPECT_EQ(JsonOf(entries.at(second + "/udc/udc.result")), JsonOf(R"({"raid":"Same"})"));
}

TEST(StartCollectTest, MakesItsDirectoriesForTheOwnerOnly) {
  StopTheClock();
  umask(0);
  ASSERT_EQ(Collect(), 0);
  for (const char* path : {"", "/udc", "/log", "/perf"}) {
    EXPECT_EQ(ModeOf(kRunDir + std::string(path)), S_IFDIR | 0700U) << path;
  }
  EXPECT_EQ(ModeOf(quendel::kWorkRoot), S_IFDIR | 0700U);
}

TEST(StartCollectTest, MakesTheWorkRootWhenItCannotBeTold) {
  On("ALIBCFileCheckDir").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(ModeOf(quendel::kWorkRoot), S_IFDIR | 0700U);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(StartCollectTest, LeavesAWorkRootThatIsThereAsItIs) {
  ASSERT_EQ(mkdir(quendel::kWorkRoot, 0750), 0);
  Record("mkdir");
  ASSERT_EQ(Collect(), 0);
  EXPECT_EQ(ModeOf(quendel::kWorkRoot), S_IFDIR | 0750U);
  EXPECT_THAT(Recorded(), SizeIs(4));
}

TEST(StartCollectTest, ReusesARunDirectoryThatIsThere) {
  StopTheClock();
  InstallCollectors();
  WriteFile(std::string(kRunDir) + "/log/of-before", "1");
  On("ALIBCFileCheckDir").Nth(2).Return(0);  // asked whether the name is taken
  EXPECT_EQ(Collect(), 0);
  const auto entries = ArchiveEntries(kArchive);
  EXPECT_EQ(entries.at(std::string(kRunName) + "/log/of-before"), "1");
  EXPECT_EQ(entries.at(std::string(kRunName) + "/log/messages"), "first\nsecond\n");
}

TEST(StartCollectTest, TakesTheNextNameWhenOneIsTaken) {
  StopTheClock();
  WriteFile(std::string(kRunDir) + "/of-someone", "1");
  EXPECT_EQ(Collect(1), 0);
  EXPECT_THAT(LeftInTmp(), ElementsAre("quendel", kRunName));
}

TEST(StartCollectTest, LeavesItToTheDirectoryWhetherTheNameIsFree) {
  StopTheClock();
  On("ALIBCFileCheckDir").Nth(2).Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_TRUE(Exists(kArchive));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(StartCollectTest, RemovesTheRunDirectoryAndTheArchiveWhenAsked) {
  InstallCollectors();
  EXPECT_EQ(Collect(1), 0);
  EXPECT_THAT(LeftInTmp(), ElementsAre("quendel"));
  EXPECT_THAT(LeftInWorkRoot(), ElementsAre("quendel.log.update.conf", "quendel.udc.update.conf"));
}

TEST(StartCollectTest, TakesAnyNonZeroNumberForYes) {
  StopTheClock();
  EXPECT_EQ(Collect(-1), 0);
  EXPECT_THAT(LeftInTmp(), ElementsAre("quendel"));
}

TEST(StartCollectTest, ForksTheUdcChildAndThenTheLogChild) {
  Record("ALIBCProcForkEx");
  On("sleep").Before([] { EXPECT_LT(ChildOf("udc"), ChildOf("log")); });
  On("QUENDELCollectUDC").Replace(Hang);
  On("QUENDELCollectLog").Replace(Hang);
  WaitLimit("1");
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
  EXPECT_THAT(Recorded(), ElementsAre("187", "187"));
}

TEST(StartCollectTest, MarksItsChildrenWhileTheyRun) {
  int seen = 0;
  On("sleep").Before([&] {
    for (const char* kind : {"udc", "log"}) {
      const std::string marker =
          "/tmp/quendel/" + std::string(kind) + ".p." + std::to_string(ChildOf(kind));
      EXPECT_EQ(ReadFile(marker), "");
      EXPECT_EQ(kill(ChildOf(kind), 0), 0);
    }
    ++seen;
  });
  On("QUENDELCollectUDC").Replace(Hang);
  On("QUENDELCollectLog").Replace(Hang);
  WaitLimit("1");
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
  EXPECT_EQ(seen, 1);
  EXPECT_THAT(LeftInWorkRoot(), IsEmpty());
}

TEST(StartCollectTest, GoesOnWithoutAMarker) {
  InstallCollectors();
  On("ALIBCFileTouch").Return(-1);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, StartsWith("Failed to touch file '/tmp/quendel/udc.p.")),
                          Logged(kUnit, StartsWith("Failed to touch file '/tmp/quendel/log.p."))));
}

TEST(StartCollectTest, TellsWhichMarkerItCannotRemove) {
  On("QUENDELCollectUDC").Replace(EndWhenTold);
  On("QUENDELCollectLog").Replace(EndWhenTold);
  On("sleep").Before([] {
    for (const std::string kind : {"udc", "log"}) {
      if (!Exists("/tmp/end")) {
        const std::string marker = "/tmp/quendel/" + kind + ".p." + std::to_string(ChildOf(kind));
        RemoveFile(marker);
        WriteFile(marker + "/a-folder-now", "");
      }
    }
    WriteFile("/tmp/end", "");
    AwaitAnyChild();
  });
  EXPECT_EQ(QUENDELStartCollect(0, 0, PerfSeries()), 0);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, MatchesRegex("Failed to remove /tmp/quendel/"
                                                            "udc.p.[0-9]+ .errno=39.")),
                                 Logged(kUnit, MatchesRegex("Failed to remove /tmp/quendel/"
                                                            "log.p.[0-9]+ .errno=39."))));
}

TEST(StartCollectTest, SucceedsWhateverBecomesOfTheCollectors) {
  StopTheClock();
  RemoveFile("/usr/arvo/etc/quendel");
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), Contains(Logged(kUnit, "Error occured when child collecting log")));
  EXPECT_THAT(Log(), Contains(Logged(kUnit, "Error occured when child collecting UDC")));
  EXPECT_TRUE(Exists(kArchive));
}

TEST(StartCollectTest, EndsItsChildrenWithStatusZeroWhateverBecameOfThem) {
  for (const char* kind : {"udc", "log"}) {
    On(CollectorOf(kind)).Replace([](const char* directory) { return EndWhenTold(directory) - 1; });
  }
  WaitLimit("1");
  On("sleep").Before([] {
    WriteFile("/tmp/end", "");
    for (const char* kind : {"udc", "log"}) {
      siginfo_t ended = {};
      EXPECT_EQ(waitid(P_PID, static_cast<id_t>(ChildOf(kind)), &ended, WEXITED | WNOWAIT), 0);
      EXPECT_EQ(ended.si_code, CLD_EXITED);
      EXPECT_EQ(ended.si_status, 0);
    }
  });
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
}

TEST(StartCollectTest, GivesEachCollectorItsDirectory) {
  StopTheClock();
  for (const char* kind : {"udc", "log"}) {
    On(CollectorOf(kind)).Replace([](const char* directory) {
      WriteFile(std::string(directory) + "/made-by", directory);
      return 0;
    });
  }
  EXPECT_EQ(Collect(), 0);
  for (const std::string kind : {"udc", "log"}) {
    EXPECT_EQ(ArchiveEntries(kArchive).at(kRunName + ("/" + kind) + "/made-by"),
              kRunDir + ("/" + kind));
  }
}

TEST(StartCollectTest, GivesItsChildrenTheDefaultActionForSigterm) {
  StopTheClock();
  EXPECT_EQ(InAGroupOfItsOwn([] {
              signal(SIGTERM, [](int) {});
              MaskSigterm(SIG_BLOCK);
              for (const char* kind : {"udc", "log"}) {
                On(CollectorOf(kind)).Replace([](const char* directory) {
                  WriteFile(std::string(directory) + "/sigterm", SigtermState());
                  return 0;
                });
              }
              const int result = Collect();
              EXPECT_EQ(SigtermState(), "handled blocked");
              return result;
            }).result,
            0);
  for (const std::string kind : {"udc", "log"}) {
    EXPECT_EQ(ReadFile(kRunDir + ("/" + kind) + "/sigterm"), "default unblocked");
  }
}

TEST(StartCollectTest, LeavesTheCallersSigtermUnblocked) {
  ASSERT_EQ(Collect(), 0);
  EXPECT_EQ(SigtermState(), "default unblocked");
}

TEST(StartCollectTest, GoesOnWhenAChildCannotSetItsActionForSigterm) {
  StopTheClock();
  On("signal").Nth(1).Return(-1, EINVAL);
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(
      Log(),
      UnorderedElementsAre(
          Logged(kUnit, "Failed to setup signal handler for udc collector: Invalid argument"),
          Logged(kUnit, "Failed to setup signal handler for log collector: Invalid argument")));
}

TEST(StartCollectTest, GivesItsChildrenNothingToRead) {
  StopTheClock();
  On("QUENDELCollectUDC").Replace([](const char* directory) {
    WriteFile(std::string(directory) + "/input", std::filesystem::read_symlink("/proc/self/fd/0"));
    return 0;
  });
  int ends[2];
  ASSERT_EQ(pipe(ends), 0);
  ASSERT_EQ(dup2(ends[0], STDIN_FILENO), STDIN_FILENO);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(ReadFile(std::string(kRunDir) + "/udc/input"), "/dev/null");
}

TEST(StartCollectTest, KeepsAnExceptionInsideTheChild) {
  StopTheClock();
  EXPECT_EQ(InAGroupOfItsOwn([] {
              On("QUENDELCollectLog").Replace([](const char*) -> int {
                throw std::runtime_error("lost");
              });
              try {
                return Collect();
              } catch (...) {
                WriteFile("/tmp/escaped", "");
                _exit(1);
              }
            }).result,
            0);
  EXPECT_FALSE(Exists("/tmp/escaped"));
  EXPECT_TRUE(Exists(kArchive));
}

TEST(StartCollectTest, RunsNothingOfTheCallersWhenAChildEnds) {
  EXPECT_EQ(InAGroupOfItsOwn([] {
              atexit([] { WriteFile("/tmp/exit-ran", ""); });
              return Collect();
            }).result,
            0);
  EXPECT_FALSE(Exists("/tmp/exit-ran"));
}

TEST(StartCollectTest, GoesOnWhenTheSeriesCannotBeWritten) {
  StopTheClock();
  InstallCollectors();
  WriteFile(std::string(kRunDir) + "/perf", "no directory");
  On("ALIBCFileCheckDir").Nth(2).Return(0);  // asked whether the name is taken
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(Log(), SizeIs(13));
  EXPECT_THAT(Log(), Contains(Logged(kUnit, "Error occured when parse perf data")));
  EXPECT_EQ(ArchiveEntries(kArchive).count(std::string(kRunName) + "/log/messages"), 1U);
}

TEST(StartCollectTest, WritesTheSeriesWhileItsChildrenRun) {
  StopTheClock();
  WaitLimit("1");
  On("QUENDELCollectUDC").Replace(Hang);
  On("QUENDELCollectLog").Replace(Hang);
  bool seen = false;
  On("sleep").Before([&] { seen = Exists(std::string(kRunDir) + "/perf/quendel.perf.Memory"); });
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
  EXPECT_TRUE(seen);
}

TEST(StartCollectTest, WritesNoSeriesBeforeItHasBothChildren) {
  for (const int nth : {1, 2}) {
    RemoveFile(kRunDir);
    const Ending ending = RunIgnoringSigterm([nth] {
      StopTheClock();
      On("ALIBCProcForkEx").Nth(nth).Return(-1);
      return Collect();
    });
    EXPECT_EQ(ending.result, -1);
    EXPECT_TRUE(Exists(std::string(kRunDir) + "/perf"));
    EXPECT_FALSE(Exists(std::string(kRunDir) + "/perf/quendel.perf.Memory")) << nth;
  }
}

TEST(StartCollectTest, TakesAnyKindOfSeries) {
  StopTheClock();
  On("sleep").Before(AwaitAnyChild);
  EXPECT_EQ(QUENDELStartCollect(0, 0, JsonOf("[\"no\",\"series\"]")), 0);
  EXPECT_EQ(ReadFile(std::string(kRunDir) + "/perf/quendel.perf.System"), "null");
}

TEST(StartCollectTest, WaitsNoLongerThanItsChildrenTake) {
  On("QUENDELCollectUDC").Replace(DoNothing);
  On("QUENDELCollectLog").Replace(DoNothing);
  EXPECT_EQ(Collect(), 0);
  EXPECT_LE(SleptSeconds(), 2);
}

TEST(StartCollectTest, GivesItsChildrenTheConfiguredTime) {
  WaitLimit("5");
  On("QUENDELCollectUDC").Replace(Hang);
  On("QUENDELCollectLog").Replace(DoNothing);
  On("sleep").Before([] { AwaitChild("log"); });
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
  EXPECT_EQ(SleptSeconds(), 5);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Timeout when wait child done")));
  EXPECT_THAT(LeftInTmp(), ElementsAre("quendel"));
}

TEST(StartCollectTest, CountsAChildThatEndsInTheLastSecondAsTooLate) {
  InstallCollectors();
  WaitLimit("1");
  On("QUENDELCollectUDC").Replace(EndWhenTold);
  const auto before = CollectorConf();
  On("sleep").Before([] {
    WriteFile("/tmp/end", "");
    AwaitChild("udc");
    AwaitChild("log");
  });
  EXPECT_EQ(QUENDELStartCollect(0, 0, PerfSeries()), -1);
  EXPECT_EQ(SleptSeconds(), 1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Timeout when wait child done")));
  EXPECT_EQ(CollectorConf(), before);
}

TEST(StartCollectTest, CountsOnlySecondsSlept) {
  WaitLimit("2");
  On("QUENDELCollectUDC").Replace(EndWhenTold);
  On("QUENDELCollectLog").Replace(EndWhenTold);
  On("sleep").Before([] {
    WriteFile("/tmp/end", "");
    AwaitChild("udc");
    AwaitChild("log");
  });
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), 0);
  EXPECT_EQ(SleptSeconds(), 1);
}

TEST(StartCollectTest, EndsAChildThatTookTooLong) {
  WaitLimit("1");
  On("QUENDELCollectUDC").Replace(Hang);
  On("QUENDELCollectLog").Replace(Hang);
  pid_t udc = 0;
  pid_t log = 0;
  On("sleep").Before([&] {
    udc = ChildOf("udc");
    log = ChildOf("log");
  });
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
  EXPECT_EQ(kill(udc, 0), -1);
  EXPECT_EQ(kill(log, 0), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Timeout when wait child done")));
}

TEST(StartCollectTest, EndsAChildOfACallerThatIgnoresOrBlocksSigterm) {
  WaitLimit("1");
  const Ending ending = RunIgnoringSigterm([] {
    MaskSigterm(SIG_BLOCK);
    On("QUENDELCollectUDC").Replace(Hang);
    On("QUENDELCollectLog").Replace(Hang);
    return QUENDELStartCollect(1, 0, PerfSeries());
  });
  EXPECT_EQ(ending.result, -1);
  EXPECT_EQ(ending.signal, 0);
  EXPECT_FALSE(ending.group_got_sigterm);
}

// A user-defined collector that keeps its child busy for longer than the run waits.
TEST(StartCollectTest, WaitsForNoUserDefinedCollectorBeyondTheLimit) {
  const std::vector<std::string> scripts = {
      "touch /tmp/started; exec sleep 1000",                    // hangs
      "trap '' TERM; touch /tmp/started; exec sleep 1000",      // and ignores SIGTERM
      "touch /tmp/started; exec yes",                           // floods
      "exec >&-; touch /tmp/started; exec sleep 1000",          // closes its output early
      "sleep 1000 & touch /tmp/started; echo '{\"disks\":4}'",  // leaves its output to another
  };
  for (const std::string& script : scripts) {
    InstallCollectors(script);
    const auto before = CollectorConf();
    RemoveFile("/tmp/started");
    ClearLog();
    const Ending ending = InAGroupOfItsOwn([] {
      WaitLimit("1");
      On("sleep").Before([] {
        while (!Exists("/tmp/started")) {
          usleep(1000);
        }
      });
      return QUENDELStartCollect(1, 0, PerfSeries());
    });
    EXPECT_EQ(ending.result, -1) << script;
    EXPECT_FALSE(ending.group_got_sigterm);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Timeout when wait child done"))) << script;
    EXPECT_EQ(CollectorConf(), before);
  }
}

TEST(StartCollectTest, GoesOnWhenAUserDefinedCollectorDies) {
  StopTheClock();
  InstallCollectors("kill -9 $$");
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(ArchiveEntries(kArchive).at(std::string(kRunName) + "/log/messages"),
            "first\nsecond\n");
}

TEST(StartCollectTest, WaitsForNothingThatACollectorLeavesBehind) {
  StopTheClock();
  InstallCollectors("sleep 1000 >/dev/null & echo '{\"disks\":4}'");
  EXPECT_EQ(Collect(), 0);
  ExpectCollected(kRunName);
}

TEST(StartCollectTest, ReportsAStoppedChildAndGoesOn) {
  WaitLimit("1");
  On("QUENDELCollectUDC").Replace(Hang);
  pid_t udc = 0;
  On("sleep").Before([&] {
    udc = ChildOf("udc");
    siginfo_t stopped;
    ASSERT_EQ(kill(udc, SIGSTOP), 0);
    ASSERT_EQ(waitid(P_PID, static_cast<id_t>(udc), &stopped, WSTOPPED | WNOWAIT), 0);
  });
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Timeout when wait child done"),
                                 Logged(kUnit, std::to_string(udc) + " status " +
                                                   std::to_string(W_STOPCODE(SIGSTOP)))));
}

TEST(StartCollectTest, CountsAChildThatDiedAsFinished) {
  StopTheClock();
  InstallCollectors();
  On("QUENDELCollectUDC").Replace(Die);
  EXPECT_EQ(Collect(), 0);
  const auto entries = ArchiveEntries(kArchive);
  EXPECT_EQ(entries.count(std::string(kRunName) + "/udc/udc.result"), 0U);
  EXPECT_EQ(entries.at(std::string(kRunName) + "/log/messages"), "first\nsecond\n");
}

// Whether the children die at once, or leave out what they do first.
TEST(StartCollectTest, NeverCommitsWhatAnOlderRunStaged) {
  InstallCollectors();
  const auto before = CollectorConf();
  for (int (*collect)(const char*) : {Die, DoNothing}) {
    WriteFile(quendel::kLogUpdateFile,
              "[/usr/arvo/etc/quendel/quendel.log.messages]\ntotal_byte=999\n");
    WriteFile(quendel::kUdcUpdateFile, "[/usr/arvo/etc/quendel/quendel.udc.raid]\nlast_hash=999\n");
    On("QUENDELCollectUDC").Replace(collect);
    On("QUENDELCollectLog").Replace(collect);
    EXPECT_EQ(Collect(1), 0);
    EXPECT_EQ(CollectorConf(), before);
    EXPECT_THAT(Log(), IsEmpty());
  }
}

TEST(StartCollectTest, NeverCommitsResultsThatAKilledChildHadNoTimeToWrite) {
  InstallCollectors();
  const auto before = CollectorConf();
  On("QUENDELCollectUDC").Replace([](const char* directory) {
    WriteFile(quendel::kUdcUpdateFile, "[/usr/arvo/etc/quendel/quendel.udc.raid]\nlast_hash=1\n");
    return Die(directory);
  });
  On("QUENDELCollectLog").Replace(DoNothing);
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(CollectorConf(), before);
}

TEST(StartCollectTest, CommitsTheLogsThatAKilledChildHadFinished) {
  InstallCollectors();
  On("QUENDELCollectUDC").Replace(DoNothing);
  On("QUENDELCollectLog").Replace([](const char* directory) {
    WriteFile(quendel::kLogUpdateFile,
              "[/usr/arvo/etc/quendel/quendel.log.messages]\ntotal_byte=6\n");
    return Die(directory);
  });
  EXPECT_EQ(Collect(), 0);
  EXPECT_THAT(ReadFile("/usr/arvo/etc/quendel/quendel.log.messages"), HasSubstr("total_byte=6\n"));
}

TEST(StartCollectTest, FailsWhenAChildOfTheCallerEndsMeanwhile) {
  InstallCollectors();
  const auto before = CollectorConf();
  const Ending ending = InAGroupOfItsOwn([] {
    On("QUENDELCollectUDC").Replace(Hang);
    On("QUENDELCollectLog").Replace(Hang);
    if (fork() == 0) {
      setsid();  // even one that is not of the caller's group any more
      _exit(7);
    }
    return Collect();
  });
  EXPECT_EQ(ending.result, -1);
  EXPECT_FALSE(ending.group_got_sigterm);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Error happened when wait all children done")));
  EXPECT_EQ(CollectorConf(), before);
}

TEST(StartCollectTest, FailsWhenTheCallerIgnoresTheEndOfChildren) {
  const Ending ending = InAGroupOfItsOwn([] {
    signal(SIGCHLD, SIG_IGN);
    return Collect();
  });
  EXPECT_EQ(ending.result, -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Error happened when wait all children done")));
}

TEST(StartCollectTest, LeavesOtherChildrenOfTheCallerAlone) {
  const Ending ending = InAGroupOfItsOwn([] {
    const pid_t other = fork();
    if (other == 0) {
      Hang(nullptr);
    }
    On("QUENDELCollectUDC").Replace(DoNothing);
    On("QUENDELCollectLog").Replace(DoNothing);
    const int result = Collect();
    EXPECT_EQ(waitpid(other, nullptr, WNOHANG), 0);
    kill(other, SIGKILL);
    return result;
  });
  EXPECT_EQ(ending.result, 0);
}

TEST(StartCollectTest, ProbesItsChildrenAndNobodyElseAfterward) {
  Record("kill");
  pid_t udc = 0;
  pid_t log = 0;
  On("sleep").Before([&] {
    udc = ChildOf("udc");
    log = ChildOf("log");
    AwaitAnyChild();
  });
  On("QUENDELCollectLog").Replace([](const char*) { return usleep(100000); });
  ASSERT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), 0);
  EXPECT_THAT(Recorded(), ElementsAre(std::to_string(udc) + "|0", std::to_string(log) + "|0"));
}

TEST(StartCollectTest, TellsWhichChildItCannotSignal) {
  WaitLimit("1");
  for (const char* kind : {"udc", "log"}) {
    On(CollectorOf(kind)).Replace(EndWhenTold);
  }
  On("kill").Nth(2).Return(-1, EPERM);  // the first is the probe
  pid_t udc = 0;
  On("sleep").Before([&] {
    udc = ChildOf("udc");
    if (fork() == 0) {
      while (Log().size() < 2) {
        usleep(1000);
      }
      WriteFile("/tmp/end", "");
      _exit(0);
    }
  });
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
  EXPECT_EQ(waitpid(udc, nullptr, WNOHANG), -1) << "it was not waited for";
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Timeout when wait child done"),
                                 Logged(kUnit, "Failed to kill a child for udc")));
}

TEST(StartCollectTest, SignalsTheCallersGroupWhenItFailsBeforeItHasChildren) {
  const Ending ending = InAGroupOfItsOwn([] {
    On("time").Nth(1).Return(-1);
    return Collect();
  });
  EXPECT_EQ(ending.signal, SIGTERM);
  EXPECT_TRUE(ending.group_got_sigterm);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get current time")));
}

TEST(StartCollectTest, CleansUpInACallerThatSurvivesTheSignal) {
  const Ending ending = RunIgnoringSigterm([] {
    On("time").Nth(1).Return(-1);
    Record("kill");
    const int result = Collect(1);
    EXPECT_THAT(Recorded(), ElementsAre("0|0", "0|15", "0|0", "0|15"));
    return result;
  });
  EXPECT_EQ(ending.result, -1);
  EXPECT_EQ(ending.signal, 0);
  EXPECT_TRUE(ending.group_got_sigterm);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get current time"),
                                 NothingToWaitFor("udc"), NothingToWaitFor("log")));
}

TEST(StartCollectTest, EndsAndReapsAChildOfTheCallersGroup) {
  const Ending ending = RunIgnoringSigterm([] {
    On("time").Nth(1).Return(-1);
    // The child starts with its action set, and misses no signal.
    MaskSigterm(SIG_BLOCK);
    signal(SIGTERM, SIG_DFL);
    const pid_t other = fork();
    if (other == 0) {
      MaskSigterm(SIG_UNBLOCK);
      Hang(nullptr);
    }
    signal(SIGTERM, SIG_IGN);
    MaskSigterm(SIG_UNBLOCK);
    const int result = Collect();
    EXPECT_EQ(kill(other, 0), -1);
    return result;
  });
  EXPECT_EQ(ending.result, -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to get current time"), NothingToWaitFor("log")));
}

// A caller that SIGTERM ends does not come to the rest of the clean-up.
TEST(StartCollectTest, LeavesItsFilesToTheParentOfACallerThatTheSignalEnds) {
  StopTheClock();
  InstallCollectors();
  const auto before = CollectorConf();
  const Ending ending = InAGroupOfItsOwn([] {
    On("mkdir").Nth(3).Return(-1, ENOSPC);
    return Collect(1);
  });
  EXPECT_EQ(ending.signal, SIGTERM);
  EXPECT_TRUE(Exists(kRunDir));
  EXPECT_THAT(LeftInWorkRoot(), IsEmpty());
  EXPECT_EQ(CollectorConf(), before);
}

TEST(StartCollectTest, LeavesAMarkerToTheParentOfACallerThatTheSignalEnds) {
  StopTheClock();
  InstallCollectors();
  const auto before = CollectorConf();
  const Ending ending = InAGroupOfItsOwn([] {
    On("ALIBCProcForkEx").Nth(2).Return(-1);
    On("QUENDELCollectUDC").Replace(Hang);
    return Collect(1);
  });
  EXPECT_EQ(ending.signal, SIGTERM);
  EXPECT_TRUE(Exists(kRunDir));
  EXPECT_THAT(LeftInWorkRoot(), ElementsAre(StartsWith("udc.p.")));
  EXPECT_EQ(kill(ChildOf("udc"), 0), -1) << "the child it names has ended";
  EXPECT_EQ(CollectorConf(), before);
}

TEST(StartCollectTest, FailsWhenADirectoryCannotBeMade) {
  const std::vector<std::pair<std::string, std::string>> directories = {
      {"UDC", quendel::kWorkRoot},
      {"quendel", kRunDir},
      {"UDC", kRunDir + std::string("/udc")},
      {"log", kRunDir + std::string("/log")},
      {"perf", kRunDir + std::string("/perf")},
  };
  for (size_t i = 0; i < directories.size(); ++i) {
    RemoveFile(kRunDir);
    RemoveFile(quendel::kWorkRoot);
    ClearLog();
    const Ending ending = RunIgnoringSigterm([i] {
      StopTheClock();
      On("mkdir").Nth(static_cast<int>(i) + 1).Return(-1, EACCES);
      const int result = Collect();
      EXPECT_EQ(Calls("ALIBCProcForkEx"), 0);
      return result;
    });
    EXPECT_EQ(ending.result, -1);
    EXPECT_TRUE(ending.group_got_sigterm);
    const auto& [what, path] = directories[i];
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to create " + what + " collect dir '" +
                                                     path + "'"),
                                   NothingToWaitFor("udc"), NothingToWaitFor("log")));
  }
}

TEST(StartCollectTest, RefusesAFileInTheWorkRootsPlace) {
  WriteFile(quendel::kWorkRoot, "");
  EXPECT_EQ(RunIgnoringSigterm([] { return Collect(); }).result, -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to create UDC collect dir '/tmp/quendel'"),
                                 NothingToWaitFor("udc"), NothingToWaitFor("log")));
}

TEST(StartCollectTest, FailsWithoutAUdcChild) {
  const Ending ending = RunIgnoringSigterm([] {
    On("ALIBCProcForkEx").Nth(1).Return(-1);
    return Collect();
  });
  EXPECT_EQ(ending.result, -1);
  EXPECT_TRUE(ending.group_got_sigterm);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to fork a child to collect udc"),
                                 Logged(kUnit, "Failed to collect UDC"), NothingToWaitFor("udc"),
                                 NothingToWaitFor("log")));
}

TEST(StartCollectTest, EndsTheUdcChildWhenThereIsNoLogChild) {
  const Ending ending = RunIgnoringSigterm([] {
    On("ALIBCProcForkEx").Nth(2).Return(-1);
    On("QUENDELCollectUDC").Replace(Hang);
    return Collect();
  });
  EXPECT_EQ(ending.result, -1);
  EXPECT_TRUE(ending.group_got_sigterm);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to fork a child to collect log"),
                                 Logged(kUnit, "Failed to collect logs"), NothingToWaitFor("log")));
  EXPECT_THAT(LeftInWorkRoot(), IsEmpty());
}

// The signal comes before the child has set its action for it, more often than not.
TEST(StartCollectTest, EndsAChildThatHasHardlyBegun) {
  for (int i = 0; i < 20; ++i) {
    const Ending ending = RunIgnoringSigterm([] {
      On("ALIBCProcForkEx").Nth(2).Return(-1);
      On("QUENDELCollectUDC").Replace(Hang);
      return Collect();
    });
    ASSERT_EQ(ending.signal, 0);
    ASSERT_EQ(ending.result, -1);
  }
}

TEST(StartCollectTest, FailsWhenTheDirectoryCannotBePacked) {
  StopTheClock();
  InstallCollectors();
  On("ALIBCExecl").Nth(1).Return(2);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_tar_collect_data",
                                        "Failed to tar '" + std::string(kRunDir) + "'")));
}

TEST(StartCollectTest, NeverContactsTheServerUnlessAsked) {
  InstallCollectors();
  const auto before = CollectorConf();
  EXPECT_EQ(Collect(), 0);
  EXPECT_EQ(Calls("gethostbyname"), 0);
  EXPECT_EQ(Calls("socket"), 0);
  EXPECT_EQ(Calls("curl_easy_init"), 0);
  EXPECT_NE(CollectorConf(), before);
}

TEST(StartCollectTest, FailsWhenTheLogsStateCannotBeCommitted) {
  InstallCollectors();
  const auto before = CollectorConf();
  On("ALIBCFileEnumSection").Nth(1).Return(-1);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_update_conf", _),
                                 Logged(kUnit, "Failed to update log config")));
  EXPECT_EQ(CollectorConf(), before);
}

TEST(StartCollectTest, FailsWhenTheUserDefinedCollectorsStateCannotBeCommitted) {
  InstallCollectors();
  const auto before = CollectorConf();
  On("ALIBCFileEnumSection").Nth(2).Return(-1);
  EXPECT_EQ(Collect(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_update_conf", _),
                                 Logged(kUnit, "Failed to update udc config")));
  const char* udc = "/usr/arvo/etc/quendel/quendel.udc.raid";
  EXPECT_EQ(CollectorConf().at(udc), before.at(udc));
  EXPECT_NE(CollectorConf(), before);
}

TEST(StartCollectTest, SucceedsWhenTheRunDirectoryCannotBeRemoved) {
  StopTheClock();
  On("ALIBCopyRemoveDir").Nth(1).Return(-1, EBUSY);
  EXPECT_EQ(Collect(1), 0);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Error happened when remove " + std::string(kRunDir) +
                                            ", errno:16 [Device or resource busy]")));
  EXPECT_FALSE(Exists(kArchive));
}

TEST(StartCollectTest, TellsWhenTheArchiveCannotBeRemoved) {
  StopTheClock();
  WriteFile(std::string(kArchive) + "/in-its-place", "");
  EXPECT_EQ(Collect(1), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_tar_collect_data", _),
                                 Logged(kUnit, "Failed to remove " + std::string(kArchive) +
                                                   " [errno=39]")));
  EXPECT_FALSE(Exists(kRunDir));
}

// Each step of the clean-up has something to tell.
TEST(StartCollectTest, CleansUpInItsOrder) {
  StopTheClock();
  WaitLimit("1");
  WriteFile(std::string(kArchive) + "/in-its-place", "");
  On("ALIBCopyRemoveDir").Nth(1).Return(-1, EBUSY);
  std::vector<testing::Matcher<LogLine>> stopped;
  std::vector<testing::Matcher<LogLine>> marked;
  On("sleep").Before([&] {
    for (const std::string kind : {"udc", "log"}) {
      const pid_t child = ChildOf(kind);
      const std::string marker = "/tmp/quendel/" + kind + ".p." + std::to_string(child);
      siginfo_t ended;
      ASSERT_EQ(kill(child, SIGSTOP), 0);
      ASSERT_EQ(waitid(P_PID, static_cast<id_t>(child), &ended, WSTOPPED | WNOWAIT), 0);
      RemoveFile(marker);
      WriteFile(marker + "/a-folder-now", "");
      stopped.push_back(
          Logged(kUnit, std::to_string(child) + " status " + std::to_string(W_STOPCODE(SIGSTOP))));
      marked.push_back(Logged(kUnit, "Failed to remove " + marker + " [errno=39]"));
    }
  });
  On("QUENDELCollectUDC").Replace(Hang);
  On("QUENDELCollectLog").Replace(Hang);
  EXPECT_EQ(QUENDELStartCollect(1, 0, PerfSeries()), -1);
  ASSERT_THAT(stopped, SizeIs(2));
  EXPECT_THAT(
      Log(),
      ElementsAre(Logged(kUnit, "Timeout when wait child done"), stopped[0], stopped[1], marked[0],
                  marked[1],
                  Logged(kUnit, "Error happened when remove " + std::string(kRunDir) +
                                    ", errno:16 [Device or resource busy]"),
                  Logged(kUnit, "Failed to remove " + std::string(kArchive) + " [errno=39]")));
}

// Whatever ends a run before its archive is made, the next run finds the same to collect.
TEST(StartCollectTest, LeavesNoTraceOfARunThatFailed) {
  InstallCollectors();
  const auto before = CollectorConf();
  const std::vector<std::function<void()>> faults = {
      [] { On("mkdir").Nth(1).Return(-1, ENOSPC); },
      [] { On("mkdir").Nth(2).Return(-1, ENOSPC); },
      [] { On("mkdir").Nth(3).Return(-1, ENOSPC); },
      [] { On("mkdir").Nth(4).Return(-1, ENOSPC); },
      [] { On("time").Nth(1).Return(-1); },
      [] { On("ALIBCProcForkEx").Nth(1).Return(-1); },
      [] { On("ALIBCProcForkEx").Nth(2).Return(-1); },
      [] { On("waitpid").Nth(1).Return(-1, ECHILD); },
      [] { On("waitpid").Nth(1).Return(999999); },
      [] {
        WaitLimit("1");
        On("QUENDELCollectUDC").Replace(Hang);
      },
      [] { On("ALIBCExecl").Nth(1).Return(-1); },
      [] { On("ALIBCExecl").Nth(1).Return(2); },
      [] { On("ALIBCFileEnumSection").Nth(1).Return(-1); },
  };
  for (size_t i = 0; i < faults.size(); ++i) {
    const Ending ending = RunIgnoringSigterm([&] {
      On("sleep").Before([] { AwaitChild("log"); });
      faults[i]();
      return QUENDELStartCollect(1, 0, PerfSeries());
    });
    EXPECT_EQ(ending.result, -1) << i;
    EXPECT_EQ(CollectorConf(), before) << i;
    EXPECT_THAT(LeftInTmp(), Each("quendel")) << i;
  }
  WaitLimit("600");
  StopTheClock();
  EXPECT_EQ(Collect(), 0);
  ExpectCollected(kRunName);
}

// What could not be written whole is not counted as collected, however little room there is.
TEST(StartCollectTest, LosesNothingToAFullDisk) {
  InstallCollectors();
  std::string noise;  // which xz cannot make much smaller
  for (unsigned int i = 1, seed = 1; i <= 150000; ++i) {
    seed = seed * 1103515245 + 12345;
    noise.push_back(i % 100 == 0 ? '\n' : static_cast<char>(' ' + (seed >> 16) % 94));
  }
  WriteFile("/volume1/messages", noise);
  const std::string log = "/usr/arvo/etc/quendel/quendel.log.messages";
  const std::string udc = "/usr/arvo/etc/quendel/quendel.udc.raid";
  const auto before = CollectorConf();
  int failures = 0;
  int partial = 0;
  for (int kibibytes = 4; kibibytes < 320; kibibytes += 12) {
    const std::string options = "size=" + std::to_string(kibibytes) + "k";
    ASSERT_EQ(mount("tmpfs", "/tmp", "tmpfs", 0, options.c_str()), 0);
    StopTheClock();
    const bool collected = RunIgnoringSigterm([] { return Collect(); }).result == 0;
    const auto after = CollectorConf();
    const auto entries =
        collected ? ArchiveEntries(kArchive) : std::map<std::string, std::string>();
    if (after.at(log) != before.at(log)) {
      EXPECT_TRUE(entries.at(std::string(kRunName) + "/log/messages") == noise) << kibibytes;
    }
    if (after.at(udc) != before.at(udc)) {
      EXPECT_EQ(JsonOf(entries.at(std::string(kRunName) + "/udc/udc.result")),
                JsonOf(R"({"raid":{"disks":4}})"))
          << kibibytes;
    }
    failures += collected ? 0 : 1;
    partial += collected && after.at(log) == before.at(log) ? 1 : 0;
    for (const auto& [path, text] : before) {
      WriteFile(path, text);
    }
    ASSERT_EQ(umount2("/tmp", MNT_DETACH), 0);
    ASSERT_FALSE(testing::Test::HasFailure()) << kibibytes;
  }
  EXPECT_GT(failures, 0);  // the archive did not fit
  EXPECT_GT(partial, 0);   // the log did not, and the archive of the rest did
  EXPECT_EQ(Collect(), 0);
  EXPECT_NE(CollectorConf().at(log), before.at(log));
}
