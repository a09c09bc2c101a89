#include "journal.h"

#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "json.h"
#include "support/appliance.h"
#include "support/log.h"

using namespace quendel::test;
using namespace quendeld;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::SizeIs;

namespace {

constexpr char kPath[] = "/tmp/journal.db";
constexpr int64_t kMost = 1000;

NewRequest Request(int id, std::optional<int> report = std::nullopt) {
  NewRequest request;
  request.id = id;
  request.action = "start_collect";
  request.report = report;
  return request;
}

Journal::Taking Take(Journal& journal, const NewRequest& request, int64_t most = kMost) {
  return journal.TakeRequests({request}, most).front();
}

// Makes every request as old as it would be after so many days.
void Age(int days) {
  Database database(kPath);
  database.Execute("UPDATE requests SET taken = taken - 86400 * " + std::to_string(days));
}

TEST(JournalTest, RemembersItsFacts) {
  Journal(kPath).SetFact("paused", "yes");
  Journal journal(kPath);
  EXPECT_EQ(journal.Fact("paused"), "yes");
  EXPECT_EQ(journal.Fact("other"), "");
}

TEST(JournalTest, TakesEachRequestOnce) {
  { EXPECT_EQ(Take(*std::make_unique<Journal>(kPath), Request(7)), Journal::Taking::kTaken); }
  Journal journal(kPath);
  EXPECT_EQ(Take(journal, Request(7)), Journal::Taking::kKnown);
  EXPECT_EQ(Take(journal, Request(8)), Journal::Taking::kTaken);
}

TEST(JournalTest, GivesRequestsInTheirOrder) {
  Journal journal(kPath);
  journal.TakeRequests({Request(9), Request(3)}, kMost);
  const StoredRequest first = journal.NextRequest().value();
  EXPECT_EQ(first.id, 9);
  journal.BeginRequest(first.sequence);
  EXPECT_EQ(journal.NextRequest()->id, 3);
}

TEST(JournalTest, ReportsWhatWasBegunAndNotEndedAsFailed) {
  Journal journal(kPath);
  Take(journal, Request(7));
  journal.BeginRequest(journal.NextRequest()->sequence);
  EXPECT_EQ(journal.EndBrokenRequests("remote_close"), 1);
  EXPECT_FALSE(journal.NextRequest().has_value());
  const std::vector<StoredReport> due = journal.DueReports(10);
  ASSERT_THAT(due, SizeIs(1));
  EXPECT_EQ(due[0].id, 7);
  EXPECT_EQ(due[0].progress, -1);
}

TEST(JournalTest, RepeatsWhatMayBeRepeated) {
  Journal journal(kPath);
  NewRequest request = Request(7);
  request.action = "remote_close";
  Take(journal, request);
  journal.BeginRequest(journal.NextRequest()->sequence);
  EXPECT_EQ(journal.EndBrokenRequests("remote_close"), 0);
  EXPECT_TRUE(journal.NextRequest()->is_repeated);
}

TEST(JournalTest, RefusesNewRequestsRatherThanForgettingYoungOnes) {
  Journal journal(kPath);
  for (int id = 0; id < 10; ++id) {
    Take(journal, Request(id, 0), 10);
    journal.ReportAccepted(id);
  }
  EXPECT_EQ(Take(journal, Request(10), 10), Journal::Taking::kNoRoom);
  EXPECT_EQ(Take(journal, Request(0), 10), Journal::Taking::kKnown);
}

TEST(JournalTest, ForgetsTheOldestRequestAfterNinetyDays) {
  {
    Journal journal(kPath);
    for (int id = 0; id < 10; ++id) {
      Take(journal, Request(id, 0), 10);
      journal.ReportAccepted(id);
    }
  }
  Age(89);
  {
    Journal journal(kPath);
    EXPECT_EQ(Take(journal, Request(10), 10), Journal::Taking::kNoRoom);
  }
  Age(2);
  Journal journal(kPath);
  EXPECT_EQ(Take(journal, Request(10), 10), Journal::Taking::kTaken);
  EXPECT_EQ(journal.KnownRequests(), 10);
  EXPECT_EQ(Take(journal, Request(1), 10), Journal::Taking::kKnown);
}

TEST(JournalTest, KeepsReportsUntilTheyAreAccepted) {
  Journal journal(kPath);
  journal.TakeRequests({Request(1, -1), Request(2, -1)}, kMost);
  journal.ReportRefused(1, 100);
  const std::vector<StoredReport> due = journal.DueReports(10);
  ASSERT_THAT(due, SizeIs(2));
  EXPECT_EQ(due[0].id, 2) << "what was tried less goes first";
  journal.ReportAccepted(2);
  EXPECT_THAT(journal.DueReports(10), SizeIs(1));
}

TEST(JournalTest, GivesAReportUpAfterManyAttempts) {
  Journal journal(kPath);
  Take(journal, Request(1, -1));
  journal.ReportRefused(1, 2);
  EXPECT_EQ(journal.WaitingReports(), 1);
  journal.ReportRefused(1, 2);
  EXPECT_EQ(journal.WaitingReports(), 0);
}

TEST(JournalTest, KeepsEventsInTheirOrderAcrossARestart) {
  {
    Journal journal(kPath);
    EXPECT_TRUE(journal.QueueEvent(0, "info", 10, "enabled", "yes"));
    EXPECT_TRUE(journal.QueueEvent(5, Json::nullValue, 10, "x", "y"));
  }
  Journal journal(kPath);
  EXPECT_EQ(journal.Fact("enabled"), "yes");
  const StoredEvent event = journal.NextEvent(std::nullopt).value();
  EXPECT_EQ(event.event, 0);
  EXPECT_EQ(event.info, "info");
  journal.EventAccepted(event.sequence);
  EXPECT_EQ(journal.NextEvent(std::nullopt)->event, 5);
}

TEST(JournalTest, PutsARefusedEventBehindTheOthers) {
  Journal journal(kPath);
  journal.QueueEvent(0, Json::nullValue, 10, "x", "y");
  journal.QueueEvent(5, Json::nullValue, 10, "x", "y");
  EXPECT_EQ(journal.EventRefused(journal.NextEvent(std::nullopt)->sequence), 1);
  EXPECT_EQ(journal.NextEvent(std::nullopt)->event, 5);
}

TEST(JournalTest, FindsTheOneEventThatMayBeSent) {
  Journal journal(kPath);
  journal.QueueEvent(5, Json::nullValue, 10, "x", "y");
  EXPECT_FALSE(journal.NextEvent(1).has_value());
  journal.QueueEvent(1, Json::nullValue, 10, "x", "y");
  EXPECT_EQ(journal.NextEvent(1)->event, 1);
}

TEST(JournalTest, DropsTheOldestEventWhenTheQueueIsFull) {
  Journal journal(kPath);
  for (int event = 0; event < 3; ++event) {
    EXPECT_TRUE(journal.QueueEvent(event, Json::nullValue, 3, "x", "y"));
  }
  EXPECT_FALSE(journal.QueueEvent(3, Json::nullValue, 3, "x", "y"));
  EXPECT_EQ(journal.WaitingEvents(), 3);
  EXPECT_EQ(journal.NextEvent(std::nullopt)->event, 1);
}

TEST(JournalTest, NumbersASeriesWithoutAGapFromTheOldest) {
  Journal journal(kPath);
  for (int sample = 0; sample < 5; ++sample) {
    journal.AddSample(sample, 3);
  }
  int64_t last = 0;
  const Json::Value series = journal.Series(1000, last);
  EXPECT_EQ(JsonLine(series), R"({"perf_0":2,"perf_1":3,"perf_2":4})");
  journal.AddSample(9, 3);
  journal.DropSamples(last);
  EXPECT_EQ(JsonLine(journal.Series(1000, last)), R"({"perf_0":9})");
}

TEST(JournalTest, KeepsTheNewestSamplesWithinTheBytesOfASeries) {
  Journal journal(kPath);
  for (int sample = 0; sample < 5; ++sample) {
    journal.AddSample(std::string(100, static_cast<char>('a' + sample)), 100);
  }
  int64_t last = 0;
  const Json::Value series = journal.Series(250, last);
  ASSERT_THAT(series, SizeIs(2));
  EXPECT_EQ(series["perf_1"], std::string(100, 'e'));
}

TEST(JournalTest, ListsTheNewestRunsFirst) {
  Journal journal(kPath);
  journal.AddRun({1, 2, "schedule", "sent", "", 10});
  journal.AddRun({3, 4, "rotation", "failed", "why", 0});
  const std::vector<StoredRun> runs = journal.Runs(5);
  ASSERT_THAT(runs, SizeIs(2));
  EXPECT_EQ(runs[0].cause, "rotation");
  EXPECT_EQ(runs[0].reason, "why");
  EXPECT_EQ(runs[1].bytes, 10);
}

TEST(JournalTest, PutsADamagedFileAsideAndStartsAnew) {
  WriteFile(kPath, std::string(8192, 'x'));
  Journal journal(kPath);
  EXPECT_THAT(Log(), ElementsAre(Logged("", HasSubstr("is put aside as /tmp/journal.db.damaged"))));
  EXPECT_EQ(ReadFile("/tmp/journal.db.damaged"), std::string(8192, 'x'));
  EXPECT_EQ(Take(journal, Request(1)), Journal::Taking::kTaken);
}

TEST(JournalTest, SurvivesPowerCutsAtAnyMoment) {
  // What a cut leaves is what was written so far: the files are copied while a writer goes on.
  namespace fs = std::filesystem;
  const pid_t writer = fork();
  if (writer == 0) {
    Journal journal(kPath);
    for (int id = 1;; ++id) {
      Take(journal, Request(id), 1'000'000);
      WriteFile("/tmp/taken", std::to_string(id));
    }
  }
  int known = 0;
  for (int cut = 0; cut < 20; ++cut) {
    usleep(20'000);
    kill(writer, SIGSTOP);
    std::error_code none;
    known = Exists("/tmp/taken") ? atoi(ReadFile("/tmp/taken").c_str()) : 0;
    for (const char* ending : {"", "-wal"}) {
      fs::copy_file(std::string(kPath) + ending, std::string("/tmp/cut.db") + ending,
                    fs::copy_options::overwrite_existing, none);
    }
    kill(writer, SIGCONT);
    Journal journal("/tmp/cut.db");
    for (int id = 1; id <= known; ++id) {
      ASSERT_EQ(Take(journal, Request(id), 1'000'000), Journal::Taking::kKnown) << id;
    }
  }
  kill(writer, SIGKILL);
  waitpid(writer, nullptr, 0);
  EXPECT_GT(known, 0);
  EXPECT_THAT(Log(), testing::IsEmpty());
}

}  // namespace
