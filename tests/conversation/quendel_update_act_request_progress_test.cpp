// The progress report.
#include <gmock/gmock.h>

#include <climits>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"
#include "support/server.h"

using namespace quendel::test;
using testing::_;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "quendel_update_act_request_progress";

const Json::Value kEmptyObject(Json::objectValue);

int Report(int requestId, int progress, const Json::Value& details = kEmptyObject) {
  return QUENDELUpdateActRequestProgress(requestId, static_cast<QuendelActionProgress_t>(progress),
                                         details);
}

}  // namespace

TEST(UpdateActRequestProgressTest, NamesRequestAndProgressInTheUrl) {
  SetIdentity();
  EXPECT_EQ(Report(17, QUENDEL_ACT_PROGRESS_NO_FILE), 0);
  EXPECT_EQ(RequestLine(), "POST /action_progress/17/-3/a1/b2/S1 HTTP/1.1");
  EXPECT_EQ(Requests()[0].body, "{}");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(UpdateActRequestProgressTest, WritesZerosAsZeros) {
  SetIdentity();
  EXPECT_EQ(Report(0, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_EQ(RequestLine(), "POST /action_progress/0/0/a1/b2/S1 HTTP/1.1");
}

TEST(UpdateActRequestProgressTest, WritesTheWidestNumbers) {
  SetIdentity();
  EXPECT_EQ(Report(INT_MIN, INT_MAX), 0);
  EXPECT_EQ(RequestLine(), "POST /action_progress/-2147483648/2147483647/a1/b2/S1 HTTP/1.1");
}

TEST(UpdateActRequestProgressTest, SendsTheDetailsAsTheyAre) {
  SetIdentity();
  const Json::Value details = JsonOf(R"({"a":[1,{"b":null}]})");
  EXPECT_EQ(Report(1, QUENDEL_ACT_PROGRESS_RUN, details), 0);
  EXPECT_EQ(JsonOf(Requests().at(0).body), details);
}

TEST(UpdateActRequestProgressTest, LeavesTheSegmentsOfEmptyFieldsEmpty) {
  SetIdentity({{"serial_number", "S1"}, {"account_email", "mail1"}});
  EXPECT_EQ(Report(17, 0), 0);
  EXPECT_EQ(RequestLine(), "POST /action_progress/17/0///S1 HTTP/1.1");
}

TEST(UpdateActRequestProgressTest, TakesOnlyANegativeAnswerForAMissingAccount) {
  SetIdentity();
  On("ARVOMYHUBAccountGet").Nth(1).Return(1);
  EXPECT_EQ(Report(17, 0), 0);
  EXPECT_EQ(RequestLine(), "POST /action_progress/17/0///S1 HTTP/1.1");
  On("ARVOMYHUBAccountGet").Nth(1).Return(-7);
  EXPECT_EQ(Report(17, 0), -1);
}

TEST(UpdateActRequestProgressTest, AsksThePlatformForOneWholeRecord) {
  SetIdentity();
  Record("calloc");
  EXPECT_EQ(Report(17, 0), 0);
  EXPECT_THAT(Recorded(), ElementsAre("1|20256"));
}

TEST(UpdateActRequestProgressTest, FailsWithoutMemoryBeforeAnythingElse) {
  On("calloc").Nth(1).Return(nullptr);
  EXPECT_EQ(Report(17, 0), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to malloc for pMyhubAccount")));
  EXPECT_EQ(Calls("ALIBGetSerialNumber"), 0);
}

TEST(UpdateActRequestProgressTest, AsksForTheSerialNumberBeforeTheAccount) {
  SetIdentity({{"service_quendeld", "yes"}});
  EXPECT_EQ(Report(17, 0), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get serial number")));
  EXPECT_EQ(Calls("ARVOMYHUBAccountGet"), 0);
}

TEST(UpdateActRequestProgressTest, FailsWithoutAnAccount) {
  SetIdentity({{"serial_number", "S1"}});
  EXPECT_EQ(Report(17, 0), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get account")));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(UpdateActRequestProgressTest, FailsWhenTheReportDoesNotGetThrough) {
  SetIdentity();
  Answer({.status = 500, .body = R"({"success":true})"});
  EXPECT_EQ(Report(17, 0), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_post_data_to_server", _),
                                 Logged(kUnit, "Failed to post quendel config")));
  EXPECT_EQ(Requests().size(), 1U);
}

TEST(UpdateActRequestProgressTest, FailsWhenTheServerRefuses) {
  SetIdentity();
  Answer({.body = R"({"success":false})"});
  EXPECT_EQ(Report(17, 0), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to update action request, server return failed. "
                                        "[{\"success\":false}]")));
}
