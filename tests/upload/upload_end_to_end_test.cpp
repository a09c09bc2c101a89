// A real dump of a real crash and a real debug archive, from the server's request to what the
// server can do with them.
#include <archive.h>
#include <archive_entry.h>
#include <elf.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <cstring>

#include "quendel.h"
#include "support/appliance.h"
#include "support/json.h"
#include "support/log.h"
#include "support/multipart.h"
#include "support/server.h"

using namespace quendel::test;
using testing::Contains;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Key;
using testing::SizeIs;

namespace {

constexpr char kDump[] = "/var/crash/@crashing.core";
constexpr char kDebugger[] = "/usr/bin/gdb";

// Runs a shell's command line and returns what it prints.
std::string Output(const std::string& command) {
  std::string output;
  FILE* stream = popen((command + " 2>&1").c_str(), "r");
  for (int c = getc(stream); c != EOF; c = getc(stream)) {
    output += static_cast<char>(c);
  }
  EXPECT_EQ(pclose(stream), 0) << command << ": " << output;
  return output;
}

// Lets a program crash, and a debugger write the dump of it. What the system itself does with dumps
// is the same for the whole machine, so a test must not depend on it, nor change it.
void Crash() {
  Output(std::string(kDebugger) + " -nx -batch -ex 'set startup-with-shell off' -ex run" +
         " -ex 'generate-core-file " + kDump + "' --args " CRASHING_PROGRAM " found-me");
}

bool IsCoreDump(const std::string& text) {
  Elf64_Ehdr header = {};
  memcpy(&header, text.data(), std::min(text.size(), sizeof header));
  return memcmp(header.e_ident, ELFMAG, SELFMAG) == 0 && header.e_type == ET_CORE;
}

std::map<std::string, std::string> ZipEntries(const std::string& zip) {
  std::map<std::string, std::string> entries;
  archive* reader = archive_read_new();
  archive_read_support_format_zip(reader);
  int result = archive_read_open_memory(reader, zip.data(), zip.size());
  archive_entry* entry = nullptr;
  while (result == ARCHIVE_OK &&
         (result = archive_read_next_header(reader, &entry)) == ARCHIVE_OK) {
    std::string text(static_cast<size_t>(archive_entry_size(entry)), '\0');
    EXPECT_EQ(archive_read_data(reader, text.data(), text.size()),
              static_cast<la_ssize_t>(text.size()));
    EXPECT_TRUE(entries.emplace(archive_entry_pathname(entry), text).second);
  }
  EXPECT_EQ(result, ARCHIVE_EOF) << archive_error_string(reader);
  archive_read_free(reader);
  return entries;
}

}  // namespace

TEST(UploadEndToEndTest, CrashDumpArrivesAndCanBeExamined) {
  if (access(kDebugger, X_OK) != 0) {
    GTEST_SKIP() << "no crash dump can be made: the package gdb is not installed";
  }
  SetIdentity();
  Crash();
  const std::string dump = ReadFile(kDump);
  ASSERT_TRUE(IsCoreDump(dump));

  EXPECT_EQ(QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN, JsonOf(R"([{"file_type":"coredump",
      "file_path":"/var/crash/@crashing.core","file_uuid":"u1"}])")),
            0);
  EXPECT_THAT(Log(), IsEmpty());
  ASSERT_THAT(Requests(), SizeIs(1));
  const std::vector<Part> parts = Parts(Requests()[0]);
  ASSERT_THAT(parts, SizeIs(2));
  WriteFile("/tmp/received.core.xz", parts[0].body);
  Output("/usr/bin/xz -d /tmp/received.core.xz");
  EXPECT_EQ(ReadFile("/tmp/received.core"), dump);
  const std::string crash =
      Output(std::string(kDebugger) +
             " -nx -batch -ex bt -ex 'up' -ex 'print first.label' " CRASHING_PROGRAM
             " /tmp/received.core");
  EXPECT_THAT(crash, HasSubstr("ValueOf"));
  EXPECT_THAT(crash, HasSubstr("\"found-me\""));

  EXPECT_EQ(ReadFile(kDump), dump);
  EXPECT_EQ(Output("ls -A /var/crash /tmp/quendel"),
            "/tmp/quendel:\n\n/var/crash:\n@crashing.core\n@demo\n");
}

TEST(UploadEndToEndTest, DebugArchiveArrivesAndCanBeOpened) {
  SetIdentity();
  EXPECT_EQ(QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN,
                              JsonOf(R"([{"file_type":"debug.dat","file_uuid":"u2"}])")),
            0);
  EXPECT_THAT(Log(), IsEmpty());
  ASSERT_THAT(Requests(), SizeIs(1));
  const std::vector<Part> parts = Parts(Requests()[0]);
  ASSERT_THAT(parts, SizeIs(2));
  const std::map<std::string, std::string> entries = ZipEntries(parts[0].body);
  const std::string folder = "tmp/quendel/debugdat/";
  ASSERT_THAT(entries, Contains(Key(folder + "version.txt")));
  EXPECT_EQ(entries.at(folder + "version.txt"), ReadFile("/etc.defaults/VERSION"));
  ASSERT_THAT(entries, Contains(Key(folder + "processes.txt")));
  EXPECT_THAT(entries.at(folder + "processes.txt"), HasSubstr(std::to_string(getpid()) + "\t"));
  EXPECT_THAT(entries, SizeIs(testing::Gt(10U)));
  EXPECT_EQ(ReadFile("/tmp/quendel/debugdat.zip"), parts[0].body);
}

// The archive of the last time stays, and the next one takes its place.
TEST(UploadEndToEndTest, DebugArchiveIsMadeAnew) {
  SetIdentity();
  const Json::Value request = JsonOf(R"([{"file_type":"debug.dat"}])");
  EXPECT_EQ(QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN, request), 0);
  WriteFile("/etc.defaults/VERSION", "majorversion=\"4\"\n");
  EXPECT_EQ(QUENDELUploadFile(18, QUENDEL_ACT_PROGRESS_RUN, request), 0);
  ASSERT_THAT(Requests(), SizeIs(2));
  const std::map<std::string, std::string> entries = ZipEntries(Parts(Requests()[1])[0].body);
  EXPECT_EQ(entries.at("tmp/quendel/debugdat/version.txt"), "majorversion=\"4\"\n");
}
