// The JSON post, against a real TLS server.
#include <curl/curl.h>
#include <gmock/gmock.h>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"
#include "support/server.h"
#include "transport/curl_line.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;

namespace {

constexpr char kUnit[] = "quendel_post_data_to_server";
constexpr char kUrl[] = "https://support.test/a/b";

Json::Value Object(const char* key, const Json::Value& value) {
  Json::Value object;
  object[key] = value;
  return object;
}

// Posts and expects failure; the response must be as it was.
void ExpectFailure() {
  Json::Value response = "before";
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), -1);
  EXPECT_EQ(response, "before");
}

}  // namespace

TEST(PostDataToServerTest, ReturnsTheParsedReply) {
  Answer({.body = R"({"success":true})"});
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
  EXPECT_EQ(response, Object("success", true));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(PostDataToServerTest, LeavesTheJudgementOfSuccessToTheCaller) {
  Answer({.body = R"({"success":false})"});
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
  EXPECT_EQ(response, Object("success", false));
}

TEST(PostDataToServerTest, SendsTheHeadersInTheirOrder) {
  Json::Value response;
  ASSERT_EQ(QUENDELPostDataToServer(kUrl, Object("k", 1), response), 0);
  ASSERT_EQ(Requests().size(), 1U);
  const Request request = Requests()[0];
  EXPECT_EQ(request.line, "POST /a/b HTTP/1.1");
  // Host is libcurl's own, and so is the length; libcurl's User-Agent is off by default.
  EXPECT_THAT(request.headers, ElementsAre(Pair("Host", "support.test:51790"),
                                           Pair("Content-Type", "application/json"),
                                           Pair("Accept", "application/json"),
                                           Pair("charsets", "utf-8"), Pair("Content-Length", "7")));
}

TEST(PostDataToServerTest, SendsTheRequestsJson) {
  Json::Value request;
  request["text"] = std::string("a\0\"\n\xC3\xA9", 6);
  request["list"].append(1.5);
  Json::Value response;
  ASSERT_EQ(QUENDELPostDataToServer(kUrl, request, response), 0);
  EXPECT_EQ(JsonOf(Requests().at(0).body), request);
}

TEST(PostDataToServerTest, SendsNullForANullRequest) {
  Json::Value response;
  ASSERT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
  EXPECT_EQ(Requests().at(0).body, "null");
}

TEST(PostDataToServerTest, SendsABodyOfAnySizeWhole) {
  const Json::Value request(std::string(3 << 20, 'x'));
  Json::Value response;
  ASSERT_EQ(QUENDELPostDataToServer(kUrl, request, response), 0);
  EXPECT_EQ(Requests().at(0).body.size(), (3U << 20) + 2);
}

TEST(PostDataToServerTest, AcceptsASelfSignedCertificate) {
  UseCertificate("self-signed");
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
}

TEST(PostDataToServerTest, AcceptsAnExpiredCertificate) {
  UseCertificate("expired");
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
}

TEST(PostDataToServerTest, AcceptsACertificateForAnotherHost) {
  UseCertificate("wrong-host");
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
}

TEST(PostDataToServerTest, FailsOnAnyOtherStatusAndStillGivesTheReply) {
  Answer({.status = 500, .body = R"({"error":1})"});
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Object("k", 1), response), -1);
  EXPECT_EQ(response, Object("error", 1));
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to send data '{\"k\":1}', server return 500")));
}

TEST(PostDataToServerTest, TakesNoOtherStatusForSuccess) {
  for (int status : {201, 204, 301, 404}) {
    ClearLog();
    Answer({.status = status, .body = status == 204 ? "" : "{}"});
    Json::Value response;
    EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), -1) << status;
  }
}

TEST(PostDataToServerTest, FollowsNoRedirect) {
  Answer({.status = 302, .body = "{}", .headers = {{"Location", "https://support.test:51790/z"}}});
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), -1);
  EXPECT_EQ(Requests().size(), 1U);
}

TEST(PostDataToServerTest, QuotesAReplyThatIsNotJson) {
  Answer({.body = "<html>\nHello</html>"});
  ExpectFailure();
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to parse response. [<html>\nHello</html>]")));
}

TEST(PostDataToServerTest, ParsesTheReplyBeforeItLooksAtTheStatus) {
  Answer({.status = 502, .body = "<html>"});
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to parse response. [<html>]")));
}

TEST(PostDataToServerTest, TakesAnEmptyReplyForNoJson) {
  Answer({.body = ""});
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to parse response. []")));
}

TEST(PostDataToServerTest, TakesAChunkedReply) {
  Answer({.body = R"({"success":true})", .chunked = true});
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
  EXPECT_EQ(response, Object("success", true));
}

TEST(PostDataToServerTest, TakesAReplyThatComesByteByByte) {
  Answer({.body = R"({"success":true})", .slow_byte_ms = 2});
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
}

TEST(PostDataToServerTest, FailsWhenTheReplyIsCut) {
  Answer({.body = R"({"success":true})", .content_length = 100});
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_PARTIAL_FILE))));
}

TEST(PostDataToServerTest, FailsWhenTheServerClosesWithoutAnAnswer) {
  Answer({.cut_after = 0});
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_GOT_NOTHING))));
}

TEST(PostDataToServerTest, FailsWhenTheHostIsNotKnown) {
  Json::Value response = "before";
  EXPECT_EQ(QUENDELPostDataToServer("https://no.such.host/", Json::Value(), response), -1);
  EXPECT_EQ(response, "before");
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_COULDNT_RESOLVE_HOST))));
}

TEST(PostDataToServerTest, NeverTakesThePortFromTheUrl) {
  Json::Value response;
  EXPECT_EQ(QUENDELPostDataToServer("https://support.test:1/a", Json::Value(), response), 0);
}

TEST(PostDataToServerTest, FailsWithoutATransferHandle) {
  On("curl_easy_init").Nth(1).Return(nullptr);
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to allocate memory for curl")));
}

TEST(PostDataToServerTest, FailsWhenAnyHeaderCannotBeAdded) {
  for (int nth = 1; nth <= 3; ++nth) {
    ClearLog();
    On("curl_slist_append").Nth(nth).Return(nullptr);
    ExpectFailure();
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to allocate memory for curl"))) << nth;
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(PostDataToServerTest, SetsItsNineOptionsInOrderAndNoOther) {
  Record("curl_easy_setopt");
  Json::Value response;
  ASSERT_EQ(QUENDELPostDataToServer(kUrl, Json::Value(), response), 0);
  std::vector<std::string> expected;
  for (CURLoption option : {CURLOPT_HTTPHEADER, CURLOPT_URL, CURLOPT_PORT, CURLOPT_SSL_VERIFYPEER,
                            CURLOPT_SSL_VERIFYHOST, CURLOPT_POSTFIELDS, CURLOPT_POSTFIELDSIZE,
                            CURLOPT_WRITEFUNCTION, CURLOPT_WRITEDATA}) {
    expected.push_back(std::to_string(static_cast<int>(option)));
  }
  EXPECT_EQ(Recorded(), expected);
}

TEST(PostDataToServerTest, StopsAtTheFirstOptionThatFails) {
  for (int nth = 1; nth <= 9; ++nth) {
    ClearLog();
    ResetCalls();
    On("curl_easy_setopt").Nth(nth).Return(CURLE_UNKNOWN_OPTION);
    ExpectFailure();
    EXPECT_EQ(Calls("curl_easy_setopt"), nth);
    EXPECT_EQ(Calls("curl_easy_perform"), 0);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_UNKNOWN_OPTION)))) << nth;
  }
}

TEST(PostDataToServerTest, FailsWhenTheStatusCannotBeRead) {
  On("curl_easy_getinfo").Nth(1).Return(CURLE_UNKNOWN_OPTION);
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, CurlLine(CURLE_UNKNOWN_OPTION))));
}

TEST(PostDataToServerTest, NeverRetries) {
  Answer({.status = 500, .body = "{}"});
  Json::Value response;
  QUENDELPostDataToServer(kUrl, Json::Value(), response);
  EXPECT_EQ(Requests().size(), 1U);
}
