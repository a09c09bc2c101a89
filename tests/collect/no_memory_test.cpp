// What the exported functions of a collection run make of a lack of memory: each allocation in turn
// fails, and nothing worse comes of it than a documented failure.
#include <gmock/gmock.h>

#include <csignal>
#include <functional>

#include "collect/archive_entries.h"
#include "collect/collection.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"
#include "support/scarce_memory.h"
#include "support/server.h"

using namespace quendel::test;
using testing::_;
using testing::AnyOf;
using testing::Each;
using testing::EndsWith;
using testing::IsEmpty;
using testing::Matcher;
using testing::Not;
using testing::StartsWith;

namespace {

// A failure was logged, and by these messages only; a success may have lost something on its way,
// which was logged as well, or nothing.
std::function<void(int)> LogsOnly(const Matcher<std::string>& message) {
  return [message](int result) {
    if (result != 0) {
      EXPECT_EQ(result, -1);
      EXPECT_THAT(Log(), Not(IsEmpty()));
    }
    EXPECT_THAT(Log(), Each(Logged(_, message)));
  };
}

int Describe(Json::Value& info, const QUENDELSendDataParam_t& item) {
  info["path"] = item.path;
  return 0;
}

}  // namespace

TEST(NoMemoryTest, IsAFailedTransferOfAFilePost) {
  WriteFile("/tmp/a.txt", "a");
  QUENDELSendDataParam_t item;
  item.path = "/tmp/a.txt";
  bool undescribed = false;
  WithEachAllocationFailing(
      [&] { return QUENDELPostFileToServer("https://support.test/a", "file", item, Describe); },
      [&](int result) {
        LogsOnly(AnyOf("Failed to allocate memory for curl",
                       "Failed to gen file metadata: '/tmp/a.txt'", StartsWith("CURL Error("),
                       "Failed to parse response",
                       StartsWith("Failed to handle response: [")))(result);
        undescribed = undescribed || result == 0;
      });
  EXPECT_TRUE(undescribed) << "a description takes memory, and costs only itself";
}

TEST(NoMemoryTest, IsAFailedAnswerOfThePerformanceService) {
  Json::Value reply;
  WithEachAllocationFailing([&] { return QUENDELCollectPerf(reply); },
                            LogsOnly(AnyOf("Failed to get perf data", "Failed to send perf request",
                                           "Failed to get perf json reply")));
}

TEST(NoMemoryTest, IsAFailedWriteOfPerformanceFiles) {
  WriteFile("/tmp/perf/.keep", "");
  const Json::Value series = PerfSeries();
  bool only_one = false;
  WithEachAllocationFailing([&] { return QUENDELParsePerfJson("/tmp/perf", series); },
                            [&](int result) {
                              EXPECT_EQ(result, -1);
                              EXPECT_THAT(Log(), Each(Logged(_, EndsWith(" perf data"))));
                              only_one = only_one || Log().size() == 1;
                            });
  EXPECT_TRUE(only_one) << "a file takes memory, and costs only itself";
}

TEST(NoMemoryTest, IsAFailedPacking) {
  WriteFile("/tmp/a/directory with a name that takes memory/f", "1");
  WithEachAllocationFailing(
      [] {
        return QUENDELTarCollectData("/tmp/a/directory with a name that takes memory",
                                     "/tmp/out.tar.xz");
      },
      LogsOnly(StartsWith("Failed to tar '")));
}

TEST(NoMemoryTest, IsAFailedDelivery) {
  SetIdentity();
  WriteFile(kArchive, "archive");
  ASSERT_EQ(QUENDELGetServerHost(), "support.test");  // what the first call finds is kept
  WithEachAllocationFailing([] { return QUENDELSendCollectData(kArchive, kStart); },
                            [](int result) {
                              if (result != 0) {
                                EXPECT_EQ(result, -1);
                                EXPECT_EQ(Log().back().unit, "quendel_send_collect_data");
                              }
                            });
}

// In the children too: what they fail to collect is not counted as collected.
TEST(NoMemoryTest, LosesNothingInACollectionRun) {
  StopTheClock();
  InstallCollectors();
  const std::string log = "/usr/arvo/etc/quendel/quendel.log.messages";
  const std::string udc = "/usr/arvo/etc/quendel/quendel.udc.raid";
  const auto before = CollectorConf();
  int uncommitted = 0;
  for (long nth = 1; nth < 400; nth += 1 + nth / 10) {
    const Ending ending = InAGroupOfItsOwn([nth] {
      signal(SIGTERM, SIG_IGN);
      On("sleep").Before(AwaitAnyChild);
      const Json::Value series = PerfSeries();
      FailAllocation(nth);
      const int result = QUENDELStartCollect(0, 0, series);
      AllocateFreely();
      return result;
    });
    EXPECT_EQ(ending.signal, 0) << nth;
    const auto after = CollectorConf();
    if (after.at(log) != before.at(log)) {
      EXPECT_EQ(ArchiveEntries(kArchive).at(std::string(kRunName) + "/log/messages"),
                "first\nsecond\n")
          << nth;
    }
    if (after.at(udc) != before.at(udc)) {
      EXPECT_EQ(JsonOf(ArchiveEntries(kArchive).at(std::string(kRunName) + "/udc/udc.result")),
                JsonOf(R"({"raid":{"disks":4}})"))
          << nth;
    }
    uncommitted += after != before ? 0 : 1;
    for (const auto& [path, text] : before) {
      WriteFile(path, text);
    }
    RemoveFile(kRunDir);
    RemoveFile(kArchive);
  }
  EXPECT_GT(uncommitted, 0);
}
