// URLs, received bytes, and what a reply says.
#include <gmock/gmock.h>

#include "quendel.h"
#include "support/appliance.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "request_util";

}  // namespace

TEST(GenerateReqTest, PutsEachPieceBehindASlash) {
  EXPECT_EQ(QUENDELGenerateReq({"heartbeat", "1234ABC"}), "https://support.test/heartbeat/1234ABC");
}

TEST(GenerateReqTest, IsTheBareHostWithoutPieces) {
  EXPECT_EQ(QUENDELGenerateReq({}), "https://support.test");
}

TEST(GenerateReqTest, TakesPiecesAsTheyAre) {
  EXPECT_EQ(QUENDELGenerateReq({"", "a/b", "x y?#", ""}), "https://support.test//a/b/x y?#/");
}

TEST(GetResponseTest, AppendsTheBytes) {
  std::string sink = "a";
  char data[] = {'b', '\0', 'c', 'd'};
  EXPECT_EQ(QUENDELGetResponse(data, 2, 2, &sink), 4U);
  EXPECT_EQ(sink, std::string("ab\0cd", 5));
  EXPECT_EQ(QUENDELGetResponse(data, 1, 0, &sink), 0U);
  EXPECT_EQ(sink.size(), 5U);
}

TEST(GetResponseTest, EndsTheTransferWhenMemoryRunsOut) {
  std::string sink;
  char data[1] = {};
  EXPECT_EQ(QUENDELGetResponse(data, 1, sink.max_size() + 1, &sink), 0U);
}

TEST(ParseResponseTest, IsZeroForSuccess) {
  EXPECT_EQ(QUENDELParseResponse(R"({"success":true})"), 0);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ParseResponseTest, LetsSuccessWinOverACode) {
  EXPECT_EQ(QUENDELParseResponse(R"({"success":true,"code":111000})"), 0);
}

TEST(ParseResponseTest, IsTheServersCode) {
  EXPECT_EQ(QUENDELParseResponse(R"({"success":false,"code":111001})"), 111001);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Response is not success")));
  EXPECT_EQ(QUENDELGetWebapiError(111001), 6905);
}

TEST(ParseResponseTest, IsTheServersCodeWithoutAWordOfSuccess) {
  EXPECT_EQ(QUENDELParseResponse(R"({"code":111000})"), 111000);
  EXPECT_EQ(QUENDELParseResponse(R"({"code":-7})"), -7);
}

TEST(ParseResponseTest, PassesOnTheServersUnspecifiedFailure) {
  EXPECT_EQ(QUENDELParseResponse(R"({"success":false,"code":119999})"), 119999);
}

TEST(ParseResponseTest, HasACodeForAFailureWithoutOne) {
  EXPECT_EQ(QUENDELParseResponse(R"({"success":false})"), 119999);
  EXPECT_EQ(QUENDELParseResponse(R"({"success":false,"code":0})"), 119999);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Response is not success"),
                                 Logged(kUnit, "Response is not success")));
}

TEST(ParseResponseTest, HasACodeForATextThatIsNotJson) {
  for (const char* text : {"", "<html>Bad gateway</html>", "{\"success\":true"}) {
    ClearLog();
    EXPECT_EQ(QUENDELParseResponse(text), 119999) << text;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to parse response"))) << text;
  }
}

TEST(ParseResponseTest, TakesUnexpectedKindsForNoAnswer) {
  for (const char* text :
       {"[]", "\"x\"", "12", "null", "true", R"({"success":"true"})", R"({"success":[]})",
        R"({"success":{},"code":"111000"})", R"({"success":false,"code":[1]})",
        R"({"success":false,"code":99999999999})", R"({"success":false,"code":1e300})"}) {
    ClearLog();
    EXPECT_EQ(QUENDELParseResponse(text), 119999) << text;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Response is not success"))) << text;
  }
}

TEST(ParseResponseTest, ConvertsNumbers) {
  EXPECT_EQ(QUENDELParseResponse(R"({"success":1})"), 0);
  EXPECT_EQ(QUENDELParseResponse(R"({"success":0,"code":111000.9})"), 111000);
}

TEST(GetWebapiErrorTest, TranslatesTheServersCodes) {
  EXPECT_EQ(QUENDELGetWebapiError(111000), 403);
  EXPECT_EQ(QUENDELGetWebapiError(111001), 6905);
  EXPECT_EQ(QUENDELGetWebapiError(119999), 6999);
}

TEST(GetWebapiErrorTest, HasOneErrorForEveryOtherCode) {
  for (int code : {0, -1, 110999, 111002, 120000}) {
    EXPECT_EQ(QUENDELGetWebapiError(code), 6900) << code;
  }
}

TEST(WebapiErrorMapTest, HoldsTheCodesThatHaveAnErrorOfTheirOwn) {
  const std::map<int, _tag_WEBAPI_CORE_ERR> expected = {
      {111000, static_cast<_tag_WEBAPI_CORE_ERR>(403)},
      {111001, static_cast<_tag_WEBAPI_CORE_ERR>(6905)},
      {119999, static_cast<_tag_WEBAPI_CORE_ERR>(6999)}};
  EXPECT_EQ(QUENDELWebapiErrorMap, expected);
}
