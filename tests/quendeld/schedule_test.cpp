// When things are due: the pure decisions.
#include <gmock/gmock.h>

#include "backoff.h"
#include "collections.h"
#include "rotation_watch.h"
#include "sessions.h"

using namespace quendeld;
using std::chrono::hours;
using std::chrono::seconds;

namespace {

TEST(NextAttemptTest, VariesTheIntervalByItsJitter) {
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 0, 0), seconds(540));
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 0, 0.5), seconds(600));
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 0, 1), seconds(660));
}

TEST(NextAttemptTest, DoublesWithEachFailureUpToTheLimit) {
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 1, 1), seconds(1200));
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 2, 1), seconds(2400));
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 3, 1), hours(1));
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 1000000, 1), hours(1));
}

TEST(NextAttemptTest, NeverWaitsLessThanHalfOfThat) {
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 1, 0), seconds(600));
  EXPECT_EQ(NextAttempt(seconds(600), 10, hours(1), 9, 0), seconds(1800));
}

TEST(NextAttemptTest, KeepsTheIntervalWhereTheLimitIsShorter) {
  EXPECT_EQ(NextAttempt(hours(2), 0, hours(1), 5, 1), hours(2));
}

TEST(DecideRunTest, KeepsLinesThatARotationWouldRemove) {
  EXPECT_EQ(DecideRun(true, false), RunKind::kSend);
  EXPECT_EQ(DecideRun(true, true), RunKind::kSend);
  EXPECT_EQ(DecideRun(false, true), RunKind::kKeep);
  EXPECT_EQ(DecideRun(false, false), RunKind::kWait);
}

TEST(DueInTest, CountsFromTheLastRun) {
  EXPECT_EQ(DueIn(hours(24), 1000000, 1000000 + 3600), hours(23));
  EXPECT_EQ(DueIn(hours(24), 1000000, 1000000 + 25 * 3600), seconds(0));
}

TEST(DueInTest, IsNowWhereNoneRan) {
  EXPECT_EQ(DueIn(hours(24), 0, 1000000), seconds(0));
}

TEST(DueInTest, IsNeverMoreThanTheIntervalWhenTheClockGoesBack) {
  EXPECT_EQ(DueIn(hours(24), 1000000, 5), hours(24));
}

TEST(TimeLeftTest, CountsFromTheOpening) {
  EXPECT_EQ(TimeLeft(hours(1), 1000, 1000 + 600), seconds(3000));
  EXPECT_EQ(TimeLeft(hours(1), 1000, 1000 + 7200), seconds(0));
  EXPECT_EQ(TimeLeft(hours(1), 1000, 5), hours(1));
}

TEST(IsArchiveNameTest, KnowsWhatARotationMakes) {
  for (const char* name : {"syslog.1", "syslog.1.xz", "syslog.12.gz", "syslog-20240305"}) {
    EXPECT_TRUE(IsArchiveName("syslog", name)) << name;
  }
  for (const char* name :
       {"syslog", "syslog.", "syslog.new", "syslogx.1", "sys", "auth.1", "syslog-"}) {
    EXPECT_FALSE(IsArchiveName("syslog", name)) << name;
  }
}

}  // namespace
