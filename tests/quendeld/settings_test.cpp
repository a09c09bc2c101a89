#include "settings.h"

#include <gmock/gmock.h>

#include "support/appliance.h"

using namespace quendel::test;
using namespace quendeld;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

namespace {

struct Read {
  Settings settings;
  std::vector<std::string> complaints;
};

Read From(const std::string& text) {
  Read read;
  read.settings = SettingsFromText(text, read.complaints);
  return read;
}

TEST(SettingsTest, AreTheDefaultsWhereNothingIsSet) {
  const Read read = From("# a comment\n\n; another\n");
  EXPECT_THAT(read.complaints, IsEmpty());
  EXPECT_EQ(read.settings.heartbeat_interval, std::chrono::seconds(600));
  EXPECT_EQ(read.settings.collection_interval, std::chrono::hours(24));
  EXPECT_EQ(read.settings.sample_interval, std::chrono::seconds(300));
  EXPECT_FALSE(read.settings.allow_power_actions);
}

TEST(SettingsTest, TakeTimesInSecondsAndPartsOfThem) {
  const Read read = From(" heartbeat_interval = \"0.25\" \r\ncollection_interval=3600\n");
  EXPECT_THAT(read.complaints, IsEmpty());
  EXPECT_EQ(read.settings.heartbeat_interval, std::chrono::milliseconds(250));
  EXPECT_EQ(read.settings.collection_interval, std::chrono::hours(1));
}

TEST(SettingsTest, TakeSwitchesAndCounts) {
  const Read read = From("allow_power_actions=yes\nmemory_limit_mb=0\n");
  EXPECT_THAT(read.complaints, IsEmpty());
  EXPECT_TRUE(read.settings.allow_power_actions);
  EXPECT_EQ(read.settings.memory_limit_mb, 0);
}

TEST(SettingsTest, KeepTheDefaultOfABadValueAndSaySoOnce) {
  const Read read = From("heartbeat_interval=soon\nsamples_kept=10\n");
  EXPECT_THAT(read.complaints,
              ElementsAre("heartbeat_interval=soon is not a number; the default is used"));
  EXPECT_EQ(read.settings.heartbeat_interval, std::chrono::seconds(600));
  EXPECT_EQ(read.settings.samples_kept, 10);
}

TEST(SettingsTest, RefuseWhatIsBeyondTheLimitsOfAKey) {
  const Read read = From(
      "heartbeat_interval=0\nheartbeat_jitter=51\nsamples_kept=1.5\n"
      "allow_power_actions=true\n");
  EXPECT_THAT(
      read.complaints,
      ElementsAre(HasSubstr("is not between 0.05 and"), HasSubstr("is not between 0 and 50"),
                  HasSubstr("is not a whole number"), HasSubstr("is neither yes nor no")));
}

TEST(SettingsTest, TellOfKeysAndLinesThatAreNone) {
  const Read read = From("hartbeat_interval=5\nnothing\n");
  EXPECT_THAT(read.complaints, ElementsAre("there is no setting of the name hartbeat_interval",
                                           "this is no key=value line: nothing"));
}

TEST(SettingsTest, AreTheDefaultsWithoutAFile) {
  std::vector<std::string> complaints;
  EXPECT_EQ(ReadSettings("/tmp/none", complaints).samples_kept, Settings().samples_kept);
  EXPECT_THAT(complaints, IsEmpty());
}

}  // namespace
