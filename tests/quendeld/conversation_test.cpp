// The switch, the heartbeats and the events of the running daemon.
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <chrono>
#include <csignal>

#include "json.h"
#include "running_daemon.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;

namespace {

int Heartbeats() {
  return CountRequests("POST /heartbeat/S1");
}
int Events() {
  return CountRequests("POST /action/");
}

TEST(QuendeldTest, TellsThatItIsEnabledAndThatItIsAlive) {
  SwitchService(true);
  RunningDaemon daemon;
  EXPECT_TRUE(Within(10, [] { return Heartbeats() >= 3 && Events() == 1; })) << daemon.LogText();
  const Json::Value event = quendeld::JsonFromText(LastBody("POST /action/")).value();
  EXPECT_EQ(event["action"], "enable");
  EXPECT_EQ(event["hmx_info"]["serial"], "S1");
  EXPECT_TRUE(event["hmx_info"]["model"].isString());
  EXPECT_TRUE(event["hmx_info"]["version"].isString());
  EXPECT_TRUE(event["hmx_info"]["hostname"].isString());
  EXPECT_EQ(daemon.Status()["healthy"], true);
}

TEST(QuendeldTest, TellsOfADisabledServiceAndThenNothing) {
  SwitchService(true);
  RunningDaemon daemon({{"collection_interval", "0.5"}, {"sample_interval", "0.2"}});
  ASSERT_TRUE(Within(10, [] { return Heartbeats() >= 1 && Events() == 1; }));
  SwitchService(false);
  ASSERT_TRUE(Within(10, [] { return Events() == 2; }));
  EXPECT_THAT(LastBody("POST /action/"), HasSubstr("disable"));
  usleep(300'000);
  const size_t before = RequestFiles().size();
  usleep(1'500'000);
  EXPECT_EQ(RequestFiles().size(), before);
}

TEST(QuendeldTest, SendsNothingAfterARestartWhileTheServiceIsDisabled) {
  SwitchService(false);
  RunningDaemon daemon({{"collection_interval", "0.5"}, {"sample_interval", "0.2"}});
  usleep(1'500'000);
  EXPECT_TRUE(RequestFiles().empty());
  EXPECT_EQ(daemon.Status()["enabled"], false);
}

TEST(QuendeldTest, StaysPausedAcrossARestart) {
  SwitchService(true);
  {
    RunningDaemon daemon;
    ASSERT_TRUE(Within(10, [] { return Heartbeats() >= 1; }));
    EXPECT_EQ(daemon.Ask("pause")["success"], true);
    usleep(500'000);
  }
  const size_t before = RequestFiles().size();
  RunningDaemon daemon;
  usleep(1'000'000);
  EXPECT_EQ(RequestFiles().size(), before);
  EXPECT_EQ(daemon.Status()["paused"], true);
  EXPECT_EQ(daemon.Ask("resume")["success"], true);
  EXPECT_TRUE(Within(10, [&] { return RequestFiles().size() > before; }));
}

TEST(QuendeldTest, TellsOfChangedFacts) {
  SwitchService(true);
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [] { return Heartbeats() >= 1 && Events() == 1; }));
  WriteFile("/usr/arvo/etc/quendel.conf", "contact=[{\"name\":\"New\"}]\n");
  ASSERT_TRUE(Within(10, [] { return Events() == 2; }));
  EXPECT_THAT(LastBody("POST /action/"), HasSubstr("update_info"));
  EXPECT_THAT(LastBody("POST /action/"), HasSubstr("New"));
}

TEST(QuendeldTest, KeepsEventsThatTheServerDoesNotTakeAcrossAKill) {
  SwitchService(true);
  AnswerAll("", "status 503");
  {
    RunningDaemon daemon;
    ASSERT_TRUE(Within(10, [] { return Heartbeats() >= 2; }));
    WriteFile("/usr/arvo/etc/quendel.conf", "contact=[{\"name\":\"New\"}]\n");
    ASSERT_TRUE(Within(10, [&] { return daemon.Status()["events"] == 2; }));
    EXPECT_EQ(daemon.End(SIGKILL), 128 + SIGKILL);
  }
  const int before = Events();
  AnswerAll("{\"success\":true}");
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [&] { return daemon.Status()["events"] == 0; })) << daemon.LogText();
  EXPECT_EQ(Events(), before + 2);
  EXPECT_THAT(LastBody("POST /action/"), HasSubstr("update_info"));
}

TEST(QuendeldTest, BacksOffFromAServerThatFailsAndReturnsAtOnce) {
  SwitchService(true);
  AnswerAll("{\"success\":false}");
  RunningDaemon daemon({{"heartbeat_interval", "0.2"}, {"heartbeat_backoff_limit", "60"}});
  ASSERT_TRUE(Within(20, [&] { return daemon.Status()["heartbeat"]["failures"].asInt() >= 4; }));
  EXPECT_EQ(daemon.Status()["healthy"], false);
  const int before = Heartbeats();
  usleep(800'000);
  EXPECT_LE(Heartbeats(), before + 1);
  AnswerAll("{\"success\":true}");
  EXPECT_EQ(daemon.Ask("heartbeat")["success"], true);
  EXPECT_EQ(daemon.Status()["heartbeat"]["failures"], 0);
  const int after = Heartbeats();
  EXPECT_TRUE(Within(3, [&] { return Heartbeats() >= after + 3; }));
}

TEST(QuendeldTest, NeverWaitsForAServerThatSaysNothing) {
  SwitchService(true);
  AnswerAll("{\"success\":true}", "status 200\ndelay_ms 60000");
  RunningDaemon daemon({{"conversation_limit", "1"}});
  ASSERT_TRUE(Within(10, [] { return AnyWorkerRuns(); }));
  const auto asked = std::chrono::steady_clock::now();
  EXPECT_EQ(daemon.Ask("history")["success"], true);
  EXPECT_LT(std::chrono::steady_clock::now() - asked, std::chrono::seconds(1));
  EXPECT_TRUE(Within(10, [&] { return daemon.Status()["heartbeat"]["failures"].asInt() >= 2; }));
  EXPECT_THAT(daemon.LogText(), HasSubstr("the worker did not answer within 1 s"));
}

TEST(QuendeldTest, TellsTheServerOfALogoutAtOnce) {
  SwitchService(true);
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [] { return Heartbeats() >= 1 && Events() == 1; }));
  EXPECT_EQ(daemon.Ask("logout")["success"], true);
  EXPECT_THAT(LastBody("POST /action/"), HasSubstr("logout"));
  AnswerAll("{\"success\":false}");
  EXPECT_EQ(daemon.Ask("logout")["success"], false);
  EXPECT_EQ(daemon.Status()["events"], 0) << "it is not queued";
}

TEST(QuendeldTest, TellsOfARebootThatSystemdHasBegun) {
  SwitchService(true);
  WriteFile("/usr/bin/systemctl", "#!/bin/sh\necho '12 reboot.target start waiting'\n");
  chmod("/usr/bin/systemctl", 0755);
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [] { return Heartbeats() >= 1 && Events() == 1; }));
  EXPECT_EQ(daemon.End(SIGTERM), 0);
  EXPECT_EQ(Events(), 2);
  EXPECT_THAT(LastBody("POST /action/"), HasSubstr("reboot"));
}

TEST(QuendeldTest, TellsOfNoRebootWhenOnlyItIsRestarted) {
  SwitchService(true);
  WriteFile("/usr/bin/systemctl", "#!/bin/sh\necho '12 quendeld.service restart running'\n");
  chmod("/usr/bin/systemctl", 0755);
  RunningDaemon daemon;
  ASSERT_TRUE(Within(10, [] { return Heartbeats() >= 1 && Events() == 1; }));
  EXPECT_EQ(daemon.End(SIGTERM), 0);
  EXPECT_EQ(Events(), 1);
}

}  // namespace
