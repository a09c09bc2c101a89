// Looks into archives that devices sent, which may hold anything. Nothing of them is written
// anywhere.
#include "archive_list.h"

#include <archive.h>
#include <archive_entry.h>
#include <sys/stat.h>

#include <memory>
#include <stdexcept>

#include "json.h"

namespace quendeldesk {
namespace {

constexpr size_t kBlock = 64UL * 1024;
constexpr long long kMostEntries = 20'000;
constexpr int64_t kMostBytes = 4LL * 1024 * 1024 * 1024;  // unpacked, while a list is made
constexpr size_t kMostPath = 4096;

struct FreeArchive {
  void operator()(archive* reader) const { archive_read_free(reader); }
};
using Reader = std::unique_ptr<archive, FreeArchive>;

// Debug archives are zip files; collections are tar files packed by xz; a dump is one file packed
// by xz, which libarchive shows as an archive of one entry.
Reader OpenArchive(int file) {
  Reader reader(archive_read_new());
  archive_read_support_filter_xz(reader.get());
  archive_read_support_filter_gzip(reader.get());
  archive_read_support_format_tar(reader.get());
  archive_read_support_format_zip(reader.get());
  archive_read_support_format_raw(reader.get());
  if (archive_read_open_fd(reader.get(), file, kBlock) != ARCHIVE_OK) {
    const char* why = archive_error_string(reader.get());
    throw std::runtime_error(why == nullptr ? "it is no archive" : why);
  }
  return reader;
}

const char* TypeOf(archive_entry* entry) {
  if (archive_entry_hardlink(entry) != nullptr) {
    return "link";
  }
  switch (archive_entry_filetype(entry)) {
    case AE_IFREG:
      return "file";
    case AE_IFDIR:
      return "folder";
    case AE_IFLNK:
      return "link";
    default:
      return "other";
  }
}

std::string PathOf(archive_entry* entry) {
  const char* path = archive_entry_pathname(entry);
  return path == nullptr ? "" : ValidUtf8(std::string(path).substr(0, kMostPath));
}

Json::Value ViewOf(archive_entry* entry, long long number) {
  Json::Value view;
  view["number"] = static_cast<Json::Int64>(number);
  view["path"] = PathOf(entry);
  view["type"] = TypeOf(entry);
  view["size"] = archive_entry_size_is_set(entry) != 0
                     ? Json::Value(static_cast<Json::Int64>(archive_entry_size(entry)))
                     : Json::Value();
  view["modified"] = static_cast<Json::Int64>(archive_entry_mtime(entry)) * 1000;
  return view;
}

// Steps over an entry's bytes. Returns how many there were.
int64_t SkipBytes(archive* reader, int64_t most) {
  int64_t bytes = 0;
  const void* block = nullptr;
  size_t size = 0;
  la_int64_t offset = 0;
  int result = ARCHIVE_OK;
  while (bytes <= most &&
         (result = archive_read_data_block(reader, &block, &size, &offset)) == ARCHIVE_OK) {
    bytes += static_cast<int64_t>(size);
  }
  if (result != ARCHIVE_OK && result != ARCHIVE_EOF) {
    throw std::runtime_error("the archive is damaged");
  }
  return bytes;
}

void ListEntries(archive* reader, Json::Value& entries) {
  int64_t left = kMostBytes;
  archive_entry* entry = nullptr;
  for (long long number = 0;; ++number) {
    const int result = archive_read_next_header(reader, &entry);
    if (result == ARCHIVE_EOF) {
      return;
    }
    if (result != ARCHIVE_OK && result != ARCHIVE_WARN) {
      throw std::runtime_error("the archive is damaged");
    }
    if (number >= kMostEntries) {
      throw std::runtime_error("the archive holds more entries than are looked at");
    }
    entries.append(ViewOf(entry, number));
    left -= SkipBytes(reader, left);
    if (left < 0) {
      throw std::runtime_error("the archive holds more bytes than are looked at");
    }
  }
}

}  // namespace

Json::Value ListArchive(Descriptor file) {
  Json::Value list;
  list["entries"] = Json::Value(Json::arrayValue);
  list["complete"] = true;
  try {
    ListEntries(OpenArchive(file.get()).get(), list["entries"]);
  } catch (const std::runtime_error& error) {
    list["complete"] = false;
    list["reason"] = error.what();
  }
  return list;
}

BodySource ReadArchiveEntry(Descriptor file, long long number) {
  const auto owner = std::make_shared<Descriptor>(std::move(file));
  const std::shared_ptr<archive> reader(OpenArchive(owner->get()).release(), FreeArchive());
  archive_entry* entry = nullptr;
  for (long long i = 0; i <= number; ++i) {
    const int result =
        i < kMostEntries ? archive_read_next_header(reader.get(), &entry) : ARCHIVE_EOF;
    if (result != ARCHIVE_OK && result != ARCHIVE_WARN) {
      throw std::out_of_range("the archive holds no such entry");
    }
  }
  if (std::string(TypeOf(entry)) != "file") {
    throw std::out_of_range("the entry is no file");
  }
  return [owner, reader](char* buffer, size_t size) {
    const la_ssize_t read = archive_read_data(reader.get(), buffer, size);
    if (read < 0) {
      throw std::runtime_error("the archive is damaged");
    }
    return static_cast<size_t>(read);
  };
}

}  // namespace quendeldesk
