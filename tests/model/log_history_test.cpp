// Random histories of logs: after each step the collector has done what the model does.
//
// QUENDEL_HISTORIES sets how many histories each test plays, QUENDEL_HISTORY_SEED the first one's
// number. A history that fails names its number and its steps; to play it again:
//   QUENDEL_HISTORIES=1 QUENDEL_HISTORY_SEED=<number>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <filesystem>
#include <regex>
#include <set>

#include "model/checked_run.h"
#include "model/collector_files.h"
#include "model/loop_mount.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/random.h"
#include "support/xz.h"

using namespace quendel::test;

namespace {

namespace fs = std::filesystem;

constexpr const char* kFileSystems[] = {"/volume1", "/tmp"};

int Environment(const char* name, int otherwise) {
  const char* value = getenv(name);
  return value == nullptr ? otherwise : atoi(value);
}

// What may happen to the logs of a history.
enum class Kind {
  kAnything,
  kWellRotated,  // nothing that may cost a line
};

class History {
 public:
  History(int number, Kind kind, const std::string& root)
      : kind_(kind),
        random_(static_cast<unsigned>(number)),
        steps_(20 + Below(20)),
        logRoot_(root + "/logs"),
        graveRoot_(root + "/graves") {
    for (const std::string& folder :
         {logRoot_, graveRoot_, std::string(kConfFolder), std::string("/tmp/quendel")}) {
      fs::remove_all(folder);
      fs::create_directories(folder);
    }
    const int logs = 1 + Below(3);
    for (int i = 0; i < logs; ++i) {
      AddLog(i);
    }
  }

  // Plays the history. Returns what went wrong, with the steps that led there; empty when nothing
  // did.
  std::string Play() {
    std::string difference;
    for (int i = 0; i < steps_ && difference.empty(); ++i) {
      difference = Step();
    }
    if (difference.empty() && kind_ == Kind::kWellRotated) {
      difference = Finish();
    }
    return difference.empty() ? "" : trace_ + difference;
  }

 private:
  struct Log {
    std::string conf;
    std::string folder;
    std::string path;
    std::string unfinished;  // what was written of the last line
  };

  int Below(int limit) { return random_.Below(limit); }
  bool OneIn(int times) { return random_.OneIn(times); }

  void AddLog(int number) {
    const std::string digit = std::to_string(number);
    // Two logs of one name share their files; that costs lines, so only where anything may happen.
    const bool sharesName = kind_ == Kind::kAnything && OneIn(8);
    Log log;
    log.folder = logRoot_ + "/" + digit;
    log.path = log.folder + "/messages";
    fs::create_directories(log.folder);
    log.conf = InstallLog("log" + digit, log.path);
    if (sharesName) {
      WriteFile(log.conf,
                std::regex_replace(ReadFile(log.conf), std::regex("name=.*"), "name=same"));
    }
    logs_.push_back(log);
    folders_.push_back(log.folder);
    if (!OneIn(4)) {
      Create(log.path);
    }
  }

  // Makes an empty file, now and then out of one that was removed, so that its inode comes again.
  void Create(const std::string& path) {
    if (!graves_.empty() && OneIn(3)) {
      fs::rename(graves_.back(), path);
      graves_.pop_back();
    }
    Write(path, "", O_TRUNC);
  }

  void Remove(const std::string& path) {
    if (kind_ == Kind::kWellRotated) {
      fs::remove(path);
      return;
    }
    graves_.push_back(graveRoot_ + "/" + std::to_string(nextGrave_++));
    fs::rename(path, graves_.back());
  }

  static void Write(const std::string& path, const std::string& text, int flag) {
    const int file = open(path.c_str(), O_WRONLY | O_CREAT | flag, 0644);
    ASSERT_GE(file, 0) << path;
    ASSERT_EQ(write(file, text.data(), text.size()), static_cast<ssize_t>(text.size()));
    close(file);
  }

  static std::string Archive(const Log& log, int n) { return ArchiveOf(log.path, n); }

  // A line that no other history has, or, where anything may happen, one of a few.
  std::string NewText() {
    if (kind_ == Kind::kAnything && OneIn(3)) {
      static const std::string kTexts[] = {"", "a", "b", std::string("\0\xff\r", 3)};
      return kTexts[Below(4)];
    }
    std::string text = "line " + std::to_string(nextLine_++);
    if (OneIn(100)) {
      text += std::string(
          65536 * static_cast<size_t>(1 + Below(2)) + static_cast<size_t>(Below(3)) - 8, 'x');
    }
    return text;
  }

  void Append(Log& log) {
    std::string added;
    for (int lines = 1 + Below(4); lines > 0; --lines) {
      const std::string text = NewText();
      written_.insert(log.unfinished + text);
      log.unfinished.clear();
      added += text + "\n";
    }
    Write(log.path, added, O_APPEND);
  }

  void AppendUnfinished(Log& log) {
    const std::string text = NewText();
    log.unfinished += text;
    Write(log.path, text, O_APPEND);
  }

  void PushArchives(const Log& log, const std::string& text) {
    int oldest = 0;
    while (Exists(Archive(log, oldest + 1))) {
      ++oldest;
    }
    for (int n = oldest; n > 0; --n) {
      const std::string next = Archive(log, n + 1);
      if (kind_ == Kind::kAnything && n >= 3) {
        Remove(Archive(log, n));
        continue;
      }
      if (Exists(next)) {
        Remove(next);
      }
      fs::rename(Archive(log, n), next);
    }
    Create(Archive(log, 1));
    Write(Archive(log, 1), Xz(text), O_TRUNC);
  }

  // What was unfinished stays so in the archive, and counts as a line there.
  void CloseUnfinished(Log& log) {
    if (!log.unfinished.empty()) {
      written_.insert(log.unfinished);
      log.unfinished.clear();
    }
  }

  void Rotate(Log& log) {
    CloseUnfinished(log);
    const std::string text = ReadFile(log.path);
    fs::rename(log.path, log.path + ".1");
    if (!OneIn(10)) {
      Create(log.path);
    }
    PushArchives(log, text);
    Remove(log.path + ".1");
  }

  void CopyTruncate(Log& log) {
    CloseUnfinished(log);
    PushArchives(log, ReadFile(log.path));
    Write(log.path, "", O_TRUNC);
  }

  // One of the things that may cost a line.
  std::string Harm(Log& log) {
    const std::string text = ReadFile(log.path);
    const int archive = 1 + Below(3);
    switch (Below(6)) {
      case 0:
        Write(log.path, text.substr(0, text.size() / 2), O_TRUNC);
        return "truncate by half";
      case 1:
        Write(log.path, "", O_TRUNC);
        return "truncate";
      case 2:
        Remove(log.path);
        return "delete";
      case 3:
        Write(log.path, std::string(text.size() / 2, 'y') + "\n" + text.substr(text.size() / 2),
              O_TRUNC);
        return "rewrite";
      case 4:
        if (Exists(Archive(log, archive))) {
          Remove(Archive(log, archive));
        }
        return "delete archive " + std::to_string(archive);
      default:
        if (Exists(Archive(log, archive))) {
          Write(Archive(log, archive), ReadFile(Archive(log, archive)).substr(0, 40), O_TRUNC);
        }
        return "damage archive " + std::to_string(archive);
    }
  }

  ModelFault RandomFault() {
    // The first seven cost no line even of a log that is rotated well.
    static const char* const kCalls[] = {
        "ALIBCSzHashSetValue", "ALIBCSzListPush",  "ALIBCStrTok", "ALIBCFileAddSection",
        "ALIBCSzListAlloc",    "ALIBCSzHashAlloc", "calloc",      "ARVOFileCopy",
        "ALIBCExec",           "ALIBCFileStat"};
    return {kCalls[Below(kind_ == Kind::kAnything ? 10 : 7)], 1 + Below(8)};
  }

  std::string Collect(const ModelFault& fault, bool commits, int failing) {
    const CheckedRun run = CollectAndCompare(folders_, fault);
    if (!run.difference.empty() || !commits) {
      return run.difference;
    }
    for (const auto& [path, file] : run.delivered) {
      Deliver(file.plain.value_or(file.bytes));
    }
    return CommitAndCompare(failing);
  }

  void Deliver(const std::string& text) {
    size_t begin = 0;
    while (begin < text.size()) {
      const size_t end = std::min(text.find('\n', begin), text.size());
      delivered_.insert(text.substr(begin, end - begin));
      begin = end + 1;
    }
  }

  void Trace(const std::string& step, const Log& log) { trace_ += step + " " + log.path + "\n"; }

  std::string CollectSomehow() {
    const int way = Below(10);
    if (way < 5) {
      trace_ += "collect and commit\n";
      return Collect({}, true, 0);
    }
    if (way < 7) {
      trace_ += "collect\n";
      return Collect({}, false, 0);
    }
    if (way < 8) {
      const int failing = 1 + Below(6);
      trace_ += "collect and commit until write " + std::to_string(failing) + "\n";
      return Collect({}, true, failing);
    }
    const ModelFault fault = RandomFault();
    trace_ += "collect, failing at " + fault.call + " " + std::to_string(fault.nth) + "\n";
    return Collect(fault, true, 0);
  }

  std::string Step() {
    Log& log = logs_[static_cast<size_t>(Below(static_cast<int>(logs_.size())))];
    const int what = Below(100);
    if (what < 35) {
      return CollectSomehow();
    }
    if (!Exists(log.path)) {
      Trace("create", log);
      Create(log.path);
    } else if (what < 65) {
      Trace("append", log);
      Append(log);
    } else if (what < 72) {
      Trace("append without newline", log);
      AppendUnfinished(log);
    } else if (what < 84) {
      Trace("rotate", log);
      Rotate(log);
    } else if (what < 89) {
      Trace("copy and truncate", log);
      CopyTruncate(log);
    } else if (what < 91) {
      Trace("reset", log);
      QUENDELResetLogConf(log.conf.c_str());
    } else if (kind_ == Kind::kAnything) {
      Trace(Harm(log), log);
    }
    return "";
  }

  // Rotates every log once more and collects; each line ever written must have been delivered.
  std::string Finish() {
    for (Log& log : logs_) {
      if (Exists(log.path)) {
        Rotate(log);
      }
      if (!Exists(log.path)) {
        Create(log.path);
      }
    }
    trace_ += "rotate all, collect and commit\n";
    const std::string difference = Collect({}, true, 0);
    if (!difference.empty()) {
      return difference;
    }
    for (const std::string& line : written_) {
      if (delivered_.count(line) == 0) {
        return "Never delivered: " + line.substr(0, 100);
      }
    }
    return "";
  }

  Kind kind_;
  Random random_;
  int steps_;
  std::string logRoot_;
  std::string graveRoot_;
  std::vector<Log> logs_;
  std::vector<std::string> folders_;
  std::vector<std::string> graves_;
  int nextGrave_ = 0;
  int nextLine_ = 0;
  std::set<std::string> written_;
  std::set<std::string> delivered_;
  std::string trace_;
};

// Without a root, every other history has its logs on the file system that they are collected to.
void PlayHistories(int first, int count, Kind kind, const char* root = nullptr) {
  first = Environment("QUENDEL_HISTORY_SEED", first);
  count = Environment("QUENDEL_HISTORIES", count);
  printf("Histories %d to %d\n", first, first + count - 1);
  for (int number = first; number < first + count; ++number) {
    const std::string failure =
        History(number, kind, root != nullptr ? root : kFileSystems[number % 2]).Play();
    EXPECT_EQ(failure, "") << "QUENDEL_HISTORIES=1 QUENDEL_HISTORY_SEED=" << number;
  }
}

}  // namespace

class LogHistoryTest : public testing::TestWithParam<int> {};
class WellRotatedLogHistoryTest : public testing::TestWithParam<int> {};

TEST_P(LogHistoryTest, FollowsTheModel) {
  PlayHistories(1 + 500 * GetParam(), 500, Kind::kAnything);
}

TEST_P(WellRotatedLogHistoryTest, FollowsTheModelAndLosesNoLine) {
  PlayHistories(100001 + 500 * GetParam(), 500, Kind::kWellRotated);
}

// On a file system that gives the number of a file that is gone to the next one.
class ReusedNumbersHistoryTest : public testing::TestWithParam<const char*> {
 protected:
  void SetUp() override {
    const std::string reason = MountFileSystem("ext4", kExt4);
    if (!reason.empty()) {
      GTEST_SKIP() << reason;
    }
    WriteFile("/usr/arvo/etc/device.conf", std::string("file_identity=") + GetParam() + "\n");
  }

  static constexpr char kExt4[] = "/volume1/ext4";
};

TEST_P(ReusedNumbersHistoryTest, FollowsTheModel) {
  PlayHistories(200001, 100, Kind::kAnything, kExt4);
}

INSTANTIATE_TEST_SUITE_P(Identities, ReusedNumbersHistoryTest, testing::Values("inode", "birth"),
                         [](const auto& identity) { return std::string(identity.param); });

class BirthHistoryTest : public ReusedNumbersHistoryTest {};

TEST_P(BirthHistoryTest, LosesNoLineOfALogThatIsRotatedWell) {
  PlayHistories(300001, 100, Kind::kWellRotated, kExt4);
}

INSTANTIATE_TEST_SUITE_P(Identities, BirthHistoryTest, testing::Values("birth"),
                         [](const auto& identity) { return std::string(identity.param); });

INSTANTIATE_TEST_SUITE_P(FiveHundred, LogHistoryTest, testing::Range(0, 8));
INSTANTIATE_TEST_SUITE_P(FiveHundred, WellRotatedLogHistoryTest, testing::Range(0, 3));
