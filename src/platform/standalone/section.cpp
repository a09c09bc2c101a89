// Sectioned key-value files.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <ctime>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/key_value.h"
#include "platform/standalone/container.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"
#include "platform/standalone/key_value_text.h"
#include "platform/standalone/replace_file.h"

namespace platform {
namespace {

constexpr mode_t kNewFileMode = 0644;

// Stands in front of the name of each section that is added, with the number of its pairs. It tells
// a whole section from one that a crash cut off behind any of its lines.
constexpr std::string_view kCountComment = "# pairs: ";

// Follows a last line that a crash cut short, so that the line end that it gets does not make it
// whole.
constexpr std::string_view kCutComment = "# cut short";

// Where the pairs of one whole section lie in a file's text.
struct Range {
  size_t begin;
  size_t end;
};

// The whole sections of one file, as they stood when this thread last read it. A commit asks for
// one section after the other: without this, each would cost reading the whole file.
//
// Only a file that had been left alone for some time is remembered. What happens to one within a
// tick of the clock that stamps it may not show in its status; such a file is read again each time,
// until the ticks have passed.
struct SectionIndex {
  struct stat status = {};
  bool settled = false;  // so that what comes shows in the status
  std::string text;
  std::vector<std::string> names;
  std::unordered_map<std::string, std::vector<Range>> ranges;
};

thread_local std::unique_ptr<SectionIndex> lastIndex;

// The section that a walk over the lines is in.
struct OpenSection {
  std::string_view name;
  size_t begin;
  size_t promised;  // number of pairs
  size_t pairs;
  bool whole;
};

size_t PromisedPairs(std::string_view line) {
  size_t promised = 0;
  if (line.substr(0, kCountComment.size()) == kCountComment) {
    std::from_chars(line.data() + kCountComment.size(), line.data() + line.size(), promised);
  }
  return promised;
}

void CloseSection(SectionIndex& index, const OpenSection& section, size_t end) {
  if (!section.whole || section.pairs < section.promised) {
    return;
  }
  std::vector<Range>& ranges = index.ranges[std::string(section.name)];
  if (ranges.empty()) {
    index.names.emplace_back(section.name);
  }
  ranges.push_back({section.begin, end});
}

// Tells whether a line is one of the two that a section begins with, its count and its name. Where
// such a line is cut short, the section that was to begin is lost, and the one above is whole.
bool IsLead(std::string_view line) {
  return !line.empty() && (line.front() == '#' || line.front() == '[');
}

// What is in front of the first section belongs to none.
void IndexSections(SectionIndex& index) {
  OpenSection section = {};
  size_t promised = 0;
  Lines lines(index.text);
  Line line;
  WrittenPair pair;
  std::string_view name;
  bool isBelowLead = false;
  while (lines.Next(line)) {
    if (ParseSectionName(line.text, name)) {
      CloseSection(index, section, line.begin);
      section = {name, line.end, promised, 0, line.complete};
    }
    section.pairs += ParsePair(line.text, pair) ? 1 : 0;
    const bool isCut =
        line.complete ? line.text == kCutComment && !isBelowLead : !IsLead(line.text);
    section.whole = section.whole && !isCut;
    promised = PromisedPairs(line.text);
    isBelowLead = IsLead(line.text);
  }
  CloseSection(index, section, index.text.size());
}

bool IsSameMoment(const struct timespec& a, const struct timespec& b) {
  return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

bool IsUnchanged(const struct stat& a, const struct stat& b) {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino && a.st_size == b.st_size &&
         IsSameMoment(a.st_mtim, b.st_mtim) && IsSameMoment(a.st_ctim, b.st_ctim);
}

// The longest tick of a kernel's clock is 10 ms.
bool IsSettled(const struct stat& status) {
  constexpr int64_t kSettledNanoseconds = 100'000'000;
  struct timespec now;
  clock_gettime(CLOCK_REALTIME, &now);
  const int64_t age = (now.tv_sec - status.st_ctim.tv_sec) * int64_t{1'000'000'000} +
                      (now.tv_nsec - status.st_ctim.tv_nsec);
  // A change that is still to come cannot get a time that is passed, nor one that the clock has
  // been set back from.
  return age < 0 || age >= kSettledNanoseconds;
}

bool IsIndexed(const char* path) {
  struct stat status;
  return lastIndex && lastIndex->settled && stat(path, &status) == 0 &&
         IsUnchanged(lastIndex->status, status);
}

// Returns the index of a file, or null with the last error set when the file cannot be read.
const SectionIndex* IndexOf(const char* path) {
  if (IsIndexed(path)) {
    return lastIndex.get();
  }
  lastIndex.reset();
  auto index = std::make_unique<SectionIndex>();
  const OwnedFd file = OpenForReading(path, index->status);
  index->settled = file && IsSettled(index->status);
  if (!file || !ReadToEnd(file.get(), index->status.st_size, index->text)) {
    return nullptr;
  }
  IndexSections(*index);
  lastIndex = std::move(index);
  return lastIndex.get();
}

void ReadPairs(std::string_view text, ALIBSZHASH& hash) {
  Lines lines(text);
  Line line;
  WrittenPair pair;
  while (lines.Next(line)) {
    if (ParsePair(line.text, pair)) {
      hash.pairs[std::string(pair.key)] = DecodeValue(pair.value);
    }
  }
}

// Returns an empty text when one of the keys cannot be written.
std::string SectionText(const char* name, const ALIBSZHASH& hash) {
  std::string text(kCountComment);
  text += std::to_string(hash.pairs.size()) + "\n[" + name + "]\n";
  for (const std::string& key : SortedKeys(hash)) {
    if (!IsWritableKey(key)) {
      return std::string();
    }
    text += key + '=' + EncodeValue(hash.pairs.at(key)) + '\n';
  }
  return text;
}

bool EndsInsideLine(int fd, off_t size) {
  char last = '\n';
  return size > 0 && pread(fd, &last, 1, size - 1) == 1 && last != '\n';
}

bool AppendByOneWrite(int fd, off_t oldSize, const std::string& text) {
  ssize_t written;
  do {
    written = write(fd, text.data(), text.size());
  } while (written < 0 && errno == EINTR);
  if (written == static_cast<ssize_t>(text.size())) {
    return true;
  }
  // A full disk took a part. What cannot be taken back is no section to a reader.
  const int reason = written < 0 ? errno : ENOSPC;
  const bool isTakenBack = written < 1 || ftruncate(fd, oldSize) == 0;
  errno = isTakenBack ? reason : EIO;
  return false;
}

int AppendLocked(const char* path, const std::string& text) {
  constexpr int kFlags = O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
  const OwnedFd file(open(path, kFlags, kNewFileMode));
  struct stat status;
  if (!file || fstat(file.get(), &status) != 0) {
    return Fail(kErrorWriteFailed);
  }
  if (!S_ISREG(status.st_mode)) {
    errno = EINVAL;
    return Fail(kErrorNotRegular);
  }
  std::string lead;
  if (EndsInsideLine(file.get(), status.st_size)) {
    lead.append("\n").append(kCutComment).append("\n");
  }
  return AppendByOneWrite(file.get(), status.st_size, lead + text) ? 0 : Fail(kErrorWriteFailed);
}

}  // namespace
}  // namespace platform

int ALIBCFileAddSection(const char* path, const char* section, ALIBSZHASH* hash,
                        int /*flags*/) try {
  if (path == nullptr || section == nullptr || hash == nullptr ||
      strchr(section, '\n') != nullptr) {
    return platform::FailForArgument();
  }
  const std::string text = platform::SectionText(section, *hash);
  if (text.empty()) {
    return platform::FailForArgument();
  }
  const platform::FileLock lock(path);
  return lock && platform::AppendLocked(path, text) == 0 ? 1 : -1;
} catch (...) {
  return platform::FailForException();
}

int ALIBCFileEnumSection(const char* path, ALIBSZLIST** sections) try {
  if (path == nullptr || sections == nullptr || *sections == nullptr) {
    return platform::FailForArgument();
  }
  const platform::SectionIndex* const index = platform::IndexOf(path);
  if (index == nullptr) {
    return -1;
  }
  std::vector<std::string>& texts = (*sections)->texts;
  texts.insert(texts.end(), index->names.begin(), index->names.end());
  return static_cast<int>(index->names.size());
} catch (...) {
  return platform::FailForException();
}

int ALIBCFileGetSection(const char* path, const char* section, ALIBSZHASH** hash) try {
  if (path == nullptr || section == nullptr || hash == nullptr || *hash == nullptr) {
    return platform::FailForArgument();
  }
  const platform::SectionIndex* const index = platform::IndexOf(path);
  if (index == nullptr) {
    return -1;
  }
  const auto found = index->ranges.find(section);
  if (found == index->ranges.end()) {
    errno = ENOENT;
    return platform::Fail(platform::kErrorSectionNotFound);
  }
  for (const platform::Range& range : found->second) {
    const std::string_view text = index->text;
    platform::ReadPairs(text.substr(range.begin, range.end - range.begin), **hash);
  }
  if (index->names.back() == section) {
    platform::lastIndex.reset();  // the walk is over
  }
  return 1;
} catch (...) {
  return platform::FailForException();
}
