// The posting of files, against a real TLS server.
#define CURL_DISABLE_DEPRECATION  // the form's option is
#include <curl/curl.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <fstream>
#include <stdexcept>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"
#include "support/multipart.h"
#include "support/server.h"
#include "transport/curl_line.h"

using namespace quendel::test;
using testing::_;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

constexpr char kUrl[] = "https://support.test/upload_file/a1";
constexpr char kUnit[] = "quendel_post_file_to_server";

using Items = std::vector<QUENDELSendDataParam_t>;

QUENDELSendDataParam_t Item(const std::string& path) {
  QUENDELSendDataParam_t item;
  item.timestamp = 1709622489;
  item.type = "dump";
  item.path = path;
  item.fileuuid = "u-1";
  return item;
}

QUENDELSendDataParam_t NewFile(const std::string& path, const std::string& text) {
  WriteFile(path, text);
  return Item(path);
}

int Describe(Json::Value& info, const QUENDELSendDataParam_t& item) {
  info["path"] = item.path;
  return 0;
}

int result_for_b = -1;

int DescribeAllButB(Json::Value& info, const QUENDELSendDataParam_t& item) {
  info["path"] = item.path;
  return item.path == "/tmp/b.txt" ? result_for_b : 0;
}

int ThrowForB(Json::Value& info, const QUENDELSendDataParam_t& item) {
  if (item.path == "/tmp/b.txt") {
    throw std::runtime_error("no description");
  }
  return Describe(info, item);
}

Json::Value given_info;

int DescribeWhole(Json::Value& info, const QUENDELSendDataParam_t& item) {
  given_info = info;
  info["type"] = item.type;
  info["fileuuid"] = item.fileuuid;
  info["timestamp"] = static_cast<Json::UInt64>(item.timestamp);
  return Describe(info, item);
}

int PostOne() {
  return QUENDELPostFileToServer(kUrl, "file", NewFile("/tmp/a.txt", "a"), Describe);
}

// The "path" of each description in the only request so far.
std::vector<std::string> DescribedPaths() {
  std::vector<std::string> paths;
  for (const Json::Value& description : JsonOf(Parts(Requests().at(0)).back().body)) {
    paths.push_back(description["path"].asString());
  }
  return paths;
}

long PeakMemoryKiB() {
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.rfind("VmHWM:", 0) == 0) {
      return std::stol(line.substr(6));
    }
  }
  ADD_FAILURE() << "the kernel does not tell the peak memory";
  return 0;
}

}  // namespace

TEST(PostFileToServerTest, PostsEachFileAndThenTheDescriptionsUnderOneName) {
  const std::string bytes("a\0\r\n--b\xff", 8);
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "upload_list",
                                    Items{NewFile("/tmp/z.tar.xz", bytes),
                                          NewFile("/tmp/a.txt", ""), NewFile("/tmp/m", "m\r\n")},
                                    Describe),
            0);

  ASSERT_THAT(Requests(), SizeIs(1));
  EXPECT_EQ(Requests()[0].line, "POST /upload_file/a1 HTTP/1.1");
  EXPECT_EQ(Header(Requests()[0], "Host"), "support.test:51790");
  const std::vector<Part> parts = Parts(Requests()[0]);
  ASSERT_THAT(parts, SizeIs(4));
  EXPECT_EQ(parts[0], FilePart("upload_list", "z.tar.xz", "application/octet-stream", bytes));
  EXPECT_EQ(parts[1], FilePart("upload_list", "a.txt", "text/plain", ""));
  EXPECT_EQ(parts[2], FilePart("upload_list", "m", "application/octet-stream", "m\r\n"));
  EXPECT_EQ(parts[3].headers, TextPart("upload_list", "").headers);
  EXPECT_THAT(DescribedPaths(), ElementsAre("/tmp/z.tar.xz", "/tmp/a.txt", "/tmp/m"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(PostFileToServerTest, HandsAnEmptyObjectAndTheItemToBeDescribed) {
  given_info = "nothing given";
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file", NewFile("/tmp/a.txt", "a"), DescribeWhole), 0);

  EXPECT_EQ(given_info, Json::Value(Json::objectValue));
  EXPECT_EQ(JsonOf(Parts(Requests().at(0)).at(1).body),
            JsonOf(R"([{"path":"/tmp/a.txt","type":"dump","fileuuid":"u-1",
                             "timestamp":1709622489}])"));
}

TEST(PostFileToServerTest, PostsAnEmptyArrayForNoItems) {
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file", Items(), Describe), 0);
  EXPECT_THAT(Parts(Requests().at(0)), ElementsAre(TextPart("file", "[]")));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(PostFileToServerTest, PostsASingleFile) {
  EXPECT_EQ(PostOne(), 0);
  const std::vector<Part> parts = Parts(Requests().at(0));
  ASSERT_THAT(parts, SizeIs(2));
  EXPECT_EQ(parts[0], FilePart("file", "a.txt", "text/plain", "a"));
  EXPECT_THAT(DescribedPaths(), ElementsAre("/tmp/a.txt"));
}

TEST(PostFileToServerTest, PostsTheSameFileTwice) {
  const QUENDELSendDataParam_t item = NewFile("/tmp/a.txt", "a");
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file", Items{item, item}, Describe), 0);
  EXPECT_THAT(Parts(Requests().at(0)), SizeIs(3));
  EXPECT_THAT(DescribedPaths(), ElementsAre("/tmp/a.txt", "/tmp/a.txt"));
}

TEST(PostFileToServerTest, KeepsAFileThatCannotBeDescribed) {
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file",
                                    Items{NewFile("/tmp/a.txt", "a"), NewFile("/tmp/b.txt", "b"),
                                          NewFile("/tmp/c.txt", "c")},
                                    DescribeAllButB),
            0);
  const std::vector<Part> parts = Parts(Requests().at(0));
  ASSERT_THAT(parts, SizeIs(4));
  EXPECT_EQ(parts[1], FilePart("file", "b.txt", "text/plain", "b"));
  EXPECT_THAT(DescribedPaths(), ElementsAre("/tmp/a.txt", "/tmp/c.txt"));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to gen file metadata: '/tmp/b.txt'")));
}

TEST(PostFileToServerTest, TakesAnyResultButZeroForAFailedDescription) {
  for (const int result : {-2, -1, 1}) {
    result_for_b = result;
    EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file", NewFile("/tmp/b.txt", "b"), DescribeAllButB),
              0);
    EXPECT_EQ(JsonOf(Parts(Requests().back()).back().body), Json::Value(Json::arrayValue))
        << result;
  }
}

TEST(PostFileToServerTest, TakesAThrownExceptionForAFailedDescription) {
  EXPECT_EQ(
      QUENDELPostFileToServer(
          kUrl, "file", Items{NewFile("/tmp/b.txt", "b"), NewFile("/tmp/c.txt", "c")}, ThrowForB),
      0);
  EXPECT_THAT(DescribedPaths(), ElementsAre("/tmp/c.txt"));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to gen file metadata: '/tmp/b.txt'")));
}

TEST(PostFileToServerTest, NeitherPostsNorDescribesAFileThatCannotBeAdded) {
  On("curl_formadd").Nth(1).Return(CURL_FORMADD_MEMORY);
  EXPECT_EQ(
      QUENDELPostFileToServer(
          kUrl, "file", Items{NewFile("/tmp/b.txt", "b"), NewFile("/tmp/c.txt", "c")}, ThrowForB),
      0);
  const std::vector<Part> parts = Parts(Requests().at(0));
  ASSERT_THAT(parts, SizeIs(2));
  EXPECT_EQ(parts[0], FilePart("file", "c.txt", "text/plain", "c"));
  EXPECT_THAT(DescribedPaths(), ElementsAre("/tmp/c.txt"));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to add curl form: '/tmp/b.txt'")));
}

TEST(PostFileToServerTest, FailsBeforeAnyTransferWhenTheDescriptionsCannotBeAdded) {
  On("curl_formadd").Nth(2).Return(CURL_FORMADD_MEMORY);
  EXPECT_EQ(PostOne(), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to add curl form: [{\"path\":\"/tmp/a.txt\"}]")));
  EXPECT_EQ(Calls("curl_easy_init"), 0);
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(PostFileToServerTest, FailsWithoutATransferHandle) {
  On("curl_easy_init").Nth(1).Return(nullptr);
  EXPECT_EQ(PostOne(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to allocate memory for curl")));
  EXPECT_EQ(Calls("curl_easy_perform"), 0);
}

TEST(PostFileToServerTest, SetsItsSevenOptionsInOrderAndNoOther) {
  Record("curl_easy_setopt");
  ASSERT_EQ(PostOne(), 0);
  std::vector<std::string> expected;
  for (CURLoption option :
       {CURLOPT_URL, CURLOPT_PORT, CURLOPT_SSL_VERIFYPEER, CURLOPT_SSL_VERIFYHOST, CURLOPT_HTTPPOST,
        CURLOPT_WRITEFUNCTION, CURLOPT_WRITEDATA}) {
    expected.push_back(std::to_string(static_cast<int>(option)));
  }
  EXPECT_EQ(Recorded(), expected);
}

TEST(PostFileToServerTest, StopsAtTheFirstOptionThatFails) {
  for (int nth = 1; nth <= 7; ++nth) {
    ClearLog();
    ResetCalls();
    On("curl_easy_setopt").Nth(nth).Return(CURLE_UNKNOWN_OPTION);
    EXPECT_EQ(PostOne(), -1);
    EXPECT_EQ(Calls("curl_easy_setopt"), nth);
    EXPECT_EQ(Calls("curl_easy_perform"), 0);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_UNKNOWN_OPTION)))) << nth;
  }
}

TEST(PostFileToServerTest, FailsWhenTheTransferFails) {
  On("curl_easy_perform").Nth(1).Return(CURLE_COULDNT_CONNECT);
  EXPECT_EQ(PostOne(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_COULDNT_CONNECT))));
  EXPECT_EQ(Calls("curl_easy_getinfo"), 0);
}

TEST(PostFileToServerTest, FailsWhenTheStatusCannotBeRead) {
  On("curl_easy_getinfo").Nth(1).Return(CURLE_UNKNOWN_OPTION);
  EXPECT_EQ(PostOne(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_UNKNOWN_OPTION))));
}

TEST(PostFileToServerTest, FailsOnAMissingFileOnlyWhenItIsSent) {
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file", Item("/tmp/missing"), Describe), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_READ_ERROR))));
}

TEST(PostFileToServerTest, FailsWhenTheServerClosesWithoutAnAnswer) {
  Answer({.cut_after = 0});
  EXPECT_EQ(PostOne(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, testing::StartsWith("CURL Error("))));
}

TEST(PostFileToServerTest, FailsWhenTheReplyIsCut) {
  Answer({.body = R"({"success":true})", .content_length = 100});
  EXPECT_EQ(PostOne(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_PARTIAL_FILE))));
}

TEST(PostFileToServerTest, FailsOnARefusalWhateverTheStatus) {
  for (int status : {200, 500}) {
    ClearLog();
    Answer({.status = status, .body = R"({"success":false,"code":111000})"});
    EXPECT_EQ(PostOne(), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged("request_util", "Response is not success"),
                                   Logged(kUnit,
                                          "Failed to handle response: "
                                          "[{\"success\":false,\"code\":111000}]")))
        << status;
  }
}

TEST(PostFileToServerTest, FailsOnAReplyThatIsNotJson) {
  Answer({.status = 502, .body = "<html>bad gateway</html>"});
  EXPECT_EQ(PostOne(), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("request_util", "Failed to parse response"),
                                 Logged(kUnit,
                                        "Failed to handle response: "
                                        "[<html>bad gateway</html>]")));
}

TEST(PostFileToServerTest, FailsOnAnEmptyReply) {
  Answer({.body = ""});
  EXPECT_EQ(PostOne(), -1);
  EXPECT_THAT(Log(), ElementsAre(_, Logged(kUnit, "Failed to handle response: []")));
}

TEST(PostFileToServerTest, FailsOnAnyOtherStatusOfAnAcceptedPost) {
  for (int status : {201, 302, 404, 500}) {
    ClearLog();
    Answer({.status = status, .body = R"({"success":true})"});
    EXPECT_EQ(PostOne(), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged(
                           kUnit, "Failed to post file, server return " + std::to_string(status))));
  }
}

TEST(PostFileToServerTest, GivesTheResultOfTheListForASingleFile) {
  Answer({.status = 500, .body = R"({"success":true})"});
  EXPECT_EQ(PostOne(), -1);
}

TEST(PostFileToServerTest, NeverRetries) {
  Answer({.status = 500, .body = R"({"success":true})"});
  PostOne();
  EXPECT_THAT(Requests(), SizeIs(1));
}

TEST(PostFileToServerTest, AcceptsAnyCertificate) {
  for (const char* certificate : {"self-signed", "expired", "wrong-host"}) {
    UseCertificate(certificate);
    EXPECT_EQ(PostOne(), 0) << certificate;
  }
}

TEST(PostFileToServerTest, NeverTakesThePortFromTheUrl) {
  EXPECT_EQ(QUENDELPostFileToServer("https://support.test:1/a", "file", Items(), Describe), 0);
}

TEST(PostFileToServerTest, SendsAFileOfMoreThanAMebibyteWhole) {
  std::string bytes(3 << 20, '\0');
  for (size_t i = 0; i < bytes.size(); ++i) {
    bytes[i] = static_cast<char>(i * i >> 7);
  }
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file", NewFile("/tmp/large", bytes), Describe), 0);
  EXPECT_EQ(Header(Requests().at(0), "Expect"), "100-continue");
  EXPECT_EQ(Parts(Requests()[0]).at(0).body, bytes);
}

TEST(PostFileToServerTest, NeverHoldsAFileInMemory) {
  ASSERT_EQ(PostOne(), 0);  // what libcurl and the TLS library need once
  constexpr long kFileKiB = 64 << 10;
  const QUENDELSendDataParam_t item = NewFile("/tmp/large", "");
  ASSERT_EQ(truncate("/tmp/large", kFileKiB << 10), 0);
  const long before = PeakMemoryKiB();
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file", item, Describe), 0);
  EXPECT_LT(PeakMemoryKiB() - before, kFileKiB / 2);
}

TEST(PostFileToServerTest, NeverFreesTheForm) {
  EXPECT_EQ(PostOne(), 0);
  EXPECT_EQ(Calls("curl_formadd"), 2);
  EXPECT_EQ(Calls("curl_formfree"), 0);
}
