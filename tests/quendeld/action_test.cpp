#include "action.h"

#include <gmock/gmock.h>

#include "json.h"

using namespace quendeld;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

ReadActions From(const std::string& text, int64_t most = 10, bool allowPower = false) {
  return ActionsFromJson(JsonFromText(text).value(), most, allowPower);
}

TEST(ActionsFromJsonTest, TakesTheOnesThatAreCarriedOutInTheirOrder) {
  const ReadActions read = From(R"([{"action":"start_collect","request_id":2},
               {"action":"upload_file","request_id":1,"progress":1,"files":[{"file_type":"x"}]}])");
  EXPECT_THAT(read.faults, IsEmpty());
  ASSERT_THAT(read.requests, SizeIs(2));
  EXPECT_EQ(read.requests[0].id, 2);
  EXPECT_EQ(read.requests[0].action, "start_collect");
  EXPECT_EQ(read.requests[0].progress, 1);
  EXPECT_FALSE(read.requests[0].report.has_value());
  EXPECT_EQ(read.requests[1].id, 1);
  EXPECT_EQ(read.requests[1].files[0]["file_type"], "x");
}

TEST(ActionsFromJsonTest, TakesNoneFromNullAndFromAnEmptyList) {
  EXPECT_THAT(From("null").faults, IsEmpty());
  EXPECT_THAT(From("[]").faults, IsEmpty());
}

TEST(ActionsFromJsonTest, TakesNothingButAList) {
  for (const char* text : {"{}", "5", "\"upload_file\"", "true"}) {
    EXPECT_THAT(From(text).requests, IsEmpty()) << text;
    EXPECT_THAT(From(text).faults, ElementsAre("the actions are no list")) << text;
  }
}

TEST(ActionsFromJsonTest, OnlyTellsOfEntriesWithoutANumber) {
  for (const char* id : {"null", "\"7\"", "7.5", "2147483648", "-2147483649", "[7]", "true",
                         "99999999999999999999"}) {
    const ReadActions read =
        From(std::string(R"([{"action":"start_collect","request_id":)") + id + "}]");
    EXPECT_THAT(read.requests, IsEmpty()) << id;
    EXPECT_THAT(read.faults, SizeIs(1)) << id;
  }
  EXPECT_THAT(From("[null,5,\"x\",[]]").faults, SizeIs(4));
}

TEST(ActionsFromJsonTest, AnswersWhatCannotBeCarriedOut) {
  for (const char* entry :
       {R"("action":"fly")", R"("action":7)", R"("progress":1)", R"("action":"enable")",
        R"("action":"disable")", R"("action":"logout")", R"("action":"poweroff")",
        R"("action":"reboot")", R"("action":"upload_file")",
        R"("action":"upload_file","files":{"a":1})", R"("action":"start_collect","progress":2)",
        R"("action":"start_collect","progress":"1")"}) {
    const ReadActions read = From(std::string("[{\"request_id\":9,") + entry + "}]");
    ASSERT_THAT(read.requests, SizeIs(1)) << entry;
    EXPECT_EQ(read.requests[0].report, -1) << entry;
    EXPECT_NE(read.requests[0].fault, "") << entry;
  }
}

TEST(ActionsFromJsonTest, SwitchesThePowerOnlyWhereTheOwnerAllowsIt) {
  const ReadActions read = From(R"([{"request_id":9,"action":"reboot"}])", 10, true);
  ASSERT_THAT(read.requests, SizeIs(1));
  EXPECT_FALSE(read.requests[0].report.has_value());
}

TEST(ActionsFromJsonTest, AnswersThoseBehindTheMost) {
  const ReadActions read = From(R"([{"request_id":1,"action":"start_collect"},
                                    {"request_id":2,"action":"start_collect"}])",
                                1);
  ASSERT_THAT(read.requests, SizeIs(2));
  EXPECT_FALSE(read.requests[0].report.has_value());
  EXPECT_EQ(read.requests[1].report, -1);
}

TEST(ActionsFromJsonTest, TellsOfAFewFaultsOnly) {
  std::string text = "[0";
  for (int entry = 0; entry < 1000; ++entry) {
    text += ",0";
  }
  EXPECT_THAT(From(text + "]").faults, SizeIs(6));
}

}  // namespace
