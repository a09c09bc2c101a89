// Key-value files: what a file's text means, and what is read of it.
#include "platform/key_value.h"

#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <string>

#include "platform/containers.h"
#include "platform/error.h"
#include "platform/owned.h"
#include "support/appliance.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;

namespace {

constexpr char kPath[] = "/tmp/test.conf";
constexpr char kUntouched[] = "untouched";

// What one read of a key gave.
struct Read {
  int result;
  std::string text;
};

bool operator==(const Read& a, const Read& b) {
  return a.result == b.result && a.text == b.text;
}

void PrintTo(const Read& read, std::ostream* out) {
  *out << read.result << " \"" << read.text.substr(0, 100) << '"';
}

Read ReadKey(const char* path, const char* key) {
  static char buf[20 * 1024 * 1024];
  strcpy(buf, kUntouched);
  const int result = ALIBCFileGetKeyValue(path, key, buf, sizeof(buf), 0);
  return {result, buf};
}

// Reads "key" of a file that holds this text.
Read ReadFrom(const std::string& text) {
  WriteFile(kPath, text);
  return ReadKey(kPath, "key");
}

Read Found(const std::string& value) {
  return {static_cast<int>(value.size()), value};
}

const Read kMissing = {0, kUntouched};

}  // namespace

TEST(FileGetKeyValueTest, ReadsARawValue) {
  EXPECT_EQ(ReadFrom("key=value\n"), Found("value"));
}

TEST(FileGetKeyValueTest, TakesJsonAsItStands) {
  EXPECT_EQ(ReadFrom("key=[{\"name\":\"A\"}]\n"), Found("[{\"name\":\"A\"}]"));
}

TEST(FileGetKeyValueTest, TakesEqualsSignsInsideAValue) {
  EXPECT_EQ(ReadFrom("key=a=b==\n"), Found("a=b=="));
}

TEST(FileGetKeyValueTest, TrimsBlanksAroundKeyAndValue) {
  EXPECT_EQ(ReadFrom(" \t key\t =\t a  b \t\n"), Found("a  b"));
}

TEST(FileGetKeyValueTest, TakesCarriageReturnForPartOfTheLineEnd) {
  EXPECT_EQ(ReadFrom("other=1\r\nkey=value\r\n"), Found("value"));
  EXPECT_EQ(ReadFrom("key=a\rb\r\r\n"), Found("a\rb\r"));
}

TEST(FileGetKeyValueTest, ReadsALastLineWithoutLineEnd) {
  EXPECT_EQ(ReadFrom("other=1\nkey=value"), Found("value"));
  EXPECT_EQ(ReadFrom("key=value\r"), Found("value"));
}

TEST(FileGetKeyValueTest, LetsTheLastLineWin) {
  EXPECT_EQ(ReadFrom("key=first\nkey=second\nother=x\nkey=last\n"), Found("last"));
}

TEST(FileGetKeyValueTest, IgnoresCommentsAndLinesThatAreNoPairs) {
  EXPECT_EQ(ReadFrom("#key=a\n ;key=b\n[key=c]\nkey\n=d\n\n   \n"), kMissing);
}

TEST(FileGetKeyValueTest, ComparesTheWholeKey) {
  EXPECT_EQ(ReadFrom("keys=a\nke=b\nKey=c\nmy key=d\n"), kMissing);
}

TEST(FileGetKeyValueTest, SeesThroughSections) {
  EXPECT_EQ(ReadFrom("[section]\nkey=value\n"), Found("value"));
}

TEST(FileGetKeyValueTest, DecodesAQuotedValue) {
  EXPECT_EQ(ReadFrom("key=\" a\\\"b\\\\c\\nd\\re\\tf \"\n"), Found(" a\"b\\c\nd\re\tf "));
}

TEST(FileGetKeyValueTest, KeepsUnknownEscapes) {
  EXPECT_EQ(ReadFrom("key=\"a\\xb\"\n"), Found("a\\xb"));
  EXPECT_EQ(ReadFrom("key=\"a\\\"\n"), Found("a\\"));
}

TEST(FileGetKeyValueTest, DecodesNothingInARawValue) {
  EXPECT_EQ(ReadFrom("key=a\\nb\n"), Found("a\\nb"));
  EXPECT_EQ(ReadFrom("key=\"a\" b\n"), Found("\"a\" b"));
}

TEST(FileGetKeyValueTest, ReadsTwoQuotesAsTwoCharacters) {
  EXPECT_EQ(ReadFrom("key=\"\"\n"), Found("\"\""));
}

TEST(FileGetKeyValueTest, ReadsSingleAndTripleQuotes) {
  EXPECT_EQ(ReadFrom("key=\"\n"), Found("\""));
  EXPECT_EQ(ReadFrom("key=\"\"\"\n"), Found("\""));
}

TEST(FileGetKeyValueTest, TellsAnEmptyValueFromAMissingKey) {
  EXPECT_EQ(ReadFrom("key=\n"), Found(""));
  EXPECT_EQ(ALIBCErrGet(), 0x0302);
  EXPECT_EQ(ReadFrom("other=1\n"), kMissing);
  EXPECT_EQ(ALIBCErrGet(), 0x0301);
}

TEST(FileGetKeyValueTest, ReadsAnEmptyFile) {
  EXPECT_EQ(ReadFrom(""), kMissing);
}

TEST(FileGetKeyValueTest, KeepsBytesOfAnyEncoding) {
  std::string value;
  for (int byte = 1; byte < 256; ++byte) {
    if (byte != '\n') {
      value += static_cast<char>(byte);
    }
  }
  EXPECT_EQ(ReadFrom("key=<" + value + ">\n"), Found("<" + value + ">"));
}

TEST(FileGetKeyValueTest, EndsAValueAtItsFirstNul) {
  EXPECT_EQ(ReadFrom(std::string("key=ab\0cd\nother=1\n", 18)), Found("ab"));
}

TEST(FileGetKeyValueTest, TakesNoKeyWithANul) {
  EXPECT_EQ(ReadFrom(std::string("key\0=ab\n", 8)), kMissing);
  EXPECT_EQ(ReadFrom(std::string("\0\0\0\nkey=v\n", 10)), Found("v"));
}

TEST(FileGetKeyValueTest, CutsTheTextAndTellsTheWholeLength) {
  WriteFile(kPath, "key=0123456789\n");
  char buf[] = "________";
  EXPECT_EQ(ALIBCFileGetKeyValue(kPath, "key", buf, 5, 0), 10);
  EXPECT_EQ(std::string(buf, 8), std::string("0123\0___", 8));
}

TEST(FileGetKeyValueTest, WritesNothingIntoNoRoom) {
  WriteFile(kPath, "key=value\n");
  char buf[] = "____";
  EXPECT_EQ(ALIBCFileGetKeyValue(kPath, "key", buf, 0, 0), 5);
  EXPECT_EQ(ALIBCFileGetKeyValue(kPath, "key", buf, -1, 0), 5);
  EXPECT_STREQ(buf, "____");
  EXPECT_EQ(ALIBCFileGetKeyValue(kPath, "key", buf, 1, 0), 5);
  EXPECT_EQ(std::string(buf, 4), std::string("\0___", 4));
}

TEST(FileGetKeyValueTest, ReadsALineOfTenMegabytes) {
  const std::string value(10 * 1024 * 1024, 'v');
  EXPECT_EQ(ReadFrom("a=1\nkey=" + value + "\nb=2\n"), Found(value));
  EXPECT_EQ(ReadKey(kPath, "b"), Found("2"));
}

TEST(FileGetKeyValueTest, FailsForAMissingFile) {
  EXPECT_EQ(ReadKey("/tmp/nowhere", "key"), (Read{-1, kUntouched}));
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_EQ(errno, ENOENT);
  WriteFile(kPath, "");
  EXPECT_EQ(ReadKey("/tmp/test.conf/below", "key"), (Read{-1, kUntouched}));
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
}

TEST(FileGetKeyValueTest, FailsForADirectory) {
  EXPECT_EQ(ReadKey("/tmp", "key"), (Read{-1, kUntouched}));
  EXPECT_EQ(ALIBCErrGet(), 0x0401);
  EXPECT_EQ(errno, EISDIR);
}

TEST(FileGetKeyValueTest, FailsForALoopOfLinks) {
  ASSERT_EQ(symlink(kPath, kPath), 0);
  EXPECT_EQ(ReadKey(kPath, "key"), (Read{-1, kUntouched}));
  EXPECT_EQ(ALIBCErrGet(), 0x0400);
  EXPECT_EQ(errno, ELOOP);
}

TEST(FileGetKeyValueTest, FailsForAFifoWithoutWaiting) {
  ASSERT_EQ(mkfifo(kPath, 0600), 0);
  EXPECT_EQ(ReadKey(kPath, "key"), (Read{-1, kUntouched}));
  EXPECT_EQ(ALIBCErrGet(), 0x0401);
}

TEST(FileGetKeyValueTest, FailsWhenAReadFails) {
  // The memory of a process has nothing at address 0.
  EXPECT_EQ(ReadKey("/proc/self/mem", "key"), (Read{-1, kUntouched}));
  EXPECT_EQ(ALIBCErrGet(), 0x0400);
  EXPECT_EQ(errno, EIO);
}

TEST(FileGetKeyValueTest, RefusesNullArguments) {
  char buf[4];
  EXPECT_EQ(ALIBCFileGetKeyValue(nullptr, "key", buf, 4, 0), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
  EXPECT_EQ(errno, EINVAL);
  WriteFile(kPath, "key=v\n");
  EXPECT_EQ(ALIBCFileGetKeyValue(kPath, nullptr, buf, 4, 0), -1);
  EXPECT_EQ(ALIBCFileGetKeyValue(kPath, "key", nullptr, 4, 0), -1);
}

TEST(FileGetPairTest, ReadsEveryPair) {
  WriteFile(kPath, "a=1\n# comment\nb = \" 2\"\n\nc=\"\"\nno pair\nd=\n");
  platform::OwnedHash hash(8);
  EXPECT_EQ(ALIBCFileGetPair(kPath, hash.slot()), 4);
  EXPECT_THAT(Pairs(hash),
              ElementsAre(Pair("a", "1"), Pair("b", " 2"), Pair("c", "\"\""), Pair("d", "")));
}

TEST(FileGetPairTest, TakesNoCommentNorAnyOtherLineForAPair) {
  WriteFile(kPath, "#a=1\n ;b=2\n\t[c=3]\n =4\n==5\nd\n" + std::string("e\0=6\n", 5) + "f=7\n");
  platform::OwnedHash hash(8);
  EXPECT_EQ(ALIBCFileGetPair(kPath, hash.slot()), 1);
  EXPECT_THAT(Pairs(hash), ElementsAre(Pair("f", "7")));
}

TEST(FileGetPairTest, ReadsAFileThatTellsNoSize) {
  // The kernel's list of mounts comes in pieces of a page.
  constexpr int kMounts = 200;
  for (int i = 0; i < kMounts; ++i) {
    const std::string path = "/tmp/mount" + std::to_string(i);
    mkdir(path.c_str(), 0700);
    ASSERT_EQ(mount(path.c_str(), path.c_str(), "tmpfs", 0, "size=4k"), 0);
  }
  platform::OwnedHash hash(8);
  EXPECT_GE(ALIBCFileGetPair("/proc/self/mountinfo", hash.slot()), kMounts);
}

TEST(FileGetPairTest, LetsTheLastLineWin) {
  WriteFile(kPath, "a=1\na=2\n");
  platform::OwnedHash hash(8);
  EXPECT_GT(ALIBCFileGetPair(kPath, hash.slot()), 0);
  EXPECT_THAT(Pairs(hash), ElementsAre(Pair("a", "2")));
}

TEST(FileGetPairTest, GoesOverWhatTheHashHolds) {
  WriteFile(kPath, "a=new\n");
  platform::OwnedHash hash(8);
  ALIBCSzHashSetValue(hash.slot(), "a", "old");
  ALIBCSzHashSetValue(hash.slot(), "b", "kept");
  EXPECT_EQ(ALIBCFileGetPair(kPath, hash.slot()), 1);
  EXPECT_THAT(Pairs(hash), ElementsAre(Pair("a", "new"), Pair("b", "kept")));
}

TEST(FileGetPairTest, ReadsAnEmptyFile) {
  WriteFile(kPath, "");
  platform::OwnedHash hash(8);
  EXPECT_EQ(ALIBCFileGetPair(kPath, hash.slot()), 0);
  EXPECT_THAT(Pairs(hash), IsEmpty());
}

TEST(FileGetPairTest, FailsForWhatCannotBeRead) {
  platform::OwnedHash hash(8);
  EXPECT_LT(ALIBCFileGetPair("/tmp/nowhere", hash.slot()), 0);
  EXPECT_LT(ALIBCFileGetPair("/tmp", hash.slot()), 0);
  EXPECT_LT(ALIBCFileGetPair("/proc/self/mem", hash.slot()), 0);
  EXPECT_THAT(Pairs(hash), IsEmpty());
}

TEST(FileGetPairTest, RefusesNullArguments) {
  platform::OwnedHash hash(8);
  ALIBSZHASH* none = nullptr;
  WriteFile(kPath, "a=1\n");
  EXPECT_LT(ALIBCFileGetPair(nullptr, hash.slot()), 0);
  EXPECT_LT(ALIBCFileGetPair(kPath, nullptr), 0);
  EXPECT_LT(ALIBCFileGetPair(kPath, &none), 0);
}
