// The event report.
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

constexpr char kUnit[] = "quendel_post_event_to_server";
constexpr char kConf[] = "/usr/arvo/etc/quendel.conf";

const Json::Value kNoInfo;

// Reports an event that must fail before anything is sent.
void ExpectRefusal(int event, const std::string& message) {
  Json::Value reply = "before";
  EXPECT_EQ(QUENDELPostEventToServer(static_cast<QuendelEvent_t>(event), reply, kNoInfo), -1);
  EXPECT_EQ(reply, "before");
  EXPECT_THAT(Log(), testing::Contains(Logged(kUnit, message)));
  EXPECT_THAT(Requests(), IsEmpty());
}

}  // namespace

TEST(PostEventToServerTest, DescribesTheDeviceWhenTheServiceIsEnabled) {
  SetIdentity();
  Json::Value reply;
  EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_ENABLE, reply, JsonOf(R"({"model":"X"})")), 0);
  EXPECT_EQ(Requests().at(0).line, "POST /action/a1/b2/S1 HTTP/1.1");
  EXPECT_EQ(JsonOf(Requests()[0].body), JsonOf(R"({"action":"enable","hmx_account_email":"mail1",)"
                                               R"("hmx_info":{"model":"X"},"contact":[]})"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(PostEventToServerTest, DescribesTheDeviceWithWhateverTheCallerGives) {
  SetIdentity();
  Json::Value reply;
  EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_ENABLE, reply, Json::Value()), 0);
  const Json::Value body = JsonOf(Requests().at(0).body);
  EXPECT_TRUE(body.isMember("hmx_info"));
  EXPECT_TRUE(body["hmx_info"].isNull());
}

TEST(PostEventToServerTest, NamesEveryEventAndDescribesTheDeviceOnlyOnce) {
  SetIdentity();
  const char* names[] = {"enable", "disable", "poweroff", "reboot", "logout", "update_info"};
  for (int event = 0; event <= 5; ++event) {
    Json::Value reply;
    EXPECT_EQ(QUENDELPostEventToServer(static_cast<QuendelEvent_t>(event), reply,
                                       JsonOf(R"({"model":"X"})")),
              0);
    const Json::Value body = JsonOf(Requests().back().body);
    EXPECT_EQ(body["action"], names[event]);
    EXPECT_EQ(body.isMember("hmx_info"), event == 0) << names[event];
  }
}

TEST(PostEventToServerTest, CarriesTheContactListUnchanged) {
  SetIdentity();
  WriteFile(kConf, "contact={\"any\":[1]}\n");
  Json::Value reply;
  EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_REBOOT, reply, kNoInfo), 0);
  EXPECT_EQ(JsonOf(Requests().at(0).body)["contact"], JsonOf("{\"any\":[1]}"));
}

TEST(PostEventToServerTest, GoesOutWithAContactEntryThatIsNotJson) {
  SetIdentity();
  WriteFile(kConf, "contact=not json\n");
  Json::Value reply;
  EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_REBOOT, reply, kNoInfo), 0);
  EXPECT_EQ(JsonOf(Requests().at(0).body)["contact"], Json::Value(Json::arrayValue));
}

TEST(PostEventToServerTest, GivesTheReply) {
  SetIdentity();
  Answer({.body = R"({"success":true,"more":1})"});
  Json::Value reply;
  EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_LOGOUT, reply, kNoInfo), 0);
  EXPECT_EQ(reply, JsonOf(R"({"success":true,"more":1})"));
}

TEST(PostEventToServerTest, FailsWhenTheServerRefusesAndStillGivesTheReply) {
  SetIdentity();
  Answer({.body = R"({"success":false,"code":1})"});
  Json::Value reply;
  EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_LOGOUT, reply, kNoInfo), -1);
  EXPECT_EQ(reply, JsonOf(R"({"success":false,"code":1})"));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to post event, server return failed. "
                                        "[{\"code\":1,\"success\":false}]")));
}

TEST(PostEventToServerTest, FailsOnABadStatusAndStillGivesTheReply) {
  SetIdentity();
  Answer({.status = 500, .body = R"({"success":true})"});
  Json::Value reply;
  EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_LOGOUT, reply, kNoInfo), -1);
  EXPECT_EQ(reply, JsonOf(R"({"success":true})"));
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_post_data_to_server", _),
                                 Logged(kUnit, "Failed to post quendel config")));
}

TEST(PostEventToServerTest, RefusesAValueThatIsNoEvent) {
  SetIdentity();
  for (int event : {6, 7, INT_MAX, -1, INT_MIN}) {
    ClearLog();
    ExpectRefusal(event, "Bad event: [" + std::to_string(event) + "]");
  }
}

TEST(PostEventToServerTest, FailsWithoutMemoryBeforeItLooksAtTheEvent) {
  On("calloc").Nth(1).Return(nullptr);
  ExpectRefusal(6, "Failed to malloc for pMyhubAccount");
  EXPECT_THAT(Log(), testing::SizeIs(1));
}

TEST(PostEventToServerTest, LooksAtTheEventBeforeTheSerialNumber) {
  ExpectRefusal(6, "Bad event: [6]");
  EXPECT_EQ(Calls("ALIBGetSerialNumber"), 0);
}

TEST(PostEventToServerTest, AsksForTheSerialNumberBeforeTheAccount) {
  SetIdentity({{"service_quendeld", "yes"}});
  ExpectRefusal(QUENDEL_EVENT_REBOOT, "Failed to get serial number");
  EXPECT_EQ(Calls("ARVOMYHUBAccountGet"), 0);
}

TEST(PostEventToServerTest, NeedsAnAccountEvenForALogout) {
  SetIdentity({{"serial_number", "S1"}});
  ExpectRefusal(QUENDEL_EVENT_LOGOUT, "Failed to get account");
}

TEST(PostEventToServerTest, FailsWhenTheContactListCannotBeRead) {
  SetIdentity();
  WriteFile(std::string(kConf) + "/a-directory-of-that-name", "");
  ExpectRefusal(QUENDEL_EVENT_REBOOT, "Failed to get quendel config");
  EXPECT_THAT(Log(),
              ElementsAre(Logged("quendel_get_conf", "Failed to get quendel configuration file"),
                          Logged(kUnit, "Failed to get quendel config")));
}

TEST(PostEventToServerTest, AsksForTheAccountBeforeTheContactList) {
  SetIdentity({{"serial_number", "S1"}});
  WriteFile(std::string(kConf) + "/a-directory-of-that-name", "");
  ExpectRefusal(QUENDEL_EVENT_REBOOT, "Failed to get account");
  EXPECT_THAT(Log(), testing::SizeIs(1));
}
