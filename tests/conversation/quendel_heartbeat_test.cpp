// The heartbeat, and the actions that come back with it.
#include <gmock/gmock.h>

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

constexpr char kUnit[] = "quendel_heartbeat";

// Sends a heartbeat that must fail and must leave the actions alone.
void ExpectFailure() {
  Json::Value actions = "before";
  EXPECT_EQ(QUENDELHeartbeat(actions), -1);
  EXPECT_EQ(actions, "before");
}

// Sends a heartbeat that the server accepts without actions. Returns what became of these.
Json::Value WithoutActions(Json::Value actions) {
  EXPECT_EQ(QUENDELHeartbeat(actions), 0);
  return actions;
}

}  // namespace

TEST(ActionNamesTest, AreIndexedByEvent) {
  EXPECT_THAT(QUENDEL_ACTION_NAMES,
              ElementsAre(testing::StrEq("enable"), testing::StrEq("disable"),
                          testing::StrEq("poweroff"), testing::StrEq("reboot"),
                          testing::StrEq("logout"), testing::StrEq("update_info")));
  EXPECT_STREQ(QUENDEL_ACTION_NAMES[QUENDEL_EVENT_REBOOT], "reboot");
}

TEST(HeartbeatTest, PostsNullToTheDevicesUrl) {
  SetIdentity();
  Json::Value actions;
  ASSERT_EQ(QUENDELHeartbeat(actions), 0);
  ASSERT_EQ(Requests().size(), 1U);
  EXPECT_EQ(Requests()[0].line, "POST /heartbeat/S1 HTTP/1.1");
  EXPECT_EQ(Requests()[0].body, "null");
}

TEST(HeartbeatTest, NeedsNoAccount) {
  SetIdentity({{"serial_number", "S1"}});
  Json::Value actions;
  EXPECT_EQ(QUENDELHeartbeat(actions), 0);
}

TEST(HeartbeatTest, SendsThirtyFiveBytesOfTheSerialNumber) {
  SetIdentity({{"serial_number", std::string(40, 'N')}});
  Json::Value actions;
  ASSERT_EQ(QUENDELHeartbeat(actions), 0);
  EXPECT_EQ(Requests().at(0).line, "POST /heartbeat/" + std::string(35, 'N') + " HTTP/1.1");
}

TEST(HeartbeatTest, HandsTheActionsOverUnchanged) {
  SetIdentity();
  Answer({.body = R"({"success":true,"actions":[{"x":1}]})"});
  Json::Value actions = "before";
  EXPECT_EQ(QUENDELHeartbeat(actions), 0);
  EXPECT_EQ(actions, JsonOf(R"([{"x":1}])"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(HeartbeatTest, HandsOverActionsOfAnyKind) {
  SetIdentity();
  for (const char* kind : {"{\"a\":[]}", "\"text\"", "12", "null", "false"}) {
    Answer({.body = std::string(R"({"success":true,"actions":)") + kind + "}"});
    Json::Value actions = "before";
    EXPECT_EQ(QUENDELHeartbeat(actions), 0);
    EXPECT_EQ(actions, JsonOf(kind)) << kind;
  }
}

TEST(HeartbeatTest, ClearsActionsOfAnyKindWhenTheReplyHasNone) {
  SetIdentity();
  EXPECT_EQ(WithoutActions(JsonOf("{\"a\":1}")), Json::Value(Json::objectValue));
  EXPECT_EQ(WithoutActions(JsonOf("[1,2]")), Json::Value(Json::arrayValue));
  for (const char* kind : {"\"text\"", "12", "1.5", "true", "null"}) {
    EXPECT_EQ(WithoutActions(JsonOf(kind)), Json::Value()) << kind;
  }
}

TEST(HeartbeatTest, FailsWithoutASerialNumber) {
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get serial number")));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(HeartbeatTest, TakesOnlyANegativeAnswerForAMissingSerialNumber) {
  On("ALIBGetSerialNumber").Nth(1).Return(1);
  Json::Value actions;
  EXPECT_EQ(QUENDELHeartbeat(actions), 0);
  EXPECT_EQ(Requests().at(0).line, "POST /heartbeat/ HTTP/1.1");
  On("ALIBGetSerialNumber").Nth(1).Return(-7);
  ExpectFailure();
}

TEST(HeartbeatTest, FailsWhenTheServerRefuses) {
  SetIdentity();
  Answer({.body = R"({"success":false,"actions":[]})"});
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to send heartbeat, server return failed. "
                                        "[{\"actions\":[],\"success\":false}]")));
}

TEST(HeartbeatTest, FailsOnABadStatusWhateverTheReplySays) {
  SetIdentity();
  Answer({.status = 500, .body = R"({"success":true,"actions":[1]})"});
  ExpectFailure();
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_post_data_to_server", _),
                                 Logged(kUnit, "Failed to post quendel config")));
}

TEST(HeartbeatTest, NeverRetries) {
  SetIdentity();
  Answer({.status = 500, .body = "{}"});
  ExpectFailure();
  EXPECT_EQ(Requests().size(), 1U);
}
