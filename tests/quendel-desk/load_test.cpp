// A desk under the load of many devices, and killed under it.
#include <gmock/gmock.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <map>
#include <random>
#include <sstream>

#include "quendel-desk/running_desk.h"
#include "support/appliance.h"

using namespace quendel::test;
using testing::HasSubstr;

namespace {

constexpr char kJournal[] = "/run/journal";

const std::vector<std::string> kRoomForLoad = {"--rate-per-device", "0",
                                               "--max-connections-per-address", "2000"};

// The fleet, which plays a thousand devices.
class Fleet {
 public:
  explicit Fleet(std::vector<std::string> options) {
    options.insert(options.begin(), {FLEET, "--journal", kJournal, "--threads", "8"});
    std::vector<char*> argv;
    for (std::string& option : options) {
      argv.push_back(option.data());
    }
    argv.push_back(nullptr);
    EXPECT_EQ(posix_spawn(&process_, FLEET, nullptr, nullptr, argv.data(), environ), 0);
  }
  void End() {
    kill(process_, SIGTERM);
    Wait();
  }
  void Wait() {
    int status = -1;
    EXPECT_EQ(waitpid(process_, &status, 0), process_);
    EXPECT_EQ(status, 0);
  }

 private:
  pid_t process_ = 0;
};

// What the desk has of each event and collection: how often it is there.
std::map<std::string, int> Stored() {
  std::map<std::string, int> stored;
  long long after = 0;
  for (Json::Value page; !page.isMember("next") || !page["next"].isNull();) {
    page = AskJson("/devices?limit=1000&after=" + std::to_string(after));
    for (const Json::Value& device : page["devices"]) {
      const std::string serial = device["serial"].asString();
      const Json::Value line =
          AskJson("/devices/" + device["id"].asString() + "/timeline?limit=1000");
      EXPECT_LT(line["entries"].size(), 1000U);
      for (const Json::Value& entry : line["entries"]) {
        const bool event = entry["kind"] == "event";
        ++stored[event ? "event " + serial + " " + entry["body"]["mark"].asString()
                       : "collection " + serial + " " + entry["files"][0]["sha256"].asString()];
      }
    }
    after = page["next"].asInt64();
  }
  return stored;
}

// Compares it with what the fleet noted: what was acknowledged is there once, what was cut at most
// once, and there is nothing else.
void ExpectNothingLostOrDoubled(size_t least) {
  std::map<std::string, int> stored = Stored();
  std::istringstream journal(ReadFile(kJournal));
  std::string kind;
  std::string serial;
  std::string mark;
  std::string end;
  size_t acknowledged = 0;
  while (journal >> kind >> serial >> mark >> end) {
    const std::string key = kind + " " + serial + " " + mark;
    const int times = stored[key];
    stored.erase(key);
    EXPECT_TRUE(times == 1 || (times == 0 && end == "cut")) << key << " " << end << " " << times;
    acknowledged += end == "acked" ? 1 : 0;
  }
  EXPECT_TRUE(stored.empty()) << stored.size() << " that nobody sent";
  EXPECT_GE(acknowledged, least);
}

// `quick` looks at sizes, not at every byte.
void ExpectVerified(const std::vector<std::string>& quick = {}) {
  std::vector<std::string> command = {"verify"};
  command.insert(command.end(), quick.begin(), quick.end());
  std::string output;
  EXPECT_EQ(RunDesk(command, output), 0) << output;
}

size_t ResidentKiB(pid_t process) {
  std::istringstream status(ReadFile("/proc/" + std::to_string(process) + "/status"));
  std::string word;
  while (status >> word && word != "VmRSS:") {
  }
  size_t size = 0;
  status >> size;
  return size;
}

int Kills() {
  const char* wanted = getenv("QUENDEL_DESK_KILLS");
  return wanted == nullptr ? 12 : atoi(wanted);
}

}  // namespace

TEST(DeskLoadTest, AThousandDevicesLoseNothingAndNothingIsDoubled) {
  const RunningDesk desk(kRoomForLoad);
  Fleet fleet({"--seconds", "6", "--event-every", "3", "--collection-every", "40"});
  fleet.Wait();
  ExpectNothingLostOrDoubled(50);
  ExpectVerified();
}

TEST(DeskLoadTest, MemoryIsFlat) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the sanitizer keeps what has been freed";
#endif
  const RunningDesk desk(kRoomForLoad);
  Fleet({"--seconds", "3"}).Wait();
  const size_t before = ResidentKiB(desk.process());
  for (int i = 0; i < 2; ++i) {
    Fleet({"--seconds", "3"}).Wait();
  }
  EXPECT_LT(ResidentKiB(desk.process()), before + 16 * 1024);
}

TEST(DeskLoadTest, KilledAtRandomPointsItKeepsWhatItAcknowledged) {
  RunningDesk desk(kRoomForLoad);
  Fleet fleet({"--seconds", "3600", "--event-every", "2", "--collection-every", "10",
               "--collection-bytes", "100000"});
  std::mt19937 random(20261122);
  for (int i = 0; i < Kills(); ++i) {
    usleep(50'000 + static_cast<useconds_t>(random() % 450'000));
    desk.Kill();
    desk.Start();
    ExpectVerified({"--quick"});
  }
  fleet.End();
  ExpectNothingLostOrDoubled(20);
  ExpectVerified();
  EXPECT_THAT(desk.Errors(), testing::Not(HasSubstr("damaged")));
}
