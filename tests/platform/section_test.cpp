// Sectioned key-value files.
#include <dirent.h>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "platform/containers.h"
#include "platform/error.h"
#include "platform/key_value.h"
#include "platform/owned.h"
#include "support/appliance.h"
#include "support/calls.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;

namespace {

using TextMap = std::map<std::string, std::string>;

constexpr char kDir[] = "/tmp/quendel";
constexpr char kPath[] = "/tmp/quendel/update.conf";

int Add(const std::string& section, const TextMap& pairs) {
  platform::OwnedHash hash(8);
  for (const auto& pair : pairs) {
    ALIBCSzHashSetValue(hash.slot(), pair.first.c_str(), pair.second.c_str());
  }
  mkdir(kDir, 0700);
  return ALIBCFileAddSection(kPath, section.c_str(), hash.get(), 0);
}

std::vector<std::string> Sections() {
  platform::OwnedList names(0);
  const int count = ALIBCFileEnumSection(kPath, names.slot());
  EXPECT_EQ(count, ALIBCSzListSize(names.get()));
  return Texts(names);
}

TextMap SectionOf(const std::string& name) {
  platform::OwnedHash hash(8);
  EXPECT_GT(ALIBCFileGetSection(kPath, name.c_str(), hash.slot()), 0) << name;
  return Pairs(hash);
}

bool HasSection(const std::string& name) {
  platform::OwnedHash hash(8);
  return ALIBCFileGetSection(kPath, name.c_str(), hash.slot()) > 0;
}

// Has files look as they do on a kernel with a tick of 4 ms and on a file system that gives the
// number of a file that is gone to the next one.
void MakeOld(struct stat& status) {
  constexpr long kTickNanoseconds = 4'000'000;
  status.st_mtim.tv_nsec -= status.st_mtim.tv_nsec % kTickNanoseconds;
  status.st_ctim.tv_nsec -= status.st_ctim.tv_nsec % kTickNanoseconds;
  status.st_ino = 12;
}

void BeOnAnOldSystem() {
  On("stat").InPlatform().Replace([](const char* path, struct stat* status) {
    const int result = stat(path, status);
    MakeOld(*status);
    return result;
  });
  On("fstat").InPlatform().Replace([](int fd, struct stat* status) {
    const int result = fstat(fd, status);
    MakeOld(*status);
    return result;
  });
}

const TextMap kState = {{"inode", "1835017"},
                        {"last_byte", "87"},
                        {"last_hash", "d41d8cd98f00b204e9800998ecf8427e"},
                        {"total_byte", "20480"}};

}  // namespace

TEST(FileAddSectionTest, CreatesTheFile) {
  EXPECT_GT(Add("/usr/arvo/etc/quendel/quendel.log.messages", kState), 0);
  EXPECT_EQ(ReadFile(kPath),
            "# pairs: 4\n"
            "[/usr/arvo/etc/quendel/quendel.log.messages]\n"
            "total_byte=20480\n"
            "last_hash=d41d8cd98f00b204e9800998ecf8427e\n"
            "last_byte=87\n"
            "inode=1835017\n");
}

TEST(FileAddSectionTest, AppendsToTheFile) {
  Add("a", {{"x", "1"}});
  Add("b", {{"y", "2"}});
  EXPECT_THAT(Sections(), ElementsAre("a", "b"));
  EXPECT_THAT(SectionOf("a"), ElementsAre(Pair("x", "1")));
  EXPECT_THAT(SectionOf("b"), ElementsAre(Pair("y", "2")));
}

TEST(FileAddSectionTest, AddsASectionWithoutPairs) {
  EXPECT_GT(Add("empty", {}), 0);
  Add("b", {{"y", "2"}});
  EXPECT_THAT(Sections(), ElementsAre("empty", "b"));
  EXPECT_THAT(SectionOf("empty"), IsEmpty());
}

TEST(FileAddSectionTest, ReadsBackEveryNameAndValue) {
  const TextMap pairs = {{"reset", "\"\""}, {"blank", " a "},   {"lines", "a\nb\r"},
                         {"json", "[{}]"},  {"quote", "\"a\""}, {"empty", ""}};
  for (const char* name : {"a]b", "[a]", "", " a ", "a=b", "# a", "\xC3\xA4", "a\r"}) {
    EXPECT_GT(Add(name, pairs), 0) << name;
    EXPECT_EQ(SectionOf(name), pairs) << name;
  }
  EXPECT_EQ(Sections().size(), 8U);
}

TEST(FileAddSectionTest, RefusesWhatCannotBeReadBack) {
  EXPECT_LT(Add("a\nb", {{"x", "1"}}), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
  EXPECT_LT(Add("a", {{"x=", "1"}}), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
  EXPECT_FALSE(Exists(kPath));
}

TEST(FileAddSectionTest, RefusesNullArguments) {
  platform::OwnedHash hash(8);
  EXPECT_LT(ALIBCFileAddSection(nullptr, "a", hash.get(), 0), 0);
  EXPECT_LT(ALIBCFileAddSection(kPath, nullptr, hash.get(), 0), 0);
  EXPECT_LT(ALIBCFileAddSection(kPath, "a", nullptr, 0), 0);
}

TEST(FileAddSectionTest, FailsInAMissingDirectory) {
  platform::OwnedHash hash(8);
  EXPECT_LT(ALIBCFileAddSection("/tmp/nowhere/update.conf", "a", hash.get(), 0), 0);
  EXPECT_EQ(errno, ENOENT);
}

TEST(FileAddSectionTest, FailsForADirectoryAndAFifoWithoutWaiting) {
  WriteFile("/tmp/quendel/other", "");
  mkdir(kPath, 0700);
  EXPECT_LT(Add("a", kState), 0);
  rmdir(kPath);
  mkfifo(kPath, 0600);
  EXPECT_LT(Add("a", kState), 0);
}

TEST(FileAddSectionTest, LeavesOnlyTheFileBehind) {
  Add("a", kState);
  DIR* const dir = opendir(kDir);
  int entries = 0;
  while (readdir(dir) != nullptr) {
    ++entries;
  }
  closedir(dir);
  EXPECT_EQ(entries, 3);  // ".", ".." and the file
}

TEST(FileAddSectionTest, TakesAPartBackOnAFullDisk) {
  mkdir(kDir, 0700);
  ASSERT_EQ(mount("small", kDir, "tmpfs", 0, "size=4k"), 0);
  ASSERT_GT(Add("a", {{"x", std::string(3000, 'x')}}), 0);
  const std::string before = ReadFile(kPath);
  EXPECT_LT(Add("b", {{"y", std::string(3000, 'y')}}), 0);
  EXPECT_EQ(errno, ENOSPC);
  EXPECT_EQ(ReadFile(kPath), before);
  EXPECT_THAT(Sections(), ElementsAre("a"));
}

TEST(FileAddSectionTest, SaysWhenAPartCannotBeTakenBack) {
  mkdir(kDir, 0700);
  ASSERT_EQ(mount("small", kDir, "tmpfs", 0, "size=4k"), 0);
  ASSERT_GT(Add("a", {{"x", std::string(3000, 'x')}}), 0);
  On("ftruncate").InPlatform().Nth(1).Return(-1, EROFS);
  EXPECT_LT(Add("b", {{"y", std::string(3000, 'y')}}), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(errno, EIO);
  EXPECT_THAT(Sections(), ElementsAre("a"));
}

TEST(FileAddSectionTest, FailsWithoutALock) {
  On("flock").InPlatform().Nth(1).Return(-1, ENOLCK);
  EXPECT_LT(Add("a", kState), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0500);
  EXPECT_FALSE(Exists(kPath));
}

TEST(FileAddSectionTest, KeepsTheSectionsOfManyProcessesWhole) {
  std::vector<pid_t> writers;
  for (int writer = 0; writer < 5; ++writer) {
    writers.push_back(fork());
    if (writers.back() == 0) {
      for (int i = 0; i < 40; ++i) {
        const std::string name = std::to_string(writer) + "_" + std::to_string(i);
        if (Add(name, {{"a", name}, {"b", std::string(200, 'b')}}) < 1) {
          _exit(1);
        }
      }
      _exit(0);
    }
  }
  for (const pid_t writer : writers) {
    int status = -1;
    waitpid(writer, &status, 0);
    EXPECT_EQ(status, 0);
  }
  const std::vector<std::string> names = Sections();
  EXPECT_EQ(names.size(), 200U);
  for (const std::string& name : names) {
    EXPECT_EQ(SectionOf(name), (TextMap{{"a", name}, {"b", std::string(200, 'b')}}));
  }
}

TEST(FileAddSectionTest, CutAnywhereIsNoSection) {
  Add("first", kState);
  const std::string first = ReadFile(kPath);
  Add("second", kState);
  const std::string whole = ReadFile(kPath);
  for (size_t size = first.size(); size < whole.size(); ++size) {
    WriteFile(kPath, whole.substr(0, size));
    ASSERT_THAT(Sections(), ElementsAre("first")) << size;
    ASSERT_FALSE(HasSection("second")) << size;
    // What is appended behind the rest makes no section of it.
    Add("third", {{"x", "1"}});
    ASSERT_THAT(Sections(), ElementsAre("first", "third")) << size;
    ASSERT_EQ(SectionOf("first"), kState) << size;
    ASSERT_EQ(SectionOf("third"), (TextMap{{"x", "1"}})) << size;
  }
  WriteFile(kPath, whole);
  EXPECT_THAT(Sections(), ElementsAre("first", "second"));
}

TEST(FileEnumSectionTest, ListsNamesInFileOrder) {
  WriteFile(kPath, "top=1\n[z]\na=1\n\n# note\n[a]\n[m]\nb=2\n");
  EXPECT_THAT(Sections(), ElementsAre("z", "a", "m"));
}

TEST(FileEnumSectionTest, ListsANameOnce) {
  WriteFile(kPath, "[a]\nx=1\n[b]\n[a]\ny=2\n");
  EXPECT_THAT(Sections(), ElementsAre("a", "b"));
}

TEST(FileEnumSectionTest, AppendsToWhatTheListHolds) {
  WriteFile(kPath, "[a]\n");
  platform::OwnedList names(0);
  ALIBCSzListPush(names.slot(), "before");
  EXPECT_EQ(ALIBCFileEnumSection(kPath, names.slot()), 1);
  EXPECT_THAT(Texts(names), ElementsAre("before", "a"));
}

TEST(FileEnumSectionTest, TakesAllBetweenTheOutermostBrackets) {
  WriteFile(kPath, "  [ a ] b] # note\r\n[no\nno]\n[]\nx=1\n");
  EXPECT_THAT(Sections(), ElementsAre(" a ] b", ""));
}

TEST(FileEnumSectionTest, FindsNoneInAFlatOrEmptyFile) {
  WriteFile(kPath, "a=1\nb=[2]\n");
  EXPECT_THAT(Sections(), IsEmpty());
  WriteFile(kPath, "");
  EXPECT_THAT(Sections(), IsEmpty());
}

TEST(FileEnumSectionTest, TakesNoSectionWhoseLastLineIsCut) {
  WriteFile(kPath, "[a]\nx=1\n[b]\ny=2");
  EXPECT_THAT(Sections(), ElementsAre("a"));
  WriteFile(kPath, "[a]\nx=1\n[b]");
  EXPECT_THAT(Sections(), ElementsAre("a"));
}

TEST(FileEnumSectionTest, TakesASectionThatHasMorePairsThanItsCount) {
  WriteFile(kPath, "# pairs: 1\n[a]\nx=1\ny=2\n");
  EXPECT_THAT(SectionOf("a"), ElementsAre(Pair("x", "1"), Pair("y", "2")));
}

TEST(FileEnumSectionTest, CountsOnlyForTheSectionRightBelow) {
  WriteFile(kPath, "# pairs: 9\n\n[a]\nx=1\n# pairs: 9\n[b]\ny=1\n[c]\n# pairs: x\n[d]\n");
  EXPECT_THAT(Sections(), ElementsAre("a", "c", "d"));
}

TEST(FileEnumSectionTest, FailsForWhatCannotBeRead) {
  platform::OwnedList names(0);
  EXPECT_LT(ALIBCFileEnumSection("/tmp/nowhere", names.slot()), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_LT(ALIBCFileEnumSection("/tmp", names.slot()), 0);
  EXPECT_LT(ALIBCFileEnumSection("/proc/self/mem", names.slot()), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0400);
  EXPECT_THAT(Texts(names), IsEmpty());
}

TEST(FileEnumSectionTest, RefusesNullArguments) {
  platform::OwnedList names(0);
  ALIBSZLIST* none = nullptr;
  WriteFile(kPath, "[a]\n");
  EXPECT_LT(ALIBCFileEnumSection(nullptr, names.slot()), 0);
  EXPECT_LT(ALIBCFileEnumSection(kPath, nullptr), 0);
  EXPECT_LT(ALIBCFileEnumSection(kPath, &none), 0);
}

TEST(FileGetSectionTest, LetsALaterSectionOfTheNameGoOverAnEarlierOne) {
  WriteFile(kPath, "[a]\nx=1\ny=1\n[b]\nx=9\n[a]\ny=2\n");
  EXPECT_THAT(SectionOf("a"), ElementsAre(Pair("x", "1"), Pair("y", "2")));
}

TEST(FileGetSectionTest, GoesOverWhatTheHashHolds) {
  WriteFile(kPath, "[a]\nx=1\n");
  platform::OwnedHash hash(8);
  ALIBCSzHashSetValue(hash.slot(), "x", "old");
  ALIBCSzHashSetValue(hash.slot(), "y", "kept");
  EXPECT_GT(ALIBCFileGetSection(kPath, "a", hash.slot()), 0);
  EXPECT_THAT(Pairs(hash), ElementsAre(Pair("x", "1"), Pair("y", "kept")));
}

TEST(FileGetSectionTest, FailsForAnAbsentSection) {
  WriteFile(kPath, "[a]\nx=1\n");
  EXPECT_FALSE(HasSection("b"));
  EXPECT_EQ(ALIBCErrGet(), 0x0303);
  EXPECT_FALSE(HasSection("x"));
}

TEST(FileGetSectionTest, FailsForWhatCannotBeRead) {
  platform::OwnedHash hash(8);
  EXPECT_LT(ALIBCFileGetSection("/tmp/nowhere", "a", hash.slot()), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_LT(ALIBCFileGetSection("/tmp", "a", hash.slot()), 0);
}

TEST(FileGetSectionTest, RefusesNullArguments) {
  platform::OwnedHash hash(8);
  ALIBSZHASH* none = nullptr;
  WriteFile(kPath, "[a]\n");
  EXPECT_LT(ALIBCFileGetSection(nullptr, "a", hash.slot()), 0);
  EXPECT_LT(ALIBCFileGetSection(kPath, nullptr, hash.slot()), 0);
  EXPECT_LT(ALIBCFileGetSection(kPath, "a", nullptr), 0);
  EXPECT_LT(ALIBCFileGetSection(kPath, "a", &none), 0);
}

TEST(FileGetSectionTest, SeesEveryChangeOfTheFile) {
  WriteFile(kPath, "[a]\nx=1\n[b]\n");
  EXPECT_EQ(SectionOf("a")["x"], "1");
  Add("c", {{"z", "3"}});
  EXPECT_EQ(SectionOf("c")["z"], "3");
  // The same length, in place.
  WriteFile(kPath, "[a]\nx=2\n[b]\n");
  EXPECT_EQ(SectionOf("a")["x"], "2");
  RemoveFile(kPath);
  EXPECT_FALSE(HasSection("a"));
  WriteFile("/tmp/quendel/other.conf", "[a]\nx=4\n[b]\n");
  platform::OwnedHash hash(8);
  EXPECT_GT(ALIBCFileGetSection("/tmp/quendel/other.conf", "a", hash.slot()), 0);
  EXPECT_EQ(Pairs(hash)["x"], "4");
}

TEST(FileGetSectionTest, NeverShowsAFileThatIsNoMore) {
  BeOnAnOldSystem();
  for (int round = 0; round < 500; ++round) {
    WriteFile(kPath, "[a]\nx=1\n[b]\n");
    EXPECT_EQ(SectionOf("a")["x"], "1");
    RemoveFile(kPath);
    WriteFile(kPath, "[a]\nx=2\n[b]\n");
    EXPECT_EQ(SectionOf("a")["x"], "2");
  }
}

TEST(FileGetSectionTest, SeesAChangeOfAFileThatItRemembers) {
  BeOnAnOldSystem();
  WriteFile(kPath, "[a]\nx=1\n[b]\n");
  std::this_thread::sleep_for(std::chrono::milliseconds(150));
  EXPECT_EQ(SectionOf("a")["x"], "1");
  WriteFile(kPath, "[a]\nx=2\n[b]\n");
  EXPECT_EQ(SectionOf("a")["x"], "2");
}

TEST(FileGetSectionTest, WalksThroughManySectionsInLinearTime) {
  // Half a minute, if each section cost reading the whole file.
  constexpr int kCount = 20000;
  std::string text;
  for (int i = 0; i < kCount; ++i) {
    text += "[/usr/arvo/etc/quendel/quendel.log." + std::to_string(i) + "]\n";
    text += "total_byte=20480\nlast_hash=d41d8cd98f00b204e9800998ecf8427e\nlast_byte=87\n";
  }
  WriteFile(kPath, text);
  const auto begin = std::chrono::steady_clock::now();
  const std::vector<std::string> names = Sections();
  ASSERT_EQ(names.size(), static_cast<size_t>(kCount));
  for (const std::string& name : names) {
    ASSERT_EQ(SectionOf(name).size(), 3U);
  }
  EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(10));
}
