// What the collectors make of a lack of memory: each allocation in turn fails, and nothing counts
// as sent that is not in the run's folder.
#include <gmock/gmock.h>
#include <json/value.h>
#include <sys/stat.h>

#include <cstring>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "model/collector_files.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/json.h"
#include "support/log.h"
#include "support/own_work.h"
#include "support/scarce_memory.h"

using namespace quendel::test;
using testing::_;
using testing::AnyOf;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Key;
using testing::Not;
using testing::Pair;
using testing::SizeIs;
using testing::StartsWith;

namespace {

namespace fs = std::filesystem;

constexpr char kUdcUpdateFile[] = "/tmp/quendel/quendel.udc.update.conf";

std::string UdcConf(const std::string& name) {
  return std::string(kConfFolder) + "/quendel.udc." + name;
}

// Installs logs of each of which a new archive, a newer one and new lines wait to be collected.
void InstallGrownLogs(const std::vector<std::string>& names) {
  for (const std::string& name : names) {
    InstallLog(name, "/volume1/" + name);
    WriteFile("/volume1/" + name, "one\n");
  }
  CollectAndCommit();
  for (const std::string& name : names) {
    for (const char* line : {"two\n", "three\n"}) {
      AppendFile("/volume1/" + name, line);
      Rotate("/volume1/" + name);
    }
    AppendFile("/volume1/" + name, "four\n");
  }
}

// Nothing of a run before is left.
void StartAfresh() {
  const OwnWork ownWork;
  RemoveFile(kRunFolder);
  fs::create_directories(kRunFolder);
  RemoveFile("/tmp/quendel");
  fs::create_directories("/tmp/quendel");
}

}  // namespace

TEST(CollectorsNoMemoryTest, StagesNoUserDefinedCollectorWithoutItsResult) {
  const std::map<std::string, std::string> outputs = {
      {"a", R"({"disks": ["the first of the disks", "the second of the disks"]})"},
      {"b", R"("printed by the second of the collectors")"},
  };
  for (const auto& [name, output] : outputs) {
    InstallUdc(name, "echo '" + output + "'");
  }
  int failures = 0;
  int partial = 0;
  WithEachAllocationFailing(
      [] {
        StartAfresh();
        return QUENDELCollectUDC(kRunFolder);
      },
      [&](int result) {
        const std::string written = std::string(kRunFolder) + "/udc.result";
        const std::string staged = Exists(kUdcUpdateFile) ? ReadFile(kUdcUpdateFile) : "";
        if (result != 0) {
          EXPECT_EQ(result, -1);
          EXPECT_THAT(Log(), Not(IsEmpty()));
          EXPECT_EQ(staged, "");
          ++failures;
          return;
        }
        const Json::Value results = JsonOf(ReadFile(written));
        const bool lacksName = testing::Value(
            Log(),
            Contains(Logged(_, StartsWith("Failed to find bin name in conf '" + UdcConf("b")))));
        for (const auto& [name, output] : outputs) {
          const bool isStaged = staged.find("[" + UdcConf(name) + "]") != std::string::npos;
          // A configuration whose name cannot be read is filed under the name before it.
          const bool isOverwritten = name == "a" && lacksName;
          if (isStaged) {
            EXPECT_EQ(results[name], isOverwritten ? "Error" : JsonOf(output));
          }
          partial += isStaged ? 0 : 1;
        }
      });
  EXPECT_GT(failures, 0);
  EXPECT_GT(partial, 0) << "a collector takes memory, and costs only itself";
}

TEST(CollectorsNoMemoryTest, CostsNoLogButTheOneThatNeedsIt) {
  // So wide that a list of them takes memory.
  On("stat").Anywhere().With(HasSubstr(".xz")).Replace([](const char* path, struct stat* status) {
    const int result = stat(path, status);
    status->st_ino += 10'000'000'000;
    return result;
  });
  InstallGrownLogs({"a", "b"});
  int failures = 0;
  int partial = 0;
  WithEachAllocationFailing(
      [] {
        StartAfresh();
        return QUENDELCollectLog(kRunFolder);
      },
      [&](int result) {
        const auto delivered = Delivered();
        const Sections staged = ReadStaged();
        if (result != 0) {
          EXPECT_EQ(result, -1);
          EXPECT_THAT(Log(), ElementsAre(Logged("quendel_collect_log",
                                                AnyOf("Failed to allocate memory for list",
                                                      StartsWith("Failed to enum dir '")))));
          EXPECT_THAT(delivered, IsEmpty());
          EXPECT_THAT(staged, IsEmpty());
          ++failures;
          return;
        }
        // One allocation fails, so one log may.
        EXPECT_THAT(staged, AnyOf(SizeIs(1), SizeIs(2)));
        for (const auto& [conf, pairs] : staged) {
          const std::string name = conf.substr(conf.size() - 1);
          // An archive that could not be prepared is passed over.
          const auto complaint = Contains(Logged(_, HasSubstr("/" + name + ".2.xz'")));
          const bool isDropped = testing::Value(Log(), complaint);
          EXPECT_THAT(delivered, Contains(Pair(name, isDropped ? "four\n" : "two\nfour\n")));
          EXPECT_THAT(delivered, Contains(Pair(name + ".1.xz", "three\n")));
          EXPECT_THAT(pairs, Contains(Key("tar_log_inode")));
        }
        partial += staged.size() == 1 ? 1 : 0;
      });
  EXPECT_GT(failures, 0);
  EXPECT_GT(partial, 0);
}
