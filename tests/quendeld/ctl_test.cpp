// quendelctl's commands that ask the running daemon.
#include <gmock/gmock.h>

#include "quendelctl/run_quendelctl.h"
#include "running_daemon.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
using testing::AllOf;
using testing::HasSubstr;

namespace {

void AwaitFirstCollection() {
  ASSERT_TRUE(Within(20, [] {
    return RunningDaemon::Status()["collection"]["last"]["result"] == "sent";
  })) << RunningDaemon::LogText();
}

TEST(QuendelctlStatusTest, TellsThatNoDaemonRuns) {
  const Output text = Quendelctl({"status"});
  EXPECT_EQ(text.status, 3);
  EXPECT_THAT(text.out, HasSubstr("quendeld does not run"));
  const Output metrics = Quendelctl({"status", "--prometheus"});
  EXPECT_EQ(metrics.status, 3);
  EXPECT_THAT(metrics.out, HasSubstr("quendeld_up 0\n"));
}

TEST(QuendelctlStatusTest, ShowsAHealthyService) {
  SwitchService(true);
  RunningDaemon daemon;
  AwaitFirstCollection();
  const Output text = Quendelctl({"status"});
  EXPECT_EQ(text.status, 0) << text.out;
  EXPECT_THAT(text.out, AllOf(HasSubstr("Service:    enabled\n"), HasSubstr("support.test"),
                              HasSubstr("/run/syslog.txt, "), HasSubstr("All is well.")));
  const Json::Value json = FromJsonLine(Quendelctl({"status", "--json"}).out);
  EXPECT_EQ(json["healthy"], true);
  EXPECT_EQ(json["success"], true);
}

TEST(QuendelctlStatusTest, ShowsMetrics) {
  SwitchService(true);
  RunningDaemon daemon;
  AwaitFirstCollection();
  const Output metrics = Quendelctl({"status", "--prometheus"});
  EXPECT_EQ(metrics.status, 0) << metrics.out;
  EXPECT_THAT(metrics.out, AllOf(HasSubstr("# TYPE quendeld_up gauge\nquendeld_up 1\n"),
                                 HasSubstr("quendeld_healthy 1\n"),
                                 HasSubstr("quendeld_log_lag_bytes{path=\"/run/syslog.txt\"} ")));
}

TEST(QuendelctlStatusTest, NamesAProblem) {
  SwitchService(true);
  AnswerAll("{\"success\":false}");
  RunningDaemon daemon;
  ASSERT_TRUE(
      Within(20, [] { return RunningDaemon::Status()["heartbeat"]["failures"].asInt() >= 3; }));
  const Output text = Quendelctl({"status"});
  EXPECT_EQ(text.status, 1);
  EXPECT_THAT(text.out, HasSubstr("Problem:    the server has not accepted the last "));
}

TEST(QuendelctlNowTest, HasTheDaemonBeatAndCollect) {
  SwitchService(true);
  RunningDaemon daemon({{"heartbeat_interval", "1000"}});
  AwaitFirstCollection();
  const int heartbeats = CountRequests("POST /heartbeat/");
  EXPECT_EQ(Quendelctl({"heartbeat", "--now"}).status, 0);
  EXPECT_EQ(CountRequests("POST /heartbeat/"), heartbeats + 1);
  EXPECT_EQ(Quendelctl({"collect", "--now"}).status, 0);
  EXPECT_EQ(CountRequests("POST /collect/"), 2);
  EXPECT_THAT(Quendelctl({"history"}).out, HasSubstr("(command)"));
}

TEST(QuendelctlNowTest, NeedsTheDaemon) {
  EXPECT_EQ(Quendelctl({"collect", "--now"}).status, 1);
  EXPECT_EQ(Quendelctl({"heartbeat", "--now"}).status, 1);
  EXPECT_EQ(Quendelctl({"collect", "--now", "--send"}).status, 2);
}

TEST(QuendelctlPauseTest, StopsAndGoesOn) {
  SwitchService(true);
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [] { return CountRequests("POST /heartbeat/") >= 1; }));
  EXPECT_EQ(Quendelctl({"pause"}).status, 0);
  EXPECT_THAT(Quendelctl({"status"}).out, HasSubstr("Service:    enabled, paused"));
  EXPECT_EQ(Quendelctl({"collect", "--now"}).status, 1);
  EXPECT_EQ(Quendelctl({"resume"}).status, 0);
  EXPECT_EQ(RunningDaemon::Status()["paused"], false);
}

TEST(QuendelctlEventTest, LeavesTheLogoutToTheDaemon) {
  SwitchService(true);
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [] { return CountRequests("POST /action/") == 1; }));
  const Output output = Quendelctl({"event", "logout"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.out, HasSubstr("The server was told of the logout."));
  EXPECT_THAT(LastBody("POST /action/"), HasSubstr("logout"));
}

TEST(QuendelctlRemoteTest, LeavesTheEndOfASessionToTheDaemon) {
  SwitchService(true);
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [] { return CountRequests("POST /heartbeat/") >= 1; }));
  EXPECT_THAT(Quendelctl({"remote", "close", "5"}).out, HasSubstr("no support session is open"));
  WriteFile("/usr/arvo/etc/quendel.remote.conf", "stop_sshd_after_complete=no\n");
  EXPECT_EQ(Quendelctl({"remote", "close", "6"}).status, 0);
  EXPECT_EQ(CountRequests("POST /action_progress/6/0/"), 1);
  EXPECT_FALSE(Exists("/usr/arvo/etc/quendel.remote.conf"));
}

}  // namespace
