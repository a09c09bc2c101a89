// The delivery of requested files.
#include <gmock/gmock.h>

#include <algorithm>
#include <climits>
#include <cstdint>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"
#include "support/multipart.h"
#include "support/replies.h"
#include "support/server.h"

using namespace quendel::test;
using testing::_;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

constexpr char kUnit[] = "quendel_send_upload_data";

QUENDELSendDataParam_t Item(const std::string& path, uint64_t timestamp = 1, std::string type = "t",
                            std::string uuid = "u") {
  QUENDELSendDataParam_t item;
  item.timestamp = timestamp;
  item.type = std::move(type);
  item.path = path;
  item.fileuuid = std::move(uuid);
  return item;
}

// What the last part of the only request so far says of the files.
Json::Value Descriptions() {
  return JsonOf(Parts(Requests().at(0)).back().body);
}

}  // namespace

TEST(SendUploadDataTest, PostsFilesAndDescriptionsUnderOneName) {
  SetIdentity();
  WriteFile("/tmp/one.xz", "first file");
  WriteFile("/tmp/two.zip", "second file");
  EXPECT_EQ(QUENDELSendUploadData(17, {Item("/tmp/one.xz", 1700000000, "coredump", "u1"),
                                       Item("/tmp/two.zip", 1700000009, "debug.dat", "u2")}),
            0);
  EXPECT_EQ(RequestLine(), "POST /upload_file/17/a1/b2/S1 HTTP/1.1");
  const std::vector<Part> parts = Parts(Requests()[0]);
  const std::string binary = "application/octet-stream";
  ASSERT_THAT(parts, SizeIs(3));
  EXPECT_EQ(parts[0], FilePart("upload_list", "one.xz", binary, "first file"));
  EXPECT_EQ(parts[1], FilePart("upload_list", "two.zip", binary, "second file"));
  EXPECT_EQ(parts[2], TextPart("upload_list", parts[2].body));
  EXPECT_EQ(Descriptions(), JsonOf(R"([
    {"filename":"one.xz","type":"coredump","fileuuid":"u1","timestamp":"1700000000"},
    {"filename":"two.zip","type":"debug.dat","fileuuid":"u2","timestamp":"1700000009"}])"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(SendUploadDataTest, PostsAnEmptyListToo) {
  SetIdentity();
  EXPECT_EQ(QUENDELSendUploadData(17, {}), 0);
  EXPECT_EQ(RequestLine(), "POST /upload_file/17/a1/b2/S1 HTTP/1.1");
  EXPECT_THAT(Parts(Requests()[0]), ElementsAre(TextPart("upload_list", "[]")));
}

TEST(SendUploadDataTest, WritesTheTimestampAsText) {
  SetIdentity();
  WriteFile("/tmp/f", "x");
  EXPECT_EQ(QUENDELSendUploadData(17, {Item("/tmp/f", 0), Item("/tmp/f", UINT64_MAX)}), 0);
  EXPECT_EQ(Descriptions()[0]["timestamp"], Json::Value("0"));
  EXPECT_EQ(Descriptions()[1]["timestamp"], Json::Value("18446744073709551615"));
}

TEST(SendUploadDataTest, PathThatEndsInASlashHasNoFileName) {
  SetIdentity();
  EXPECT_EQ(QUENDELSendUploadData(17, {Item("/tmp/")}), 0);
  EXPECT_EQ(Descriptions()[0]["filename"], Json::Value(""));
}

TEST(SendUploadDataTest, SevenCharactersOfTheActionCount) {
  const struct {
    int action;
    const char* text;
  } cases[] = {{0, "0"},
               {-1, "-1"},
               {9999999, "9999999"},
               {10000000, "1000000"},
               {12345678, "1234567"},
               {-999999, "-999999"},
               {-1234567, "-123456"},
               {INT_MAX, "2147483"},
               {INT_MIN, "-214748"}};
  SetIdentity();
  for (const auto& c : cases) {
    const size_t before = Requests().size();
    EXPECT_EQ(QUENDELSendUploadData(c.action, {}), 0);
    ASSERT_THAT(Requests(), SizeIs(before + 1));
    EXPECT_EQ(Requests().back().line,
              std::string("POST /upload_file/") + c.text + "/a1/b2/S1 HTTP/1.1");
  }
}

TEST(SendUploadDataTest, LeavesTheSegmentsOfEmptyFieldsEmpty) {
  SetIdentity({{"serial_number", "S1"}, {"account_email", "mail1"}});
  EXPECT_EQ(QUENDELSendUploadData(17, {}), 0);
  EXPECT_EQ(RequestLine(), "POST /upload_file/17///S1 HTTP/1.1");
}

TEST(SendUploadDataTest, LeavesTheFilesAlone) {
  SetIdentity();
  WriteFile("/tmp/f", "contents");
  EXPECT_EQ(QUENDELSendUploadData(17, {Item("/tmp/f")}), 0);
  EXPECT_EQ(ReadFile("/tmp/f"), "contents");
}

TEST(SendUploadDataTest, FailsWithoutMemoryBeforeAnythingElse) {
  On("calloc").Nth(1).Return(nullptr);
  EXPECT_EQ(QUENDELSendUploadData(17, {}), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to malloc for pMyhubAccount")));
  EXPECT_EQ(Calls("ARVOMYHUBAccountGet"), 0);
  EXPECT_EQ(Calls("ALIBGetSerialNumber"), 0);
}

TEST(SendUploadDataTest, AsksForTheAccountBeforeTheSerialNumber) {
  SetIdentity({{"service_quendeld", "yes"}});  // neither is there
  EXPECT_EQ(QUENDELSendUploadData(17, {}), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get account")));
  EXPECT_EQ(Calls("ALIBGetSerialNumber"), 0);
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(SendUploadDataTest, FailsWithoutASerialNumber) {
  SetIdentity({{"account_email", "mail1"}});
  EXPECT_EQ(QUENDELSendUploadData(17, {}), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get serial number")));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(SendUploadDataTest, FailsOnAnyNegativeResult) {
  SetIdentity();
  On("ARVOMYHUBAccountGet").Nth(1).Return(-2);
  EXPECT_EQ(QUENDELSendUploadData(17, {}), -1);
  On("ALIBGetSerialNumber").Nth(1).Return(-2);
  EXPECT_EQ(QUENDELSendUploadData(17, {}), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get account"),
                                 Logged(kUnit, "Failed to get serial number")));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(SendUploadDataTest, FailsWhenTheServerRefuses) {
  SetIdentity();
  Answer({.body = R"({"success":false,"code":111001})"});
  EXPECT_EQ(QUENDELSendUploadData(17, {}), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("request_util", "Response is not success"),
                                 Logged("quendel_post_file_to_server",
                                        HasSubstr("Failed to handle response")),
                                 Logged(kUnit, "Failed to post file to server")));
  EXPECT_THAT(Requests(), SizeIs(1));  // nothing is retried
}

TEST(SendUploadDataTest, FailsWhenThePostDoesNotGetThrough) {
  SetIdentity();
  On("curl_easy_perform").Nth(1).Return(7);
  EXPECT_EQ(QUENDELSendUploadData(17, {}), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_post_file_to_server", _),
                                 Logged(kUnit, "Failed to post file to server")));
  EXPECT_EQ(Calls("curl_easy_perform"), 1);  // nothing is retried
}

TEST(SendUploadDataTest, GoesByWhatEachHostileReplySays) {
  SetIdentity();
  for (const HostileReply& reply : HostileReplies()) {
    SCOPED_TRACE(reply.name);
    ClearLog();
    ScriptedAnswer answer = reply.answer;
    answer.fill = std::min<size_t>(answer.fill, 1'000'000);  // the file post's test takes the whole
    Answer(answer);
    EXPECT_EQ(QUENDELSendUploadData(17, {}), reply.success ? 0 : -1);
    if (reply.success) {
      EXPECT_THAT(Log(), IsEmpty());
    } else {
      EXPECT_THAT(Log().back(), Logged(kUnit, "Failed to post file to server"));
    }
  }
}
