// That the list of hostile replies says the truth about each of them.
#include "support/replies.h"

#include <gmock/gmock.h>

#include <set>

#include "base/json_text.h"

using namespace quendel::test;

namespace {

std::string WholeBody(const ScriptedAnswer& answer) {
  return answer.body + std::string(answer.fill, 'x') + answer.tail;
}

class HostileRepliesTest : public testing::TestWithParam<HostileReply> {};

std::string NameOf(const testing::TestParamInfo<HostileReply>& info) {
  return info.param.name;
}

}  // namespace

TEST_P(HostileRepliesTest, GivesWhatTheListSays) {
  Json::Value value;
  EXPECT_EQ(quendel::JsonFromText(WholeBody(GetParam().answer), value), GetParam().parses);
  EXPECT_EQ(quendel::JsonBool(value, "success"), GetParam().success);
}

INSTANTIATE_TEST_SUITE_P(Each, HostileRepliesTest, testing::ValuesIn(HostileReplies()), NameOf);

TEST(HostileRepliesTest, HaveNamesOfTheirOwn) {
  std::set<std::string> names;
  for (const HostileReply& reply : HostileReplies()) {
    EXPECT_TRUE(names.insert(reply.name).second) << reply.name;
  }
}
