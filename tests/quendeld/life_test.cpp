// How the running daemon begins, ends and keeps order.
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <filesystem>

#include "running_daemon.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;

namespace {

TEST(QuendeldLifeTest, EndsWithinFiveSecondsWhateverItsWorkersDo) {
  SwitchService(true);
  AnswerAll("{\"success\":true}", "status 200\ndelay_ms 60000");
  RunningDaemon daemon({{"conversation_limit", "60"}, {"kill_after", "60"}});
  ASSERT_TRUE(Within(10, [] { return AnyWorkerRuns(); }));
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_EQ(daemon.End(SIGTERM), 0);
  EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(5));
  EXPECT_FALSE(AnyWorkerRuns());
}

TEST(QuendeldLifeTest, EndsWhatAKilledDaemonLeftRunning) {
  SwitchService(true);
  WriteFile("/usr/arvo/etc/quendel/quendel.udc.stray",
            "name=stray\npath=/usr/arvo/udc/stray\nlast_hash=\"\"\n");
  WriteFile("/usr/arvo/udc/stray",
            "#!/bin/sh\nsetsid sleep 1000 &\n>/tmp/stray-runs\nsleep 1000\n");
  chmod("/usr/arvo/udc/stray", 0755);
  {
    RunningDaemon daemon;
    ASSERT_TRUE(Within(20, [] { return Exists("/tmp/stray-runs"); }));
    daemon.End(SIGKILL);
  }
  EXPECT_TRUE(AnyWorkerRuns()) << "there is nothing to end";
  RemoveFile("/usr/arvo/etc/quendel/quendel.udc.stray");
  SwitchService(false);
  RunningDaemon daemon;
  EXPECT_TRUE(Within(5, [] { return !AnyWorkerRuns(); }));
}

TEST(QuendeldLifeTest, RunsOnceOnADevice) {
  SwitchService(true);
  RunningDaemon daemon;
  EXPECT_EQ(system(QUENDELD " 2>/dev/null") >> 8, 3);
  EXPECT_EQ(daemon.Status()["pid"], daemon.process());
}

TEST(QuendeldLifeTest, ReadsItsSettingsAgain) {
  SwitchService(true);
  RunningDaemon daemon({{"heartbeat_interval", "1000"}});
  ASSERT_TRUE(Within(10, [] { return CountRequests("POST /heartbeat/") == 1; }));
  WriteFile("/usr/arvo/etc/quendeld.conf",
            "heartbeat_interval=0.2\nfirst_heartbeat_within=0\nsamples_kept=many\n");
  daemon.Signal(SIGHUP);
  EXPECT_TRUE(Within(10, [] { return CountRequests("POST /heartbeat/") >= 4; }));
  EXPECT_THAT(daemon.LogText(),
              HasSubstr("samples_kept=many is not a number; the default is used"));
}

TEST(QuendeldLifeTest, StartsAnewOnADamagedJournal) {
  SwitchService(true);
  WriteFile("/var/lib/quendel/quendeld.db", std::string(20000, 'x'));
  RunningDaemon daemon;
  EXPECT_TRUE(Within(10, [] { return CountRequests("POST /heartbeat/") >= 1; }));
  EXPECT_TRUE(Exists("/var/lib/quendel/quendeld.db.damaged"));
}

TEST(QuendeldLifeTest, AnswersOnlyWhatItKnows) {
  SwitchService(true);
  RunningDaemon daemon;
  EXPECT_EQ(daemon.Ask("fly")["success"], false);
  EXPECT_EQ(daemon.Ask("\"")["success"], false);
  EXPECT_EQ(daemon.Ask("history")["success"], true);
  struct stat status = {};
  ASSERT_EQ(stat("/run/quendel/control", &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0600);
}

TEST(QuendeldLifeTest, WritesItsStatusWhereOthersCanReadIt) {
  SwitchService(true);
  RunningDaemon daemon;
  EXPECT_TRUE(Within(10, [] {
    return Exists("/run/quendel/status.json") &&
           ReadFile("/run/quendel/status.json").find("\"enabled\":true") != std::string::npos;
  }));
}

TEST(QuendeldLifeTest, HoldsItsMemoryAndDescriptorsOverManyWorkers) {
  SwitchService(true);
  RunningDaemon daemon({{"heartbeat_interval", "0.05"}});
  const std::string folder = "/proc/" + std::to_string(daemon.process());
  const auto descriptors = [&] {
    const std::filesystem::directory_iterator entries(folder + "/fd");
    return std::distance(begin(entries), end(entries));
  };
  ASSERT_TRUE(Within(20, [] { return CountRequests("POST /heartbeat/") >= 20; }));
  daemon.Ask("pause");
  ASSERT_TRUE(Within(5, [] { return !AnyWorkerRuns(); }));
  const auto before = descriptors();
  daemon.Ask("resume");
  ASSERT_TRUE(Within(60, [] { return CountRequests("POST /heartbeat/") >= 70; }));
  daemon.Ask("pause");
  ASSERT_TRUE(Within(5, [&] { return !AnyWorkerRuns() && descriptors() <= before; }))
      << descriptors() << " descriptors, " << before << " before";
}

#ifndef __SANITIZE_ADDRESS__
TEST(QuendeldLifeTest, EndsAWorkerThatTakesTooMuchMemory) {
  SwitchService(true);
  AnswerAll("{\"success\":true,\"x\":\"", "status 200\nfill 200000000\ntail 0");
  RunningDaemon daemon({{"memory_limit_mb", "64"}});
  EXPECT_TRUE(Within(20, [&] { return daemon.Status()["heartbeat"]["failures"].asInt() >= 1; }));
  AnswerAll("{\"success\":true}");
  EXPECT_TRUE(Within(20, [&] { return daemon.Status()["heartbeat"]["failures"].asInt() == 0; }));
}
#endif

}  // namespace
