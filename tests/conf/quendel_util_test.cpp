// File helpers, MD5 and hexadecimal text.
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <array>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

std::string Md5(const std::string& text) {
  std::array<char, 34> out;
  out.fill('#');
  QUENDELMD5String(text, out.data());
  EXPECT_EQ(out[32], '\0');
  EXPECT_EQ(out[33], '#') << "written behind the NUL";
  return out.data();
}

std::string Hex(const std::string& bytes, int len) {
  std::string out = "what was there";
  QUENDELBytesToHex(out, reinterpret_cast<const unsigned char*>(bytes.data()), len);
  return out;
}

// What is written over eight bytes of 0xee.
std::string Bytes(const std::string& hex, int maxlen) {
  std::string out(8, '\xee');
  QUENDELHexToBytes(hex, reinterpret_cast<unsigned char*>(out.data()), maxlen);
  const size_t rest = out.find_last_not_of('\xee') + 1;
  return out.substr(0, rest);
}

}  // namespace

TEST(FileCopyTest, CopiesAFile) {
  const std::string bytes("a\0b\n", 4);
  WriteFile("/tmp/from", bytes);
  EXPECT_EQ(QUENDELFileCopy("/tmp/from", "/tmp/to"), 0);
  EXPECT_EQ(ReadFile("/tmp/to"), bytes);
}

TEST(FileCopyTest, SetsTwoFlagsOfThePlatformsOptions) {
  Record("ARVOFileCopy");
  QUENDELFileCopy("/tmp/from", "/tmp/to");
  EXPECT_THAT(Recorded(), ElementsAre("/tmp/from|/tmp/to|1,0,1,0,0,0,0,0,0,0,0,0,0,0,0,0,0,0,0,0"));
}

TEST(FileCopyTest, PassesThePlatformsAnswerOnInSilence) {
  On("ARVOFileCopy").Nth(1).Return(-42);
  EXPECT_EQ(QUENDELFileCopy("/tmp/from", "/tmp/to"), -42);
  On("ARVOFileCopy").Nth(1).Return(7);
  EXPECT_EQ(QUENDELFileCopy("/tmp/from", "/tmp/to"), 7);
  EXPECT_LT(QUENDELFileCopy("/tmp/missing", "/tmp/to"), 0);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(RecursiveMkdirTest, RunsTheToolWithThePathBeforeTheMode) {
  Record("ALIBCExec");
  EXPECT_EQ(QUENDELRecursiveMkdir("/tmp/a/b", 0700), 0);
  EXPECT_THAT(Recorded(), ElementsAre("/bin/mkdir|-p|/tmp/a/b|-m|700"));
  EXPECT_EQ(ModeOf("/tmp/a/b"), S_IFDIR | 0700u);
}

TEST(RecursiveMkdirTest, WritesTheModeInOctalWithoutALeadingZero) {
  Record("ALIBCExec");
  On("ALIBCExec").Return(0);
  QUENDELRecursiveMkdir("/x", 0755);
  QUENDELRecursiveMkdir("/x", 01777);
  QUENDELRecursiveMkdir("/x", 0);
  QUENDELRecursiveMkdir("/x", 0123456712);  // cut to seven digits
  EXPECT_THAT(Recorded(), ElementsAre("/bin/mkdir|-p|/x|-m|755", "/bin/mkdir|-p|/x|-m|1777",
                                      "/bin/mkdir|-p|/x|-m|0", "/bin/mkdir|-p|/x|-m|1234567"));
}

TEST(RecursiveMkdirTest, RunsNothingForTheCurrentDirectoryAndTheRoot) {
  EXPECT_EQ(QUENDELRecursiveMkdir(".", 0755), 0);
  EXPECT_EQ(QUENDELRecursiveMkdir("/", 0755), 0);
  EXPECT_EQ(Calls("ALIBCExec"), 0);
}

TEST(RecursiveMkdirTest, PassesOnOtherSpellingsOfThem) {
  Record("ALIBCExec");
  On("ALIBCExec").Return(0);
  QUENDELRecursiveMkdir("./", 0755);
  QUENDELRecursiveMkdir("//", 0755);
  EXPECT_THAT(Recorded(), ElementsAre("/bin/mkdir|-p|./|-m|755", "/bin/mkdir|-p|//|-m|755"));
}

TEST(RecursiveMkdirTest, FailsOnlyWhenTheToolCannotBeRun) {
  On("ALIBCExec").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELRecursiveMkdir("/tmp/a", 0755), -1);
  EXPECT_FALSE(Exists("/tmp/a"));
  WriteFile("/tmp/file", "");
  EXPECT_EQ(QUENDELRecursiveMkdir("/tmp/file/below", 0755), 0);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(RecursiveMkdirTest, TakesOnlyMinusOneForAToolThatCannotBeRun) {
  On("ALIBCExec").Nth(1).Return(-2);
  EXPECT_EQ(QUENDELRecursiveMkdir("/tmp/a", 0755), 0);
}

TEST(RecursiveRmdirTest, RemovesATreeWithTheTool) {
  WriteFile("/tmp/a/b/c", "");
  Record("ALIBCExec");
  EXPECT_EQ(QUENDELRecursiveRmdir("/tmp/a"), 0);
  EXPECT_THAT(Recorded(), ElementsAre("/bin/rm|-f|-r|/tmp/a"));
  EXPECT_FALSE(Exists("/tmp/a"));
}

TEST(RecursiveRmdirTest, RemovesAFileToo) {
  WriteFile("/tmp/file", "");
  EXPECT_EQ(QUENDELRecursiveRmdir("/tmp/file"), 0);
  EXPECT_FALSE(Exists("/tmp/file"));
}

TEST(RecursiveRmdirTest, RunsNothingForTheCurrentDirectoryAndTheRoot) {
  EXPECT_EQ(QUENDELRecursiveRmdir("."), 0);
  EXPECT_EQ(QUENDELRecursiveRmdir("/"), 0);
  EXPECT_EQ(Calls("ALIBCExec"), 0);
}

TEST(RecursiveRmdirTest, PassesOnOtherSpellingsOfThem) {
  Record("ALIBCExec");
  On("ALIBCExec").Return(0);
  QUENDELRecursiveRmdir("./");
  QUENDELRecursiveRmdir("//");
  EXPECT_THAT(Recorded(), ElementsAre("/bin/rm|-f|-r|./", "/bin/rm|-f|-r|//"));
}

TEST(RecursiveRmdirTest, FailsOnlyWhenTheToolCannotBeRun) {
  On("ALIBCExec").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELRecursiveRmdir("/tmp/a"), -1);
  for (int answer : {1, -2}) {
    On("ALIBCExec").Nth(1).Return(answer);
    EXPECT_EQ(QUENDELRecursiveRmdir("/tmp/a"), 0) << answer;
  }
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(MD5StringTest, WritesLowercaseDigitsAndANul) {
  EXPECT_EQ(Md5(""), "d41d8cd98f00b204e9800998ecf8427e");
  EXPECT_EQ(Md5("a"), "0cc175b9c0f1b6a831c399e269772661");
  EXPECT_EQ(Md5("The quick brown fox jumps over the lazy dog"), "9e107d9d372bb6826bd81d3542a419d6");
}

TEST(MD5StringTest, TakesNulBytesForBytes) {
  EXPECT_EQ(Md5(std::string("a\0b", 3)), "70350f6027bce3713f6b76473084309b");
}

TEST(BytesToHexTest, WritesLowercaseDigits) {
  EXPECT_EQ(Hex(std::string("\x00\xAB\x0F", 3), 3), "00ab0f");
  EXPECT_EQ(Hex("\xff\x10", 1), "ff");
}

TEST(BytesToHexTest, GivesAnEmptyTextForNoBytes) {
  EXPECT_EQ(Hex("abc", 0), "");
  EXPECT_EQ(Hex("abc", -1), "");
}

TEST(HexToBytesTest, ConvertsALoneLastDigitByItself) {
  EXPECT_EQ(Bytes("abc", 8), "\xab\x0c");
}

TEST(HexToBytesTest, StopsAtTheRoomGiven) {
  EXPECT_EQ(Bytes("a1b2c3", 2), "\xa1\xb2");
}

TEST(HexToBytesTest, WritesNothingWithoutRoomOrText) {
  EXPECT_EQ(Bytes("a1", 0), "");
  EXPECT_EQ(Bytes("a1", -3), "");
  EXPECT_EQ(Bytes("", 8), "");
}

TEST(HexToBytesTest, TakesDigitsOfEitherCase) {
  EXPECT_EQ(Bytes("aBCd", 8), "\xab\xcd");
}

TEST(HexToBytesTest, ReadsWhatIsNoNumberAsFarAsItIsOne) {
  EXPECT_EQ(Bytes("zz", 8), std::string(1, '\0'));
  EXPECT_EQ(Bytes("1z", 8), "\x01");
  EXPECT_EQ(Bytes("-1", 8), "\xff");
  EXPECT_EQ(Bytes(" 7", 8), "\x07");
  EXPECT_EQ(Bytes("0x", 8), std::string(1, '\0'));
  EXPECT_EQ(Bytes(std::string("1\0"
                              "22",
                              4),
                  8),
            "\x01\x22");
}
