// A day at high speed: the daemon and its workers are killed at random moments, the server behaves
// as badly as it can, and the real logrotate rotates the log. Afterwards nothing is missing.
//
// QUENDELD_DAY_KILLS is how many kills; script/quendeld-day asks for 200.
#include <gmock/gmock.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <random>
#include <set>

#include "json.h"
#include "received.h"
#include "running_daemon.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
namespace fs = std::filesystem;
using testing::HasSubstr;

namespace {

constexpr char kLog[] = "/var/log/arvo/one.log";

int KillsWanted() {
  const char* text = getenv("QUENDELD_DAY_KILLS");
  return text == nullptr ? 12 : atoi(text);
}

class Day {
 public:
  Day() {
    SwitchService(true);
    RemoveFile("/usr/arvo/etc/quendel");
    WriteFile("/usr/arvo/etc/quendel/quendel.log.one",
              std::string("name=one\npath=") + kLog +
                  "\nlast_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\ntotal_byte=\"\"\n"
                  "inode=\"\"\n");
    WriteFile("/var/crash/@demo/x.core", "dump");
    WriteFile("/tmp/rotate.conf", std::string(kLog) +
                                      " {\ncompress\ncompresscmd /usr/bin/xz\ncompressext .xz\n"
                                      "nodelaycompress\nnodateext\ncreate\nrotate 15\n}\n");
    fs::create_directories("/var/log/arvo");
    Write(5);
    Behave();
    Start();
  }

  void Write(int lines) {
    std::ofstream log(kLog, std::ios::app);
    for (int line = 0; line < lines; ++line) {
      log << "line " << ++written_ << " " << std::string(random_() % 60, 'x') << "\n";
    }
  }

  // Not while a run looks at the archives, which docs/delivery-guarantee.md asks for.
  void Rotate() {
    Write(1);
    EXPECT_EQ(system("flock /run/quendel/collect.lock logrotate --force /tmp/rotate.conf"), 0);
    Write(1);
  }

  // The server is as it should be, and asks for something. Each request comes many times.
  void Behave() {
    if (is_bad_) {
      for (const std::string& file : RequestFiles()) {
        if (good_.count(file) == 0) {
          refused_.insert(file);
        }
      }
      is_bad_ = false;
    }
    std::string actions;
    for (int id = std::max(1, last_id_ - 2); id <= last_id_ + 1; ++id) {
      actions += (actions.empty() ? "" : ",") +
                 (R"({"action":"upload_file","request_id":)" + std::to_string(id)) +
                 R"(,"files":[{"file_type":"coredump","file_uuid":"u",)"
                 R"("file_path":"/var/crash/@demo/x.core"}]})";
    }
    ++last_id_;
    AnswerAll("{\"success\":true,\"actions\":[" + actions + "]}");
  }

  void Misbehave() {
    static const std::vector<std::pair<std::string, std::string>> kMoods = {
        {"status 503", ""},
        {"status 200\ndelay_ms 60000", "{\"success\":true}"},
        {"status 200\ncut_after 40", "{\"success\":true}"},
        {"status 200", "{\"success\":\"[[[["},
        {"status 200", "{\"success\":false,\"actions\":[{\"action\":7}],\"code\":119999}"}};
    if (!is_bad_) {
      for (const std::string& file : RequestFiles()) {
        good_.insert(file);
      }
    }
    const auto& [head, body] = kMoods[random_() % kMoods.size()];
    AnswerAll(body, head);
    if (!is_bad_) {
      usleep(300'000);  // what was under way had its answer
      for (const std::string& file : RequestFiles()) {
        good_.insert(file);
      }
    }
    is_bad_ = true;
  }

  void KillDaemon() {
    daemon_->End(SIGKILL);
    Start();
  }

  void KillAWorker() {
    for (const fs::directory_entry& entry : fs::directory_iterator("/proc")) {
      std::error_code error;
      if (fs::read_symlink(entry.path() / "exe", error).filename() == "quendel-worker") {
        kill(atoi(entry.path().filename().c_str()), SIGKILL);
        return;
      }
    }
  }

  void ChangeContact() {
    ++contact_;
    WriteFile("/usr/arvo/etc/quendel.conf",
              "contact=[\"contact " + std::to_string(contact_) + "\"]\n");
  }

  // Lets everything that waits be delivered.
  void End() {
    Behave();
    KillDaemon();
    EXPECT_TRUE(Within(60, [&] {
      const Json::Value status = daemon_->Status();
      return status["events"] == 0 && status["reports"] == 0 && status["actions"] == 0 &&
             status["outbox"]["archives"] == 0 && status["collection"]["running"] == false;
    })) << quendeld::JsonLine(daemon_->Status());
    EXPECT_TRUE(Within(60, [&] { return daemon_->Ask("collect")["success"] == true; }));
    EXPECT_TRUE(Within(10, [&] { return daemon_->Ask("pause")["success"] == true; }));
    EXPECT_TRUE(Within(10, [] { return !AnyWorkerRuns(); }));
  }

  void ExpectEveryLine() const {
    const std::string received = "\n" + Received(refused_);
    for (int line = 1; line <= written_; ++line) {
      EXPECT_NE(received.find("\nline " + std::to_string(line) + " "), std::string::npos)
          << "line " << line << " of " << written_ << " is missing";
    }
  }

  void ExpectNoActionTwice() const {
    for (int id = 1; id <= last_id_; ++id) {
      EXPECT_LE(CountRequests("POST /upload_file/" + std::to_string(id) + "/"), 1) << id;
    }
  }

  void ExpectTheLastEvent() const {
    EXPECT_THAT(LastBody("POST /action/"), HasSubstr("contact " + std::to_string(contact_)));
    EXPECT_GE(CountRequests("POST /action/"), contact_ > 0 ? 2 : 1);
  }

  void ExpectNothingLeft() const {
    for (const fs::directory_entry& entry : fs::directory_iterator("/tmp")) {
      EXPECT_NE(entry.path().filename().string().rfind("quendel_", 0), 0U) << entry.path();
    }
    for (const fs::directory_entry& entry : fs::directory_iterator("/tmp/quendel")) {
      EXPECT_THAT(entry.path().filename().string(), testing::Not(HasSubstr(".p.")));
    }
  }

  size_t Random(size_t below) { return random_() % below; }

 private:
  void Start() {
    daemon_.reset();
    daemon_ =
        std::make_unique<RunningDaemon>(RunningDaemon::Settings{{"heartbeat_interval", "0.3"},
                                                                {"heartbeat_backoff_limit", "0.6"},
                                                                {"collection_interval", "2"},
                                                                {"collection_retry", "0.5"},
                                                                {"sample_interval", "0.5"},
                                                                {"conversation_limit", "1.5"},
                                                                {"collection_limit", "8"},
                                                                {"upload_limit", "3"},
                                                                {"kill_after", "0.5"}});
  }

  std::mt19937 random_{testing::UnitTest::GetInstance()->random_seed() + 7U};
  std::unique_ptr<RunningDaemon> daemon_;
  std::set<std::string> good_;
  std::set<std::string> refused_;
  bool is_bad_ = false;
  int written_ = 0;
  int last_id_ = 0;
  int contact_ = 0;
};

TEST(QuendeldDayTest, LosesNothingAndDoesNothingTwice) {
  Day day;
  for (int kills = 0; kills < KillsWanted();) {
    day.Write(1 + static_cast<int>(day.Random(4)));
    usleep(static_cast<useconds_t>(50'000 + day.Random(900'000)));
    switch (day.Random(7)) {
      case 0:
        day.Misbehave();
        break;
      case 1:
      case 2:
        day.Behave();
        break;
      case 3:
        day.Rotate();
        break;
      case 4:
        day.ChangeContact();
        break;
      case 5:
        day.KillDaemon();
        ++kills;
        break;
      default:
        day.KillAWorker();
        ++kills;
    }
  }
  day.End();
  day.ExpectEveryLine();
  day.ExpectNoActionTwice();
  day.ExpectTheLastEvent();
  day.ExpectNothingLeft();
}

}  // namespace
