// Reads an archive with a reader that is not the tar that made it.
#ifndef TESTS_COLLECT_ARCHIVE_ENTRIES_H_
#define TESTS_COLLECT_ARCHIVE_ENTRIES_H_

#include <map>
#include <string>

namespace quendel::test {

// Returns the entries of a tar file inside xz by their names, with the contents of files. Anything
// else gives a test failure.
std::map<std::string, std::string> ArchiveEntries(const std::string& path);

}  // namespace quendel::test

#endif  // TESTS_COLLECT_ARCHIVE_ENTRIES_H_
