// A run that is killed alone, with no time to clean up. Its children must stage nothing for the
// next run, which starts at once and would commit it: the lines behind that are lost.
#include <gmock/gmock.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <random>

#include "base/paths.h"
#include "collect/archive_entries.h"
#include "collect/collection.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::Contains;
using testing::IsEmpty;
using testing::Not;

namespace {

namespace fs = std::filesystem;

// Waits at most ten seconds. A kill has its effect much sooner.
bool Await(const std::function<bool()>& holds) {
  for (int i = 0; i < 10000 && !holds(); ++i) {
    usleep(1000);
  }
  return holds();
}

bool IsGone(pid_t process) {
  return kill(process, 0) == -1;
}

int RunToItsEnd() {
  On("sleep").Before(AwaitAnyChild);
  return QUENDELStartCollect(0, 0, Json::Value());
}

// A run in a process of its own.
pid_t StartRun(const std::function<void()>& prepare = [] {}) {
  const pid_t run = fork();
  if (run == 0) {
    setsid();
    prepare();
    _exit(RunToItsEnd() == 0 ? 0 : 1);
  }
  return run;
}

void Kill(pid_t run) {
  EXPECT_EQ(kill(run, SIGKILL), 0);
  EXPECT_EQ(waitpid(run, nullptr, 0), run);
}

struct Children {
  pid_t udc = 0;
  pid_t log = 0;
};

Children AwaitChildren() {
  EXPECT_TRUE(Await([] { return fs::exists(quendel::kWorkRoot) && ChildOf("log") != 0; }));
  return {ChildOf("udc"), ChildOf("log")};
}

bool AreGone(const Children& children) {
  return Await([&] { return IsGone(children.udc) && IsGone(children.log); });
}

void AwaitOrphanhood(pid_t parent) {
  while (getppid() == parent) {
    usleep(1000);
  }
}

}  // namespace

TEST(KilledRunTest, TakesItsChildrenAlong) {
  InstallCollectors("while [ ! -e /tmp/end ]; do sleep 0.01; done");
  const pid_t run = StartRun([] { On("QUENDELCollectLog").Replace(Hang); });
  const Children children = AwaitChildren();
  Kill(run);
  EXPECT_TRUE(AreGone(children));
  WriteFile("/tmp/end", "");
}

TEST(KilledRunTest, LeavesNothingToChildrenThatHaveHardlyBegun) {
  StopTheClock();
  InstallCollectors();
  const pid_t run = StartRun([] {
    On("prctl")
        .With(PR_SET_PDEATHSIG)
        .Before([parent = getpid()] { AwaitOrphanhood(parent); })
        .Return(0);
  });
  const Children children = AwaitChildren();
  Kill(run);
  EXPECT_TRUE(AreGone(children));
  EXPECT_FALSE(Exists(std::string(kRunDir) + "/udc/udc.result"));
  EXPECT_FALSE(Exists(std::string(kRunDir) + "/log/messages"));
  EXPECT_THAT(Log(), IsEmpty());
}

// The signal does not come, as between two looks at the clock of a busy machine.
TEST(KilledRunTest, LetsNoChildStageForAnotherRun) {
  InstallCollectors();
  const pid_t run = StartRun([] {
    On("prctl").With(PR_SET_PDEATHSIG).Return(0);
    for (const std::string kind : {"udc", "log"}) {
      On(CollectorOf(kind)).Before([kind, parent = getpid()] {
        WriteFile("/tmp/begun-" + kind, "");
        AwaitOrphanhood(parent);
      });
    }
  });
  EXPECT_TRUE(Await([] { return Exists("/tmp/begun-udc") && Exists("/tmp/begun-log"); }));
  const Children children = AwaitChildren();
  WriteFile(quendel::kLogUpdateFile, "of another run");
  WriteFile(quendel::kUdcUpdateFile, "of another run");
  Kill(run);
  EXPECT_TRUE(AreGone(children));
  EXPECT_EQ(ReadFile(quendel::kLogUpdateFile), "of another run");
  EXPECT_EQ(ReadFile(quendel::kUdcUpdateFile), "of another run");
  EXPECT_THAT(Log(), Contains(Logged("quendel_collect_log",
                                     "Failed to add new section to "
                                     "'/tmp/quendel/quendel.log.update.conf'")));
  EXPECT_THAT(Log(), Contains(Logged("quendel_collect_udc",
                                     "Failed to add new section to "
                                     "'/tmp/quendel/quendel.udc.update.conf'")));
}

TEST(KilledRunTest, LeavesTheProgramsOfItsCollectorsAlone) {
  InstallCollectors(
      "touch /tmp/begun; while [ ! -e /tmp/end ]; do sleep 0.01; done; touch /tmp/ended");
  const pid_t run = StartRun();
  const Children children = AwaitChildren();
  EXPECT_TRUE(Await([] { return Exists("/tmp/begun"); }));
  Kill(run);
  EXPECT_TRUE(AreGone(children));
  WriteFile("/tmp/end", "");
  EXPECT_TRUE(Await([] { return Exists("/tmp/ended"); }));
}

// ---- A hundred runs that are killed, each with the next one right behind it.

namespace {

constexpr int kKills = 100;
constexpr int kLogs = 8;

std::string LogPath(int log) {
  return "/volume1/log" + std::to_string(log);
}

std::string ConfPath(int log) {
  return "/usr/arvo/etc/quendel/quendel.log." + std::to_string(log);
}

void Append(int log, const std::string& line) {
  std::ofstream(LogPath(log), std::ios::app) << line << "\n";
}

// Logs that grow all the time, and a collector that is slow and never prints the same.
void InstallSlowCollectors() {
  InstallCollectors("sleep 0.0$((RANDOM % 10)); date +%s%N");
  WriteFile("/volume1/raid", "#!/bin/bash\n" + ReadFile("/volume1/raid"));
  RemoveFile("/usr/arvo/etc/quendel/quendel.log.messages");
  for (int log = 0; log < kLogs; ++log) {
    Append(log, "the first line of log " + std::to_string(log));
    WriteFile(ConfPath(log), "name=" + std::to_string(log) + "\npath=" + LogPath(log) +
                                 "\nlast_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\n"
                                 "total_byte=\"\"\ninode=\"\"\n");
  }
}

std::string ValueOf(const std::string& conf, const std::string& key) {
  const std::string text = ReadFile(conf);
  const size_t begin = text.find("\n" + key + "=") + key.size() + 2;
  return text.substr(begin, text.find('\n', begin) - begin);
}

// Each process has delays of its own.
void StageSlowly() {
  On("ALIBCFileAddSection").Before([] {
    static std::minstd_rand random(static_cast<unsigned>(getpid()));
    usleep(static_cast<useconds_t>(random() % 20000));
  });
}

// Nothing is packed, and so nothing committed, by a run that is to be killed.
void StageSlowlyAndNeverPack() {
  StageSlowly();
  On("ALIBCExecl").Before([] { Hang(nullptr); });
}

int RunWhileLogsGrow(int round) {
  const pid_t run = StartRun(StageSlowly);
  int status = 0;
  for (int line = 0; waitpid(run, &status, WNOHANG) == 0; ++line) {
    for (int log = 0; log < kLogs; ++log) {
      Append(log, "line " + std::to_string(round) + "." + std::to_string(line));
    }
    usleep(2000);
  }
  return status;
}

std::map<std::string, std::string> TakeArchive() {
  std::map<std::string, std::string> entries;
  for (const auto& entry : fs::directory_iterator("/tmp")) {
    if (entry.path().extension() == ".xz" && entry.file_size() > 0) {
      for (const auto& [name, text] : ArchiveEntries(entry.path())) {
        entries[name.substr(name.find('/') + 1)] = text;
      }
    }
  }
  for (const auto& entry : fs::directory_iterator("/tmp")) {
    if (entry.path().filename().string().rfind("quendel_", 0) == 0) {
      RemoveFile(entry.path());
    }
  }
  return entries;
}

}  // namespace

TEST(KilledRunTest, LosesNothingThoughTheNextRunStartsAtOnce) {
  InstallSlowCollectors();
  std::mt19937 random(20260101);
  std::vector<std::string> delivered(kLogs);
  for (int round = 0; round < kKills; ++round) {
    SCOPED_TRACE("round " + std::to_string(round));
    const pid_t killed = StartRun(StageSlowlyAndNeverPack);
    usleep(static_cast<useconds_t>(random() % 100000));
    Kill(killed);
    ASSERT_EQ(RunWhileLogsGrow(round), 0);
    auto entries = TakeArchive();
    for (int log = 0; log < kLogs; ++log) {
      delivered[log] += entries["log/" + std::to_string(log)];
      const size_t committed = std::stoul(ValueOf(ConfPath(log), "total_byte"));
      ASSERT_TRUE(delivered[log] == ReadFile(LogPath(log)).substr(0, committed))
          << "of log " << log << " " << committed << " bytes are committed, "
          << delivered[log].size() << " were delivered";
    }
    char hash[64] = {};
    Json::Value result;
    const std::string text = entries["udc/udc.result"];
    const std::string printed = text.substr(text.find(':') + 1, 19) + "\n";
    QUENDELMD5String(printed, hash);
    ASSERT_EQ(ValueOf("/usr/arvo/etc/quendel/quendel.udc.raid", "last_hash"), hash) << text;
  }
}
