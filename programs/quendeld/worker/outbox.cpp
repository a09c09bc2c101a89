#include "worker/outbox.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <vector>

#include "json.h"
#include "quendel.h"
#include "worker/work.h"

namespace quendel_worker {
namespace {

namespace fs = std::filesystem;

// What is being put in has a name that begins with a dot, until it is whole.
bool IsWhole(const fs::path& folder) {
  return folder.filename().string().find_first_not_of("0123456789-") == std::string::npos;
}

std::vector<fs::path> Items() {
  std::vector<fs::path> items;
  std::error_code error;
  for (fs::directory_iterator entry(kOutbox, error); !error && entry != fs::directory_iterator();
       entry.increment(error)) {
    if (IsWhole(entry->path())) {
      items.push_back(entry->path());
    }
  }
  std::sort(items.begin(), items.end());
  return items;
}

fs::path ArchiveIn(const fs::path& item) {
  std::error_code error;
  const fs::directory_iterator entry(item, error);
  return !error && entry != fs::directory_iterator() ? entry->path() : fs::path();
}

bool Sync(const fs::path& path) {
  const int file = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  const bool synced = file >= 0 && fsync(file) == 0;
  if (file >= 0) {
    close(file);
  }
  return synced;
}

// A second run in one second gets a name of its own, behind the first.
fs::path FreePlace(int64_t started) {
  std::error_code error;
  fs::path place = fs::path(kOutbox) / std::to_string(started);
  for (int number = 1; fs::exists(place, error); ++number) {
    place = fs::path(kOutbox) / (std::to_string(started) + "-" + std::to_string(number));
  }
  return place;
}

bool CopyIn(const fs::path& archive, const fs::path& draft, const fs::path& place) {
  std::error_code error;
  fs::remove_all(draft, error);
  const fs::path copy = draft / archive.filename();
  return mkdir(draft.c_str(), 0700) == 0 && QUENDELFileCopy(archive.c_str(), copy.c_str()) == 0 &&
         Sync(copy) && Sync(draft) && rename(draft.c_str(), place.c_str()) == 0 && Sync(kOutbox);
}

}  // namespace

Json::Value DescribeOutbox() {
  Json::UInt64 bytes = 0;
  const std::vector<fs::path> items = Items();
  for (const fs::path& item : items) {
    std::error_code error;
    const uintmax_t size = fs::file_size(ArchiveIn(item), error);
    bytes += error ? 0 : size;
  }
  Json::Value outbox = Json::objectValue;
  outbox["archives"] = static_cast<Json::UInt64>(items.size());
  outbox["bytes"] = bytes;
  return outbox;
}

bool PutIntoOutbox(const std::string& archive, int64_t started) {
  mkdir(kOutbox, 0700);
  const fs::path draft = fs::path(kOutbox) / ".draft";
  if (!CopyIn(archive, draft, FreePlace(started))) {
    syslog(LOG_ERR, "cannot put %s into %s: %m", archive.c_str(), kOutbox);
    std::error_code error;
    fs::remove_all(draft, error);
    return false;
  }
  unlink(archive.c_str());
  return true;
}

Json::Value SendOutbox(const Json::Value& /*request*/) {
  if (QUENDELIsEnable() == 0) {
    return Disabled();
  }
  Json::Value answer = Json::objectValue;
  answer["result"] = 0;
  const std::vector<fs::path> items = Items();
  if (!items.empty()) {
    const fs::path archive = ArchiveIn(items.front());
    const long started = strtol(items.front().filename().c_str(), nullptr, 10);
    answer["result"] = archive.empty() ? 0 : QUENDELSendCollectData(archive.c_str(), started);
    if (answer["result"] == 0) {
      std::error_code error;
      fs::remove_all(items.front(), error);
    }
  }
  answer["outbox"] = DescribeOutbox();
  return answer;
}

}  // namespace quendel_worker
