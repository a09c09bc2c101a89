// The asking of the local performance service.
#include <gmock/gmock.h>

#include <new>

#include "platform/transmitor.h"
#include "quendel.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "quendel_collect_perf";

// Plays a service that gives this answer, with this result.
void Play(const std::string& answer, int result = 0) {
  On("Transmitor::Transmit").Return(result);
  On("Transmitor::GetDataJson").Replace([=](Transmitor*, Json::Value& reply) {
    reply = JsonOf(answer);
    return result;
  });
}

int CollectFrom(const std::string& answer, Json::Value& reply) {
  Play(answer);
  return QUENDELCollectPerf(reply);
}

void ExpectRefused(const std::string& answer) {
  ClearLog();
  Json::Value reply = "before";
  EXPECT_EQ(CollectFrom(answer, reply), -1);
  EXPECT_EQ(reply, JsonOf(answer));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get perf data"))) << answer;
}

}  // namespace

TEST(CollectPerfTest, GetsTheFiguresOfThisDevice) {
  Json::Value reply;
  EXPECT_EQ(QUENDELCollectPerf(reply), 0);
  EXPECT_EQ(reply["success"], true);
  EXPECT_TRUE(reply["data"].isMember("time"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectPerfTest, AsksForTheCurrentFigures) {
  Record("Transmitor::Transmit");
  Json::Value reply;
  EXPECT_EQ(CollectFrom(R"({"success":true,"data":{}})", reply), 0);
  EXPECT_THAT(Recorded(), ElementsAre(R"({"request":"curr"})"));
}

TEST(CollectPerfTest, HandsTheAnswerOnWhole) {
  Json::Value reply = "before";
  EXPECT_EQ(CollectFrom(R"({"success":true,"data":null,"more":[1]})", reply), 0);
  EXPECT_EQ(reply, JsonOf(R"({"success":true,"data":null,"more":[1]})"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectPerfTest, FailsWhenTheRequestCannotBeSent) {
  Play(R"({"success":true,"data":{}})");
  On("Transmitor::Transmit").Return(-1);
  Json::Value reply = "before";
  EXPECT_EQ(QUENDELCollectPerf(reply), -1);
  EXPECT_EQ(reply, "before");
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to send perf request")));
}

TEST(CollectPerfTest, FailsWhenThereIsNoAnswer) {
  Play(R"({"success":true,"data":{}})");
  On("Transmitor::GetDataJson").Return(-1);
  Json::Value reply = "before";
  EXPECT_EQ(QUENDELCollectPerf(reply), -1);
  EXPECT_EQ(reply, "before");
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get perf json reply")));
}

TEST(CollectPerfTest, TakesPositiveResultsOfTheServiceForSuccess) {
  Play(R"({"success":true,"data":{}})", 1);
  Json::Value reply;
  EXPECT_EQ(QUENDELCollectPerf(reply), 0);
}

TEST(CollectPerfTest, FailsOnAnAnswerWithoutSuccess) {
  for (const char* answer :
       {R"({"success":false,"data":{}})", R"({"data":{}})", R"({"success":"true","data":{}})",
        R"({"success":[true],"data":{}})", R"({"success":null,"data":{}})"}) {
    ExpectRefused(answer);
  }
}

TEST(CollectPerfTest, FailsOnAnAnswerWithoutData) {
  ExpectRefused(R"({"success":true})");
}

TEST(CollectPerfTest, FailsOnAnAnswerThatIsNoObject) {
  for (const char* answer : {"null", "[]", R"(["success"])", "\"success\"", "1", "true"}) {
    ExpectRefused(answer);
  }
}

TEST(CollectPerfTest, FailsWhenMemoryRunsOut) {
  Play("null");
  On("Transmitor::GetDataJson").Replace([](Transmitor*, Json::Value&) -> int {
    throw std::bad_alloc();
  });
  Json::Value reply;
  EXPECT_EQ(QUENDELCollectPerf(reply), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get perf data")));
}
