// Every function that posts, against every reply that a server which nobody authenticated may send.
#include <gmock/gmock.h>

#include <algorithm>
#include <cstdint>
#include <functional>

#include "quendel.h"
#include "support/appliance.h"
#include "support/log.h"
#include "support/replies.h"
#include "support/server.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::StartsWith;

namespace {

constexpr char kPostUnit[] = "quendel_post_data_to_server";

// The two functions that read replies are to take a hundred megabytes. Those that leave that to
// them are spared the wait.
constexpr size_t kWhole = SIZE_MAX;
constexpr size_t kShort = 1'000'000;

// Has the server give each of the replies once, with a clean log, and judges what came of it.
void AgainstEach(size_t longest, const std::function<void(const HostileReply&)>& judge) {
  SetIdentity();
  for (const HostileReply& reply : HostileReplies()) {
    SCOPED_TRACE(reply.name);
    ClearLog();
    ScriptedAnswer answer = reply.answer;
    answer.fill = std::min(answer.fill, longest);
    Answer(answer);
    judge(reply);
  }
}

// What a conversation logs: nothing for a success; for a reply that is not JSON the post's line and
// its own; for a refusal its own with the reply.
void ExpectLines(const HostileReply& reply, const char* unit, const char* refusal) {
  if (reply.success) {
    EXPECT_THAT(Log(), IsEmpty());
  } else if (reply.parses) {
    EXPECT_THAT(Log(), ElementsAre(Logged(unit, StartsWith(refusal))));
  } else {
    EXPECT_THAT(Log(), ElementsAre(Logged(kPostUnit, StartsWith("Failed to parse response. [")),
                                   Logged(unit, "Failed to post quendel config")));
  }
}

int DescribeNothing(Json::Value& /*info*/, const QUENDELSendDataParam_t& /*item*/) {
  return 0;
}

}  // namespace

TEST(HostileRepliesTest, GiveThePostWhatTheReaderAccepts) {
  AgainstEach(kWhole, [](const HostileReply& reply) {
    Json::Value response = "before";
    EXPECT_EQ(QUENDELPostDataToServer("https://support.test/x", Json::Value(), response),
              reply.parses ? 0 : -1);
    if (reply.parses) {
      EXPECT_THAT(Log(), IsEmpty());
    } else {
      EXPECT_EQ(response, "before");
      EXPECT_THAT(Log(), ElementsAre(Logged(kPostUnit, StartsWith("Failed to parse response. ["))));
    }
  });
}

TEST(HostileRepliesTest, LeaveTheActionsAloneUnlessTheySaySuccess) {
  AgainstEach(kShort, [](const HostileReply& reply) {
    Json::Value actions = "before";
    EXPECT_EQ(QUENDELHeartbeat(actions), reply.success ? 0 : -1);
    EXPECT_EQ(actions, reply.success ? Json::Value() : Json::Value("before"));
    ExpectLines(reply, "quendel_heartbeat", "Failed to send heartbeat, server return failed. [");
  });
}

TEST(HostileRepliesTest, FailTheProgressReportUnlessTheySaySuccess) {
  AgainstEach(kShort, [](const HostileReply& reply) {
    EXPECT_EQ(QUENDELUpdateActRequestProgress(1, QUENDEL_ACT_PROGRESS_DONE, Json::objectValue),
              reply.success ? 0 : -1);
    ExpectLines(reply, "quendel_update_act_request_progress",
                "Failed to update action request, server return failed. [");
  });
}

TEST(HostileRepliesTest, FailTheEventReportUnlessTheySaySuccess) {
  AgainstEach(kShort, [](const HostileReply& reply) {
    Json::Value answer = "before";
    EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_REBOOT, answer, Json::Value()),
              reply.success ? 0 : -1);
    if (!reply.parses) {
      EXPECT_EQ(answer, "before");
    }
    ExpectLines(reply, "quendel_post_event_to_server",
                "Failed to post event, server return failed. [");
  });
}

TEST(HostileRepliesTest, FailTheFilePostUnlessTheySaySuccess) {
  AgainstEach(kWhole, [](const HostileReply& reply) {
    EXPECT_EQ(QUENDELPostFileToServer("https://support.test/x", "file",
                                      std::vector<QUENDELSendDataParam_t>(), DescribeNothing),
              reply.success ? 0 : -1);
    if (reply.success) {
      EXPECT_THAT(Log(), IsEmpty());
    } else {
      EXPECT_THAT(Log(),
                  ElementsAre(Logged("request_util", reply.parses ? "Response is not success"
                                                                  : "Failed to parse response"),
                              Logged("quendel_post_file_to_server",
                                     StartsWith("Failed to handle response: ["))));
    }
  });
}
