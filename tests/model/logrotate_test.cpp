// The log collector behind the real logrotate, with the configurations that this machine's packages
// bring, compressing with xz. Against the model, and for lines that never arrive.
#include <gmock/gmock.h>
#include <sys/mount.h>

#include <cstdlib>
#include <filesystem>
#include <regex>
#include <set>
#include <sstream>

#include "model/checked_run.h"
#include "model/collector_files.h"
#include "model/loop_mount.h"
#include "support/appliance.h"
#include "support/random.h"

using namespace quendel::test;

namespace {

namespace fs = std::filesystem;

constexpr char kPackagesFolder[] = "/etc/logrotate.d";
constexpr char kConfig[] = "/tmp/logrotate.conf";
constexpr char kCommand[] =
    "/usr/sbin/logrotate --force --state /tmp/logrotate.state /tmp/logrotate.conf";
constexpr int kRotations = 12;

// The configurations of the packages, by file name.
std::map<std::string, std::string> PackageConfigs() {
  std::map<std::string, std::string> configs;
  for (const fs::directory_entry& entry : fs::directory_iterator(kPackagesFolder)) {
    configs[entry.path().filename()] = ReadFile(entry.path());
  }
  return configs;
}

// The logs that a configuration is about; a pattern stands for one log that it fits.
std::vector<std::string> LogsOf(const std::string& config) {
  std::vector<std::string> logs;
  const std::regex path("(^|\\n|[ \\t])\"?(/var/log/[^ \\t\\n\"{]+)(?=[^}]*\\{)");
  for (std::sregex_iterator found(config.begin(), config.end(), path), end; found != end; ++found) {
    logs.push_back(std::regex_replace((*found)[2].str(), std::regex("\\*"), "one"));
  }
  return logs;
}

// One package's logs, written, rotated and collected.
class Packaged {
 public:
  Packaged(const std::string& config, const std::string& fileSystem) : logs_(LogsOf(config)) {
    // A file system whose inode numbers are its own.
    if (fileSystem == "tmpfs") {
      EXPECT_EQ(mount("log", "/var/log", "tmpfs", 0, "mode=755"), 0);
    } else {
      EXPECT_EQ(MountFileSystem(fileSystem, "/var/log"), "");
    }
    std::set<std::string> folders;
    for (const std::string& log : logs_) {
      folders.insert(fs::path(log).parent_path());
    }
    for (const std::string& folder : folders) {
      fs::create_directories(folder);
      folders_.push_back(folder);
    }
    for (const std::string& log : logs_) {
      InstallLog(std::regex_replace(log, std::regex("/"), "-"), log);
      WriteFile(log, "first of " + log + "\n");
    }
    WriteFile(kConfig,
              "compress\ncompresscmd /usr/bin/xz\nuncompresscmd /usr/bin/unxz\ncompressext .xz\n"
              "compressoptions -0\n" +
                  config);
  }

  ~Packaged() {
    EXPECT_EQ(umount("/var/log"), 0);
    RemoveFile("/tmp/logrotate.state");
    RemoveFile(kConfFolder);
    fs::create_directories(kConfFolder);
  }

  const std::vector<std::string>& logs() const { return logs_; }

  void Append(size_t lines) {
    for (const std::string& log : logs_) {
      for (size_t i = 0; i < lines; ++i) {
        const std::string line = log + " line " + std::to_string(nextLine_++);
        AppendFile(log, line + "\n");
        written_.insert(line);
      }
    }
  }

  static void RotateAll() { ASSERT_EQ(system(kCommand), 0); }

  void CollectAndCommit() {
    const CheckedRun run = CollectAndCompare(folders_, {});
    ASSERT_EQ(run.difference, "");
    for (const auto& [path, file] : run.delivered) {
      std::istringstream text(file.plain.value_or(file.bytes));
      for (std::string line; std::getline(text, line);) {
        written_.erase(line);
      }
    }
    ASSERT_EQ(CommitAndCompare(0), "");
  }

  // The lines that have not been delivered.
  const std::set<std::string>& missing() const { return written_; }

 private:
  std::vector<std::string> logs_;
  std::vector<std::string> folders_;
  std::set<std::string> written_;
  int nextLine_ = 0;
};

}  // namespace

// On a file system that never gives a file the number of one that is gone, and on one that does.
class LogrotateTest : public testing::TestWithParam<const char*> {
 protected:
  void SetUp() override {
    const std::string reason =
        GetParam() == std::string("tmpfs") ? "" : MountFileSystem(GetParam(), "/tmp/trial");
    if (!reason.empty()) {
      GTEST_SKIP() << reason;
    }
    ASSERT_TRUE(Exists("/usr/sbin/logrotate")) << "script/bootstrap installs logrotate";
    configs_ = PackageConfigs();
    ASSERT_GE(configs_.size(), 3u) << "every Debian brings those of dpkg, apt and alternatives";
  }

  // With the identity that docs/delivery-guarantee.md asks for.
  static void KnowFilesByBirth() {
    WriteFile("/usr/arvo/etc/device.conf", "file_identity=birth\n");
  }

  std::map<std::string, std::string> configs_;
};

INSTANTIATE_TEST_SUITE_P(FileSystems, LogrotateTest, testing::Values("tmpfs", "ext4"),
                         [](const auto& type) { return std::string(type.param); });

TEST_P(LogrotateTest, TheCollectorFollowsTheModelWithTheConfigurationsAsTheyAre) {
  Random random(1);
  size_t logs = 0;
  for (const auto& [name, config] : configs_) {
    SCOPED_TRACE(name);
    Packaged packaged(config, GetParam());
    logs += packaged.logs().size();
    for (int i = 0; i < kRotations && !HasFatalFailure(); ++i) {
      packaged.Append(random.Below(3));
      if (random.OneIn(2)) {
        packaged.CollectAndCommit();
        packaged.Append(random.Below(3));
      }
      Packaged::RotateAll();
    }
    packaged.CollectAndCommit();
  }
  EXPECT_GE(logs, 4u);
}

// As docs/delivery-guarantee.md asks for: no delayed compression, and a run after each rotation.
TEST_P(LogrotateTest, NoLineIsLostWithoutDelayedCompression) {
  Random random(2);
  KnowFilesByBirth();
  for (const auto& [name, config] : configs_) {
    SCOPED_TRACE(name);
    Packaged packaged(std::regex_replace(config, std::regex("[ \\t]*delaycompress[ \\t]*\\n"), ""),
                      GetParam());
    for (int i = 0; i < kRotations && !HasFatalFailure(); ++i) {
      packaged.Append(1 + random.Below(3));
      if (random.OneIn(2)) {
        packaged.CollectAndCommit();
        packaged.Append(random.Below(3));
      }
      Packaged::RotateAll();
      packaged.Append(1);
      packaged.CollectAndCommit();
    }
    // A log that was emptied and has its old size again is not looked at until it changes.
    Packaged::RotateAll();
    packaged.Append(4);
    packaged.CollectAndCommit();
    EXPECT_THAT(packaged.missing(), testing::IsEmpty());
  }
}

TEST_P(LogrotateTest, LinesAreLostWithDelayedCompression) {
  ASSERT_EQ(configs_.count("dpkg"), 1u);
  ASSERT_THAT(configs_["dpkg"], testing::HasSubstr("delaycompress"));
  Packaged packaged(configs_["dpkg"], GetParam());
  packaged.CollectAndCommit();
  packaged.Append(1);
  for (int i = 0; i < 3; ++i) {
    Packaged::RotateAll();
    packaged.CollectAndCommit();
  }
  EXPECT_THAT(packaged.missing(), testing::SizeIs(1));
}
