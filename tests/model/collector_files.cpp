// The files around the log collector.
#include "model/collector_files.h"

#include <gmock/gmock.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "platform/file.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"
#include "support/xz.h"

namespace quendel::test {
namespace {

namespace fs = std::filesystem;

// What stands before the first section line has the name "".
Sections ReadSections(const std::string& path) {
  Sections sections = {{"", {}}};
  std::istringstream in(Exists(path) ? ReadFile(path) : "");
  for (std::string line; std::getline(in, line);) {
    const size_t equals = line.find('=');
    if (!line.empty() && line.front() == '[') {
      sections.emplace_back(line.substr(1, line.size() - 2), Pairs());
    } else if (equals != std::string::npos) {
      sections.back().second[line.substr(0, equals)] = line.substr(equals + 1);
    }
  }
  return sections;
}

}  // namespace

Pairs ReadPairs(const std::string& path) {
  return ReadSections(path).front().second;
}

Sections ReadStaged() {
  Sections sections = ReadSections(kLogUpdateFile);
  sections.erase(sections.begin());
  return sections;
}

void ShowInode(const std::string& path, uint64_t inode) {
  On("stat").Anywhere().With(path).Replace([inode](const char* given, struct stat* status) {
    const int result = stat(given, status);
    status->st_ino = inode;
    return result;
  });
}

void OnceMeasured(const std::string& path, std::function<void()> action) {
  On("ALIBCFileStat")
      .With(path)
      .Nth(1)
      .Replace([action = std::move(action)](const char* given, int flags, struct stat* status) {
        const int result = ALIBCFileStat(given, flags, status);
        action();
        return result;
      });
}

int Collect() {
  fs::remove_all(kRunFolder);
  fs::create_directories(kRunFolder);
  fs::create_directories("/tmp/quendel");
  return QUENDELCollectLog(kRunFolder);
}

void Commit() {
  EXPECT_EQ(QUENDELUpdateCollectConf(kLogUpdateFile), 0);
}

void CollectAndCommit() {
  ClearLog();
  EXPECT_EQ(Collect(), 0);
  Commit();
  EXPECT_THAT(Log(), testing::IsEmpty());
}

std::map<std::string, std::string> Delivered() {
  std::map<std::string, std::string> files;
  for (const fs::directory_entry& entry : fs::directory_iterator(kRunFolder)) {
    const std::string bytes = ReadFile(entry.path());
    const bool isArchive = entry.path().extension() == ".xz";
    files[entry.path().filename()] = isArchive ? Unxz(bytes).value_or("(no archive)") : bytes;
  }
  return files;
}

}  // namespace quendel::test
