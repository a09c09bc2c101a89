// The collections of the running daemon.
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "received.h"
#include "running_daemon.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
namespace fs = std::filesystem;
using testing::HasSubstr;

namespace {

constexpr char kLog[] = "/var/log/arvo/one.log";

int Collections() {
  return CountRequests("POST /collect/");
}

void InstallLog() {
  RemoveFile("/usr/arvo/etc/quendel");
  WriteFile(
      "/usr/arvo/etc/quendel/quendel.log.one",
      "name=one\npath=" + std::string(kLog) +
          "\nlast_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\ntotal_byte=\"\"\ninode=\"\"\n");
}

void Append(const std::string& line) {
  std::ofstream(kLog, std::ios::app) << line << "\n";
}

// As logrotate does, with a new file for the log.
void Rotate() {
  EXPECT_EQ(system(("cd /var/log/arvo && for n in 3 2 1; do [ ! -e one.log.$n.xz ] || "
                    "mv one.log.$n.xz one.log.$((n + 1)).xz; done; mv one.log one.log.1 && "
                    "xz one.log.1 && : >one.log")),
            0);
}

class QuendeldCollectionsTest : public testing::Test {
 protected:
  void SetUp() override {
    SwitchService(true);
    InstallLog();
    fs::create_directories("/var/log/arvo");
    Append("first");
  }
};

TEST_F(QuendeldCollectionsTest, RunsAtTheStartAndAtTheInterval) {
  RunningDaemon daemon({{"collection_interval", "3"}});
  ASSERT_TRUE(Within(20, [] { return Collections() == 1; })) << daemon.LogText();
  EXPECT_EQ(Received(), "first\n");
  Append("second");
  ASSERT_TRUE(Within(20, [] { return Collections() == 2; })) << daemon.LogText();
  EXPECT_EQ(Received(), "first\nsecond\n");
}

TEST_F(QuendeldCollectionsTest, DoesNotRunAgainAfterARestartBeforeItIsDue) {
  {
    RunningDaemon daemon;
    ASSERT_TRUE(
        Within(20, [&] { return daemon.Status()["collection"]["last"]["result"] == "sent"; }));
  }
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [&] { return !daemon.Status()["heartbeat"]["last"].isNull(); }));
  usleep(1'000'000);
  EXPECT_EQ(Collections(), 1);
}

TEST_F(QuendeldCollectionsTest, RunsOnRequestAndTellsTheEnd) {
  RunningDaemon daemon;
  ASSERT_TRUE(
      Within(20, [&] { return daemon.Status()["collection"]["last"]["result"] == "sent"; }));
  Append("second");
  EXPECT_EQ(daemon.Ask("collect")["success"], true);
  EXPECT_EQ(Received(), "first\nsecond\n");
  EXPECT_EQ(daemon.Ask("history")["runs"][0]["cause"], "command");
}

TEST_F(QuendeldCollectionsTest, RunsAfterARotation) {
  RunningDaemon daemon;
  ASSERT_TRUE(
      Within(20, [&] { return daemon.Status()["collection"]["last"]["result"] == "sent"; }));
  Append("second");
  Rotate();
  usleep(1'500'000);
  EXPECT_EQ(Collections(), 1) << "the log is still empty";
  Append("third");
  ASSERT_TRUE(Within(20, [] { return Collections() == 2; })) << daemon.LogText();
  EXPECT_EQ(Received(), "first\nsecond\nthird\n");
}

TEST_F(QuendeldCollectionsTest, KeepsWhatARotationWouldRemoveWhileTheServerIsAway) {
  AnswerAll("", "status 503");
  Rotate();
  Append("second");
  {
    RunningDaemon daemon;
    ASSERT_TRUE(Within(30, [&] { return daemon.Status()["outbox"]["archives"] == 1; }))
        << daemon.LogText();
    // The archive is there a moment before the run is noted.
    EXPECT_TRUE(Within(10, [&] { return daemon.Ask("history")["runs"][0]["result"] == "kept"; }));
  }
  EXPECT_TRUE(Received().empty());
  AnswerAll("{\"success\":true}");
  RunningDaemon daemon;
  ASSERT_TRUE(Within(30, [&] { return daemon.Status()["outbox"]["archives"] == 0; }))
      << daemon.LogText();
  EXPECT_THAT(Received(), HasSubstr("first\n"));
  EXPECT_THAT(Received(), HasSubstr("second\n"));
}

TEST_F(QuendeldCollectionsTest, WaitsForTheServerWhereNothingIsAtRisk) {
  AnswerAll("", "status 503");
  RunningDaemon daemon;
  ASSERT_TRUE(Within(20, [&] { return daemon.Status()["heartbeat"]["failures"].asInt() >= 3; }));
  EXPECT_TRUE(daemon.Ask("history")["runs"].empty());
  AnswerAll("{\"success\":true}");
  EXPECT_TRUE(Within(20, [] { return Collections() == 1; })) << daemon.LogText();
}

TEST_F(QuendeldCollectionsTest, CuresALogThatWasCollectedEmpty) {
  WriteFile(kLog, "");
  RunningDaemon daemon;
  ASSERT_TRUE(
      Within(20, [&] { return daemon.Status()["collection"]["last"]["result"] == "sent"; }));
  Append("late");
  EXPECT_EQ(daemon.Ask("collect")["success"], true);
  EXPECT_EQ(Received(), "late\n");
  EXPECT_THAT(daemon.LogText(), HasSubstr("was collected before it held a line; it is reset"));
  Append("later");
  EXPECT_EQ(daemon.Ask("collect")["success"], true);
  EXPECT_EQ(Received(), "late\nlater\n");
}

TEST_F(QuendeldCollectionsTest, TakesThePerformanceSeriesAlong) {
  RunningDaemon daemon({{"sample_interval", "0.3"}});
  ASSERT_TRUE(
      Within(20, [&] { return daemon.Status()["collection"]["last"]["result"] == "sent"; }));
  usleep(1'500'000);
  EXPECT_EQ(daemon.Ask("collect")["success"], true);
  Received();
  EXPECT_THAT(ReadFile("/tmp/received/2/perf/quendel.perf.Memory"), HasSubstr("\"time\""));
}

TEST_F(QuendeldCollectionsTest, DoesNotRunWithoutRoomForIt) {
  RunningDaemon daemon({{"free_space_mb", "100000"}});
  ASSERT_TRUE(Within(20, [&] { return daemon.Status()["collection"]["failing"] == true; }));
  EXPECT_THAT(daemon.LogText(), HasSubstr("no room in /tmp"));
  EXPECT_EQ(Collections(), 0);
}

TEST_F(QuendeldCollectionsTest, ClearsAwayWhatADeadRunLeft) {
  fs::create_directories("/tmp/quendel_20240101_000000_0/log");
  WriteFile("/tmp/quendel_20240101_000000_0.tar.xz", "half");
  WriteFile("/tmp/quendel/udc.p.999999", "");
  WriteFile("/tmp/quendel/debugdat.zip", "old");
  WriteFile("/tmp/quendel_mine", "not a run's");
  RunningDaemon daemon;
  EXPECT_TRUE(Within(10, [] {
    return !Exists("/tmp/quendel_20240101_000000_0") &&
           !Exists("/tmp/quendel_20240101_000000_0.tar.xz") &&
           !Exists("/tmp/quendel/udc.p.999999") && !Exists("/tmp/quendel/debugdat.zip");
  })) << daemon.LogText();
  EXPECT_TRUE(Exists("/tmp/quendel_mine"));
}

TEST_F(QuendeldCollectionsTest, LeavesARunOfAnotherProgramAlone) {
  RunningDaemon daemon;
  ASSERT_TRUE(
      Within(20, [&] { return daemon.Status()["collection"]["last"]["result"] == "sent"; }));
  EXPECT_EQ(system("flock -n /run/quendel/collect.lock true"), 0);
  EXPECT_NE(system("flock /run/quendel/collect.lock sleep 3 & sleep 0.3; exit 1"), 0);
  const Json::Value answer = daemon.Ask("collect");
  EXPECT_EQ(answer["success"], false);
  EXPECT_THAT(answer["reason"].asString(), HasSubstr("is collecting"));
}

}  // namespace
