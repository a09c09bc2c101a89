// What the running daemon does for the server.
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "running_daemon.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;

namespace {

void Queue(const std::string& actions) {
  AnswerAll("{\"success\":true,\"actions\":[" + actions + "]}");
}

int Reports(const std::string& idAndProgress) {
  return CountRequests("POST /action_progress/" + idAndProgress + "/");
}

void NoOtherCollectors() {
  RemoveFile("/usr/arvo/etc/quendel");
  std::filesystem::create_directories("/usr/arvo/etc/quendel");
}

// Makes each run take so long.
void InstallSlowCollector(const std::string& seconds) {
  NoOtherCollectors();
  WriteFile("/usr/arvo/etc/quendel/quendel.udc.slow",
            "name=slow\npath=/usr/arvo/udc/slow\nlast_hash=\"\"\n");
  WriteFile("/usr/arvo/udc/slow",
            "#!/bin/sh\necho run >>/run/runs\nsleep " + seconds + "\necho '{}'\n");
  chmod("/usr/arvo/udc/slow", 0755);
}

class QuendeldActionsTest : public testing::Test {
 protected:
  void SetUp() override {
    SwitchService(true);
    NoOtherCollectors();
    // Or the first collection would run before those that are asked for.
    WriteFile("/usr/arvo/etc/placeholder", "");
  }
};

TEST_F(QuendeldActionsTest, CarriesARequestOutOnceHoweverOftenItComes) {
  Queue(R"({"action":"start_collect","request_id":17})");
  RunningDaemon daemon;
  ASSERT_TRUE(Within(30, [] { return Reports("17/0") >= 1; })) << daemon.LogText();
  const int collections = CountRequests("POST /collect/");
  usleep(1'500'000);
  EXPECT_EQ(CountRequests("POST /collect/"), collections);
  EXPECT_EQ(Reports("17/0"), 1);
}

TEST_F(QuendeldActionsTest, ReportsAnActionThatAKillBrokeOffAndDoesNotRepeatIt) {
  InstallSlowCollector("30");
  Queue(R"({"action":"start_collect","request_id":17})");
  {
    RunningDaemon daemon;
    ASSERT_TRUE(Within(10, [] { return Exists("/run/runs"); })) << daemon.LogText();
    usleep(200'000);
    EXPECT_EQ(daemon.End(SIGKILL), 128 + SIGKILL);
  }
  // The next run is the regular one: it is not on request.
  WriteFile("/usr/arvo/udc/slow", "#!/bin/sh\necho '{}'\n");
  RunningDaemon daemon;
  EXPECT_TRUE(Within(20, [] { return Reports("17/-1") == 1; })) << daemon.LogText();
  EXPECT_EQ(Reports("17/0"), 0);
  EXPECT_TRUE(Within(20, [&] { return daemon.Status()["collection"]["running"] == false; }));
  EXPECT_TRUE(Within(10, [] { return !AnyWorkerRuns(); }));
}

TEST_F(QuendeldActionsTest, AnswersWhatItDoesNotCarryOut) {
  Queue(R"({"action":"fly","request_id":1},{"action":"reboot","request_id":2},)"
        R"({"action":"logout","request_id":3},{"request_id":4},{"action":"upload_file"},null,7,)"
        R"({"action":"remote_close","request_id":5,"progress":0})");
  RunningDaemon daemon;
  for (const char* report : {"1/-1", "2/-1", "3/-1", "4/-1", "5/-1"}) {
    EXPECT_TRUE(Within(20, [&] { return Reports(report) == 1; })) << report << daemon.LogText();
  }
  usleep(1'000'000);
  EXPECT_EQ(CountRequests("POST /action_progress/"), 5);
}

TEST_F(QuendeldActionsTest, OutlivesAThousandActionsAtOnce) {
  std::string actions;
  for (int id = 1; id <= 1000; ++id) {
    actions += std::string(id == 1 ? "" : ",") + R"({"action":"fly","request_id":)" +
               std::to_string(id) + "}";
  }
  Queue(actions);
  RunningDaemon daemon;
  EXPECT_TRUE(Within(120, [&] { return Reports("1000/-1") == 1; }))
      << daemon.LogText().substr(0, 3000);
  EXPECT_TRUE(Within(10, [&] { return daemon.Status()["reports"] == 0; }));
  EXPECT_EQ(CountRequests("POST /action_progress/"), 1000);
}

TEST_F(QuendeldActionsTest, UploadsAFileAndReportsWhatTheLibraryDoesNot) {
  WriteFile("/var/crash/@demo/x.core", "dump");
  Queue(R"({"action":"upload_file","request_id":8,"progress":1,"files":[{"file_type":"coredump",)"
        R"("file_path":"/var/crash/@demo/x.core","file_uuid":"u"}]},)"
        R"({"action":"upload_file","request_id":9,"progress":1,"files":[{"file_type":"coredump",)"
        R"("file_path":"/etc/passwd","file_uuid":"u"}]})");
  RunningDaemon daemon;
  EXPECT_TRUE(Within(20, [] { return CountRequests("POST /upload_file/8/") == 1; }))
      << daemon.LogText();
  EXPECT_TRUE(Within(20, [] { return Reports("9/-1") == 1; })) << daemon.LogText();
  EXPECT_EQ(CountRequests("POST /action_progress/8/"), 0);
}

TEST_F(QuendeldActionsTest, RefusesPathsThatLeaveTheirFolder) {
  std::filesystem::create_directories("/volume1/@a");
  WriteFile("/etc/secret.core", "secret");
  std::filesystem::create_symlink("/etc/secret.core", "/volume1/@a/link.core");
  int id = 20;
  std::string actions;
  for (const char* path : {"/volume1/@a/../../etc/secret.core", "/volume1/@a/link.core"}) {
    actions += (actions.empty() ? "" : ",") +
               (R"({"action":"upload_file","request_id":)" + std::to_string(id++)) +
               R"(,"files":[{"file_type":"coredump","file_uuid":"u","file_path":")" + path +
               "\"}]}";
  }
  Queue(actions);
  RunningDaemon daemon;
  EXPECT_TRUE(Within(20, [] { return Reports("20/-1") == 1 && Reports("21/-1") == 1; }))
      << daemon.LogText();
  EXPECT_EQ(CountRequests("POST /upload_file/"), 0);
  EXPECT_THAT(daemon.LogText(), HasSubstr("it leaves its folder"));
}

TEST_F(QuendeldActionsTest, SwitchesThePowerWhereTheOwnerAllowsItAndReportsThatFirst) {
  WriteFile("/usr/bin/systemctl", "#!/bin/sh\necho \"$*\" >>/run/systemctl\n");
  chmod("/usr/bin/systemctl", 0755);
  Queue(R"({"action":"reboot","request_id":30})");
  RunningDaemon daemon({{"allow_power_actions", "yes"}});
  ASSERT_TRUE(Within(20, [] { return Exists("/run/systemctl"); })) << daemon.LogText();
  EXPECT_EQ(Reports("30/0"), 1);
  usleep(1'000'000);
  EXPECT_EQ(ReadFile("/run/systemctl"), "reboot\n");
}

TEST_F(QuendeldActionsTest, ClosesASessionForTheServer) {
  WriteFile("/usr/arvo/etc/quendel.remote.conf", "stop_sshd_after_complete=no\n");
  Queue(R"({"action":"remote_close","request_id":40,"progress":-1})");
  RunningDaemon daemon;
  EXPECT_TRUE(Within(20, [] { return Reports("40/-1") == 1; })) << daemon.LogText();
  EXPECT_TRUE(Within(5, [] { return !Exists("/usr/arvo/etc/quendel.remote.conf"); }));
}

TEST_F(QuendeldActionsTest, ClosesASessionThatLastsTooLong) {
  RunningDaemon daemon({{"session_limit", "2"}});
  ASSERT_TRUE(Within(10, [&] { return daemon.Status()["enabled"] == true; }));
  WriteFile("/usr/arvo/etc/quendel.remote.conf", "stop_sshd_after_complete=no\n");
  EXPECT_TRUE(Within(5, [&] { return !daemon.Status()["session"].isNull(); }));
  EXPECT_TRUE(Within(10, [] { return !Exists("/usr/arvo/etc/quendel.remote.conf"); }))
      << daemon.LogText();
  EXPECT_EQ(Reports("0/0"), 1);
}

TEST_F(QuendeldActionsTest, RepeatsTheEndOfASessionUntilTheServerTakesIt) {
  WriteFile("/usr/arvo/etc/quendel.remote.conf", "stop_sshd_after_complete=no\n");
  Queue(R"({"action":"remote_close","request_id":41,"progress":0})");
  RunningDaemon daemon({{"heartbeat_interval", "0.3"}});
  // One heartbeat gets the request; then the server refuses, for a while.
  ASSERT_TRUE(Within(10, [] { return CountRequests("POST /heartbeat/") >= 1; }));
  EXPECT_TRUE(Within(20, [] { return Reports("41/0") >= 1; })) << daemon.LogText();
  EXPECT_TRUE(Within(10, [] { return !Exists("/usr/arvo/etc/quendel.remote.conf"); }));
}

}  // namespace
