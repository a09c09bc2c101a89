// The asking of the local performance service.
#include <gmock/gmock.h>

#include "platform/transmitor.h"
#include "quendel.h"
#include "support/json.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "quendel_collect_perf";

// What the service does, when a test stands in for it, and what it was asked.
struct Script {
  bool plays = false;
  int transmit = 0;
  int get = 0;
  bool throws = false;
  std::string reply;
  Json::Value request;
} script;

// Plays a service that gives this answer.
int CollectFrom(const std::string& answer, Json::Value& reply) {
  script.plays = true;
  script.reply = answer;
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

// The library's calls of the service's client pass through these.
extern "C" {
// NOLINTBEGIN(bugprone-reserved-identifier)
int __real__ZN10Transmitor8TransmitERKN4Json5ValueE(Transmitor* self, const Json::Value& request);
int __real__ZN10Transmitor11GetDataJsonERN4Json5ValueE(Transmitor* self, Json::Value& reply);

int __wrap__ZN10Transmitor8TransmitERKN4Json5ValueE(Transmitor* self, const Json::Value& request) {
  script.request = request;
  if (!script.plays) {
    return __real__ZN10Transmitor8TransmitERKN4Json5ValueE(self, request);
  }
  return script.transmit;
}

int __wrap__ZN10Transmitor11GetDataJsonERN4Json5ValueE(Transmitor* self, Json::Value& reply) {
  if (!script.plays) {
    return __real__ZN10Transmitor11GetDataJsonERN4Json5ValueE(self, reply);
  }
  if (script.throws) {
    throw std::bad_alloc();
  }
  if (script.get >= 0) {
    reply = JsonOf(script.reply);
  }
  return script.get;
}
// NOLINTEND(bugprone-reserved-identifier)
}

TEST(CollectPerfTest, GetsTheFiguresOfThisDevice) {
  Json::Value reply;
  EXPECT_EQ(QUENDELCollectPerf(reply), 0);
  EXPECT_EQ(reply["success"], true);
  EXPECT_TRUE(reply["data"].isMember("time"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectPerfTest, AsksForTheCurrentFigures) {
  Json::Value reply;
  EXPECT_EQ(CollectFrom(R"({"success":true,"data":{}})", reply), 0);
  EXPECT_EQ(script.request, JsonOf(R"({"request":"curr"})"));
}

TEST(CollectPerfTest, HandsTheAnswerOnWhole) {
  Json::Value reply = "before";
  EXPECT_EQ(CollectFrom(R"({"success":true,"data":null,"more":[1]})", reply), 0);
  EXPECT_EQ(reply, JsonOf(R"({"success":true,"data":null,"more":[1]})"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(CollectPerfTest, FailsWhenTheRequestCannotBeSent) {
  script.transmit = -1;
  Json::Value reply = "before";
  EXPECT_EQ(CollectFrom(R"({"success":true,"data":{}})", reply), -1);
  EXPECT_EQ(reply, "before");
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to send perf request")));
}

TEST(CollectPerfTest, FailsWhenThereIsNoAnswer) {
  script.get = -1;
  Json::Value reply = "before";
  EXPECT_EQ(CollectFrom(R"({"success":true,"data":{}})", reply), -1);
  EXPECT_EQ(reply, "before");
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get perf json reply")));
}

TEST(CollectPerfTest, TakesPositiveResultsOfTheServiceForSuccess) {
  script.transmit = 1;
  script.get = 1;
  Json::Value reply;
  EXPECT_EQ(CollectFrom(R"({"success":true,"data":{}})", reply), 0);
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
  script.throws = true;
  Json::Value reply;
  EXPECT_EQ(CollectFrom("null", reply), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get perf data")));
}
