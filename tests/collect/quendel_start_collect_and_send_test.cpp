// The collection run when its archive is to be sent.
#include <gmock/gmock.h>

#include <csignal>
#include <filesystem>

#include "collect/archive_entries.h"
#include "collect/collection.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"
#include "support/multipart.h"
#include "support/server.h"

using namespace quendel::test;
using testing::_;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

constexpr char kUnit[] = "quendel_start_collect";
constexpr char kRefusal[] = R"({"success":false,"code":111000})";

testing::Matcher<LogLine> FailedToSend() {
  return Logged(kUnit, "Failed to send '" + std::string(kArchive) + "'");
}

int CollectAndSend(int removeAfter) {
  StopTheClock();
  On("sleep").Before(AwaitAnyChild);
  return QUENDELStartCollect(removeAfter, 1, PerfSeries());
}

}  // namespace

TEST(StartCollectAndSendTest, SendsTheArchiveThatItLeaves) {
  SetIdentity();
  InstallCollectors();
  EXPECT_EQ(CollectAndSend(0), 0);
  ASSERT_THAT(Requests(), SizeIs(1));
  EXPECT_EQ(Requests()[0].line, "POST /collect/a1/b2/S1 HTTP/1.1");
  const std::vector<Part> parts = Parts(Requests()[0]);
  ASSERT_THAT(parts, SizeIs(2));
  EXPECT_TRUE(parts[0].body == ReadFile(kArchive));
  const Json::Value description = JsonOf(parts[1].body)[0];
  EXPECT_EQ(description["filename"], std::string(kRunName) + ".tar.xz");
  EXPECT_EQ(description["timestamp"], std::to_string(kStart));
  EXPECT_EQ(ArchiveEntries(kArchive).at(std::string(kRunName) + "/log/messages"),
            "first\nsecond\n");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(StartCollectAndSendTest, CommitsWhatTheServerAccepted) {
  SetIdentity();
  InstallCollectors();
  const auto before = CollectorConf();
  EXPECT_EQ(CollectAndSend(1), 0);
  EXPECT_NE(CollectorConf(), before);
  EXPECT_FALSE(Exists(kRunDir));
  EXPECT_FALSE(Exists(kArchive));
}

TEST(StartCollectAndSendTest, CommitsNothingBeforeTheServerHasAnswered) {
  SetIdentity();
  InstallCollectors();
  const auto before = CollectorConf();
  Answer({.body = R"({"success":true})", .delay_ms = 500});
  EXPECT_EQ(InAGroupOfItsOwn([] { return CollectAndSend(1); }).result, 0);
  // The request came in with the files as they were: the server keeps what was sent, and the files
  // are younger than that.
  const auto sent = std::filesystem::last_write_time(RequestFiles().at(0));
  for (const auto& [path, text] : CollectorConf()) {
    EXPECT_NE(text, before.at(path));
    EXPECT_GT(std::filesystem::last_write_time(path), sent) << path;
  }
}

// docs/delivery-guarantee.md lists it.
TEST(StartCollectAndSendTest, LinesAreLostWhenTheArchiveFindsNoPlaceInTheRequest) {
  SetIdentity();
  InstallCollectors();
  const auto before = CollectorConf();
  On("curl_formadd").Nth(1).Return(1);
  EXPECT_EQ(CollectAndSend(1), 0);
  ASSERT_THAT(Requests(), SizeIs(1));
  EXPECT_THAT(Parts(Requests()[0]), SizeIs(1));
  EXPECT_THAT(Log(),
              ElementsAre(Logged("quendel_post_file_to_server",
                                 "Failed to add curl form: '" + std::string(kArchive) + "'")));
  EXPECT_NE(CollectorConf(), before);
}

TEST(StartCollectAndSendTest, CommitsNothingThatTheServerRefused) {
  SetIdentity();
  InstallCollectors();
  const auto before = CollectorConf();
  Answer({.body = kRefusal});
  EXPECT_EQ(CollectAndSend(0), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged("request_util", _), Logged("quendel_post_file_to_server", _),
                          Logged("quendel_send_collect_data", _), FailedToSend()));
  EXPECT_EQ(CollectorConf(), before);
  EXPECT_TRUE(Exists(kRunDir));
  EXPECT_TRUE(Exists(kArchive));
}

TEST(StartCollectAndSendTest, RemovesWhatTheServerRefusedWhenAsked) {
  SetIdentity();
  Answer({.body = kRefusal});
  EXPECT_EQ(CollectAndSend(1), -1);
  EXPECT_FALSE(Exists(kRunDir));
  EXPECT_FALSE(Exists(kArchive));
}

TEST(StartCollectAndSendTest, SendsTheSameAgainAfterAnyFailedSend) {
  SetIdentity();
  InstallCollectors();
  const auto before = CollectorConf();
  const std::vector<ScriptedAnswer> failures = {
      {.body = kRefusal}, {.status = 500, .body = R"({"success":true})"},
      {.body = "<html>"}, {.body = ""},
      {.cut_after = 0},   {.body = R"({"success":true})", .content_length = 100},
  };
  for (size_t i = 0; i < failures.size(); ++i) {
    Answer(failures[i]);
    EXPECT_EQ(CollectAndSend(1), -1) << i;
    EXPECT_THAT(Log(), Contains(FailedToSend())) << i;
    EXPECT_EQ(CollectorConf(), before) << i;
    ClearLog();
  }
  EXPECT_EQ(CollectAndSend(0), 0);
  EXPECT_EQ(ArchiveEntries(kArchive).at(std::string(kRunName) + "/log/messages"),
            "first\nsecond\n");
}

TEST(StartCollectAndSendTest, CommitsNothingWithoutAnAccount) {
  SetIdentity({{"serial_number", "S1"}});
  InstallCollectors();
  const auto before = CollectorConf();
  EXPECT_EQ(CollectAndSend(0), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_send_collect_data", "Failed to get account"),
                                 FailedToSend()));
  EXPECT_EQ(CollectorConf(), before);
  EXPECT_TRUE(Exists(kArchive));
}

TEST(StartCollectAndSendTest, SendsEvenWhenTheStateCannotBeCommitted) {
  SetIdentity();
  InstallCollectors();
  On("ALIBCFileEnumSection").Nth(1).Return(-1);
  EXPECT_EQ(CollectAndSend(1), -1);
  EXPECT_THAT(Requests(), SizeIs(1));
  EXPECT_THAT(Log(), Contains(Logged(kUnit, "Failed to update log config")));
}

TEST(StartCollectAndSendTest, GathersNothingWhenTheServerCannotBeReached) {
  WriteFile("/etc.defaults/arvoinfo.conf", "quendel_server=no.such.host\n");
  InstallCollectors();
  const auto before = CollectorConf();
  const Ending ending = InAGroupOfItsOwn([] {
    signal(SIGTERM, SIG_IGN);
    const int result = QUENDELStartCollect(0, 1, PerfSeries());
    EXPECT_EQ(Calls("time"), 0);
    EXPECT_EQ(Calls("ALIBCProcForkEx"), 0);
    return result;
  });
  EXPECT_EQ(ending.result, -1);
  EXPECT_TRUE(ending.group_got_sigterm);
  EXPECT_THAT(Log(), ElementsAre(Logged("util.cpp", _), Logged(kUnit, "Failed to access server"),
                                 Logged(kUnit, _), Logged(kUnit, _)));
  EXPECT_EQ(CollectorConf(), before);
  EXPECT_TRUE(Exists("/tmp/quendel"));
  EXPECT_FALSE(Exists(kRunDir));
}
