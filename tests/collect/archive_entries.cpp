// Reads an archive with a reader that is not the tar that made it.
#include "collect/archive_entries.h"

#include <archive.h>
#include <archive_entry.h>
#include <gtest/gtest.h>

namespace quendel::test {

std::map<std::string, std::string> ArchiveEntries(const std::string& path) {
  std::map<std::string, std::string> entries;
  archive* reader = archive_read_new();
  archive_read_support_filter_xz(reader);
  archive_read_support_format_tar(reader);
  int result = archive_read_open_filename(reader, path.c_str(), 1 << 16);
  archive_entry* entry = nullptr;
  while (result == ARCHIVE_OK &&
         (result = archive_read_next_header(reader, &entry)) == ARCHIVE_OK) {
    std::string text(static_cast<size_t>(archive_entry_size(entry)), '\0');
    EXPECT_EQ(archive_read_data(reader, text.data(), text.size()),
              static_cast<la_ssize_t>(text.size()));
    EXPECT_TRUE(entries.emplace(archive_entry_pathname(entry), text).second);
  }
  EXPECT_EQ(result, ARCHIVE_EOF) << path << ": " << archive_error_string(reader);
  EXPECT_EQ(archive_filter_code(reader, 0), ARCHIVE_FILTER_XZ);
  archive_read_free(reader);
  return entries;
}

}  // namespace quendel::test
