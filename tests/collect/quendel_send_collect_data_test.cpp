// The delivery of an archive.
#include <gmock/gmock.h>

#include <cstdlib>

#include "platform/zone.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"
#include "support/multipart.h"
#include "support/server.h"

using namespace quendel::test;
using testing::_;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

constexpr char kUnit[] = "quendel_send_collect_data";
constexpr char kPostUnit[] = "quendel_post_file_to_server";
constexpr char kName[] = "quendel_20240305_070809_0.tar.xz";
constexpr char kArchive[] = "/tmp/quendel_20240305_070809_0.tar.xz";
constexpr long kStart = 1709622489;  // 2024-03-05 07:08:09 UTC

int Send(long start = kStart) {
  WriteFile(kArchive, "archive");
  return QUENDELSendCollectData(kArchive, start);
}

Part ArchivePart() {
  return FilePart("file", kName, "application/octet-stream", "archive");
}

// The only description in the only request so far.
Json::Value Description() {
  const Json::Value list = JsonOf(Parts(Requests().at(0)).at(1).body);
  EXPECT_EQ(list.size(), 1U);
  return list[0];
}

// Sends while a device fact cannot be read: the archive goes out and nothing describes it.
void ExpectSentUndescribed() {
  SetIdentity();
  EXPECT_EQ(Send(), 0);
  EXPECT_THAT(Parts(Requests().at(0)), ElementsAre(ArchivePart(), TextPart("file", "[]")));
}

testing::Matcher<LogLine> NotDescribed() {
  return Logged(kPostUnit, "Failed to gen file metadata: '" + std::string(kArchive) + "'");
}

}  // namespace

TEST(SendCollectDataTest, PostsTheArchiveAndItsDescription) {
  setenv("TZ", "UTC-1", 1);  // an hour east of UTC
  SetIdentity();
  EXPECT_EQ(Send(), 0);
  ASSERT_THAT(Requests(), SizeIs(1));
  EXPECT_EQ(Requests()[0].line, "POST /collect/a1/b2/S1 HTTP/1.1");
  const std::vector<Part> parts = Parts(Requests()[0]);
  ASSERT_THAT(parts, SizeIs(2));
  EXPECT_EQ(parts[0], ArchivePart());
  EXPECT_EQ(parts[1].headers, TextPart("file", "").headers);

  const Json::Value description = Description();
  EXPECT_THAT(
      description.getMemberNames(),
      testing::UnorderedElementsAre("filename", "timestamp", "timezone", "local_time", "version"));
  EXPECT_EQ(description["filename"], kName);
  EXPECT_EQ(description["timestamp"], "1709622489");
  EXPECT_EQ(description["local_time"], "20240305_080809");
  EXPECT_EQ(description["version"], "HMX 3.2-2044");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(SendCollectDataTest, DescribesTheTimeZoneOfTheDevice) {
  SetIdentity({{"serial_number", "S1"}, {"account_email", "mail1"}, {"timezone", "Asia/Taipei"}});
  char expected[256] = {};
  ASSERT_GE(ARVOZoneDesc("Asia/Taipei", expected, sizeof expected), 0);
  EXPECT_EQ(Send(), 0);
  EXPECT_EQ(Description()["timezone"], expected);
}

TEST(SendCollectDataTest, LeavesTheSegmentsOfEmptyFieldsEmpty) {
  SetIdentity({{"serial_number", "S1"}, {"account_email", "mail1"}});
  EXPECT_EQ(Send(), 0);
  EXPECT_EQ(Requests().at(0).line, "POST /collect///S1 HTTP/1.1");
}

TEST(SendCollectDataTest, WritesTheTimestampAsAnUnsignedNumber) {
  SetIdentity();
  EXPECT_EQ(Send(-1), 0);
  EXPECT_EQ(Description()["timestamp"], "18446744073709551615");
}

TEST(SendCollectDataTest, FailsWithoutMemoryBeforeAnythingElse) {
  On("calloc").Nth(1).Return(nullptr);
  EXPECT_EQ(Send(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to malloc for pMyhubAccount")));
  EXPECT_EQ(Calls("ARVOMYHUBAccountGet"), 0);
}

TEST(SendCollectDataTest, AsksForTheAccountBeforeTheSerialNumber) {
  SetIdentity({{"service_quendeld", "yes"}});
  EXPECT_EQ(Send(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get account")));
  EXPECT_EQ(Calls("ALIBGetSerialNumber"), 0);
}

TEST(SendCollectDataTest, FailsWithoutASerialNumber) {
  SetIdentity({{"account_email", "mail1"}});
  EXPECT_EQ(Send(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get serial number")));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(SendCollectDataTest, SendsUndescribedWithoutATimeZone) {
  On("ARVOZoneGet").Nth(1).Return(-1);
  ExpectSentUndescribed();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get timezone"), NotDescribed()));
  EXPECT_EQ(Calls("ARVOZoneDesc"), 0);
}

TEST(SendCollectDataTest, SendsUndescribedWhenTheTimeZoneHasNoDescription) {
  On("ARVOZoneDesc").Nth(1).Return(-1);
  ExpectSentUndescribed();
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to get timezone description"), NotDescribed()));
}

TEST(SendCollectDataTest, SendsUndescribedWithoutAVersion) {
  On("ALIBCSzHashAlloc").Nth(1).Return(nullptr);
  ExpectSentUndescribed();
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_device_facts", _),
                                 Logged(kUnit, "Failed to get HMX version"), NotDescribed()));
}

TEST(SendCollectDataTest, FailsWhenTheServerRefuses) {
  SetIdentity();
  Answer({.body = R"({"success":false})"});
  EXPECT_EQ(Send(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("request_util", _), Logged(kPostUnit, _),
                                 Logged(kUnit, "Failed to post file to server")));
  EXPECT_TRUE(Exists(kArchive));
}

TEST(SendCollectDataTest, FailsWhenTheArchiveIsMissing) {
  SetIdentity();
  EXPECT_EQ(QUENDELSendCollectData("/tmp/none", kStart), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kPostUnit, _), Logged(kUnit, "Failed to post file to server")));
}
