// What the conversations make of a lack of memory: each allocation in turn fails, and nothing worse
// comes of it than a documented failure.
#include <gmock/gmock.h>

#include <functional>

#include "quendel.h"
#include "support/appliance.h"
#include "support/log.h"
#include "support/scarce_memory.h"
#include "support/server.h"

using namespace quendel::test;
using testing::_;
using testing::AnyOf;
using testing::Each;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

namespace {

// Texts longer than what a std::string holds without memory of its own.
void SetLongIdentity() {
  SetIdentity({{"serial_number", "a-serial-number-of-31-bytes-...."},
               {"account_email", "an.address@of-more-than.15.bytes"},
               {"account_field_a", "a-field-of-more-than-15-bytes"},
               {"account_field_b", "b-field-of-more-than-15-bytes"}});
  ASSERT_EQ(QUENDELGetServerHost(), "support.test");  // what the first call finds is kept
}

// The failure is the conversation's own, and was logged with documented texts only.
std::function<void(int)> FailsAs(const char* unit) {
  return [unit](int result) {
    EXPECT_EQ(result, -1);
    ASSERT_THAT(Log(), Not(IsEmpty()));
    EXPECT_EQ(Log().back().unit, unit);
    EXPECT_THAT(
        Log(),
        Each(Logged(
            _, AnyOf("Failed to get serial number", "Failed to get account",
                     "Failed to get quendel config", "Failed to post quendel config",
                     "Failed to allocate memory for curl", "Fail to allocate memory for alibc hash",
                     "Failed to get quendel configuration file", StartsWith("CURL Error(")))));
  };
}

}  // namespace

TEST(ConversationNoMemoryTest, IsAFailedPost) {
  Json::Value body;
  body["text"] = "of more than fifteen bytes";
  Json::Value response;
  WithEachAllocationFailing(
      [&] {
        response = "before";
        return QUENDELPostDataToServer("https://support.test/a", body, response);
      },
      [&](int result) {
        FailsAs("quendel_post_data_to_server")(result);
        EXPECT_EQ(response, "before");
      });
}

TEST(ConversationNoMemoryTest, IsAFailedHeartbeatThatLeavesTheActionsAlone) {
  SetLongIdentity();
  Json::Value actions;
  WithEachAllocationFailing(
      [&] {
        actions = "before";
        return QUENDELHeartbeat(actions);
      },
      [&](int result) {
        FailsAs("quendel_heartbeat")(result);
        EXPECT_EQ(actions, "before");
      });
}

TEST(ConversationNoMemoryTest, IsAFailedProgressReport) {
  SetLongIdentity();
  const Json::Value none;  // the copy of any other is the caller's own work
  WithEachAllocationFailing(
      [&] { return QUENDELUpdateActRequestProgress(17, QUENDEL_ACT_PROGRESS_DONE, none); },
      FailsAs("quendel_update_act_request_progress"));
}

TEST(ConversationNoMemoryTest, IsAFailedEventReportAndNeverOneWithoutContacts) {
  SetLongIdentity();
  WriteFile("/usr/arvo/etc/quendel.conf", "contact=[{\"name\":\"more than fifteen bytes\"}]\n");
  Json::Value reply;
  WithEachAllocationFailing(
      [&] { return QUENDELPostEventToServer(QUENDEL_EVENT_REBOOT, reply, Json::Value()); },
      FailsAs("quendel_post_event_to_server"));
  for (const Request& request : Requests()) {
    EXPECT_THAT(request.body, testing::HasSubstr("more than fifteen bytes"));
  }
}
