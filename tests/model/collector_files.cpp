// The files around the log collector.
#include "model/collector_files.h"

#include <gmock/gmock.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "model/xz.h"
#include "platform/file.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

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

void PushArchive(const std::string& log, const std::string& text) {
  int number = 1;
  while (Exists(ArchiveOf(log, number))) {
    ++number;
  }
  for (; number > 1; --number) {
    fs::rename(ArchiveOf(log, number - 1), ArchiveOf(log, number));
  }
  WriteFile(ArchiveOf(log, 1), Xz(text));
}

}  // namespace

std::string InstallLog(const std::string& name, const std::string& path) {
  const std::string conf = std::string(kConfFolder) + "/quendel.log." + name;
  WriteFile(conf, "name=" + name + "\npath=" + path +
                      "\nlast_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\ntotal_byte=\"\"\n"
                      "inode=\"\"\n");
  return conf;
}

Pairs ReadPairs(const std::string& path) {
  return ReadSections(path).front().second;
}

Sections ReadStaged() {
  Sections sections = ReadSections(kLogUpdateFile);
  sections.erase(sections.begin());
  return sections;
}

void AppendFile(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary | std::ios::app);
  out << text << std::flush;
  ASSERT_TRUE(out) << path;
}

std::string ArchiveOf(const std::string& log, int number) {
  return log + "." + std::to_string(number) + ".xz";
}

void Rotate(const std::string& log) {
  const std::string text = ReadFile(log);
  // The new log is there before the old one goes, so that it cannot have the old one's inode.
  fs::rename(log, log + ".1");
  WriteFile(log, "");
  PushArchive(log, text);
  fs::remove(log + ".1");
}

void CopyTruncate(const std::string& log) {
  PushArchive(log, ReadFile(log));
  fs::resize_file(log, 0);
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
