// Model, version, local time, and the name of a fresh work directory.
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <climits>
#include <cstdlib>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kDefaults[] = "/etc.defaults/arvoinfo.conf";
constexpr char kVersion[] = "/etc.defaults/VERSION";

// 2024-03-05 07:08:09 UTC.
constexpr time_t kMoment = 1709622489;

std::string VersionOf(const std::string& fileText) {
  WriteFile(kVersion, fileText);
  char version[64];
  EXPECT_EQ(QUENDELGetHMXVersion(version, sizeof version), 0);
  return version;
}

void UseTimeZone(const char* zone) {
  setenv("TZ", zone, 1);
  tzset();
}

}  // namespace

TEST(GetHMXModelTest, IsTheModelName) {
  WriteFile(kDefaults, "upnpmodelname=\"TEST-1\"\n");
  char model[64];
  EXPECT_EQ(QUENDELGetHMXModel(model, sizeof model), 0);
  EXPECT_STREQ(model, "TEST-1");
}

TEST(GetHMXModelTest, IsEmptyWhenTheKeyIsMissing) {
  WriteFile(kDefaults, "other=1\n");
  char model[64] = "before";
  EXPECT_EQ(QUENDELGetHMXModel(model, sizeof model), 0);
  EXPECT_STREQ(model, "");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(GetHMXModelTest, IsCutToTheBuffer) {
  WriteFile(kDefaults, "upnpmodelname=\"TEST-1\"\n");
  char model[] = "xxxxxxxx";
  EXPECT_EQ(QUENDELGetHMXModel(model, 4), 0);
  EXPECT_STREQ(model, "TES");
  EXPECT_EQ(model[4], 'x');
}

TEST(GetHMXModelTest, TakesSixtyThreeBytesAtMost) {
  WriteFile(kDefaults, "upnpmodelname=" + std::string(100, 'm') + "\n");
  char model[128];
  EXPECT_EQ(QUENDELGetHMXModel(model, sizeof model), 0);
  EXPECT_EQ(std::string(model), std::string(63, 'm'));
}

TEST(GetHMXModelTest, FailsWhenTheFileCannotBeRead) {
  RemoveFile(kDefaults);
  char model[64] = "before";
  EXPECT_EQ(QUENDELGetHMXModel(model, sizeof model), -1);
  EXPECT_STREQ(model, "before");
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_device_facts", "Failed to get model name")));
}

TEST(GetHMXModelTest, ReleasesThePlatformsLockAfterEveryRead) {
  constexpr char kRead[] = "/etc.defaults/arvoinfo.conf|upnpmodelname|64|0";
  Record("ALIBCFileGetKeyValue");
  Record("ALIBCFileUnlock");
  char model[64];
  EXPECT_EQ(QUENDELGetHMXModel(model, sizeof model), 0);
  On("ALIBCFileGetKeyValue").Nth(1).Return(-7);
  EXPECT_EQ(QUENDELGetHMXModel(model, sizeof model), -1);
  EXPECT_THAT(Recorded(), ElementsAre(kRead, "2048", kRead, "2048"));
}

TEST(GetHMXVersionTest, NamesTheBuild) {
  EXPECT_EQ(VersionOf("majorversion=\"3\"\nminorversion=\"2\"\nbuildnumber=\"2044\"\n"
                      "smallfixnumber=\"0\"\n"),
            "HMX 3.2-2044");
}

TEST(GetHMXVersionTest, NamesTheUpdate) {
  EXPECT_EQ(VersionOf("majorversion=3\nminorversion=2\nbuildnumber=2044\nsmallfixnumber=3\n"),
            "HMX 3.2-2044 Update 3");
}

TEST(GetHMXVersionTest, NamesNoUpdateWhenTheKeyIsMissing) {
  EXPECT_EQ(VersionOf("majorversion=3\nminorversion=2\nbuildnumber=2044\n"), "HMX 3.2-2044");
}

TEST(GetHMXVersionTest, TakesOnlyAPlainZeroForNoUpdate) {
  const std::string build = "majorversion=3\nminorversion=2\nbuildnumber=2044\n";
  EXPECT_EQ(VersionOf(build + "smallfixnumber=00\n"), "HMX 3.2-2044 Update 00");
  EXPECT_EQ(VersionOf(build + "smallfixnumber=\n"), "HMX 3.2-2044 Update ");
  EXPECT_EQ(VersionOf(build + "smallfixnumber=\"0 \"\n"), "HMX 3.2-2044 Update 0 ");
}

TEST(GetHMXVersionTest, LeavesThePlacesOfMissingKeysEmpty) {
  EXPECT_EQ(VersionOf("minorversion=2\n"), "HMX .2-");
  RemoveFile(kVersion);
  char version[64];
  EXPECT_EQ(QUENDELGetHMXVersion(version, sizeof version), 0);
  EXPECT_STREQ(version, "HMX .-");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(GetHMXVersionTest, IsCutToTheBuffer) {
  WriteFile(kVersion, "majorversion=3\nminorversion=2\nbuildnumber=2044\n");
  char version[] = "xxxxxxxxxxxx";
  EXPECT_EQ(QUENDELGetHMXVersion(version, 7), 0);
  EXPECT_STREQ(version, "HMX 3.");
  EXPECT_EQ(version[7], 'x');
}

TEST(GetHMXVersionTest, MakesRoomForTheWholeFile) {
  Record("ALIBCSzHashAlloc");
  VersionOf("");
  EXPECT_THAT(Recorded(), ElementsAre("512"));
}

TEST(GetHMXVersionTest, FailsWhenMemoryRunsOut) {
  On("ALIBCSzHashAlloc").Nth(1).Return(nullptr);
  char version[64] = "before";
  EXPECT_EQ(QUENDELGetHMXVersion(version, sizeof version), -1);
  EXPECT_STREQ(version, "before");
  EXPECT_THAT(Log(),
              ElementsAre(Logged("quendel_device_facts", "Failed to allocate memory for hash")));
}

TEST(GetLocalTimeTest, IsCompact) {
  UseTimeZone("UTC0");
  char text[32];
  EXPECT_EQ(QUENDELGetLocalTime(text, sizeof text, kMoment), 15);
  EXPECT_STREQ(text, "20240305_070809");
}

TEST(GetLocalTimeTest, FollowsTheTimeZone) {
  UseTimeZone("XXX-2");
  char text[32];
  QUENDELGetLocalTime(text, sizeof text, kMoment);
  EXPECT_STREQ(text, "20240305_090809");
}

TEST(GetLocalTimeTest, ReturnsTheFullLengthWhenItIsCut) {
  UseTimeZone("UTC0");
  char text[9];
  EXPECT_EQ(QUENDELGetLocalTime(text, sizeof text, kMoment), 15);
  EXPECT_STREQ(text, "20240305");
}

TEST(GetLocalTimeTest, RefusesAMomentWithoutADate) {
  char text[32] = "before";
  EXPECT_EQ(QUENDELGetLocalTime(text, sizeof text, LONG_MAX), -1);
  EXPECT_STREQ(text, "");
}

TEST(GetDstDirTest, StartsAtZero) {
  UseTimeZone("UTC0");
  char path[64];
  EXPECT_EQ(QUENDELGetDstDir(path, sizeof path, kMoment), 0);
  EXPECT_STREQ(path, "/tmp/quendel_20240305_070809_0");
  EXPECT_FALSE(Exists(path));
}

TEST(GetDstDirTest, TakesTheFirstNumberThatNoDirectoryHas) {
  UseTimeZone("UTC0");
  mkdir("/tmp/quendel_20240305_070809_0", 0700);
  mkdir("/tmp/quendel_20240305_070809_1", 0700);
  mkdir("/tmp/quendel_20240305_070809_3", 0700);
  char path[64];
  EXPECT_EQ(QUENDELGetDstDir(path, sizeof path, kMoment), 0);
  EXPECT_STREQ(path, "/tmp/quendel_20240305_070809_2");
}

TEST(GetDstDirTest, DoesNotTakeAFileForADirectory) {
  UseTimeZone("UTC0");
  WriteFile("/tmp/quendel_20240305_070809_0", "");
  char path[64];
  EXPECT_EQ(QUENDELGetDstDir(path, sizeof path, kMoment), 0);
  EXPECT_STREQ(path, "/tmp/quendel_20240305_070809_0");
}

TEST(GetDstDirTest, PassesOnThatThePlatformCannotTell) {
  UseTimeZone("UTC0");
  On("ALIBCFileCheckDir").Nth(1).Return(-1);
  char path[64];
  EXPECT_EQ(QUENDELGetDstDir(path, sizeof path, kMoment), -1);
  EXPECT_STREQ(path, "/tmp/quendel_20240305_070809_0");
}

TEST(GetDstDirTest, TakesOnlyOneForATakenName) {
  UseTimeZone("UTC0");
  On("ALIBCFileCheckDir").Nth(1).Return(2);
  char path[64];
  EXPECT_EQ(QUENDELGetDstDir(path, sizeof path, kMoment), 2);
  EXPECT_STREQ(path, "/tmp/quendel_20240305_070809_0");
}

TEST(GetDstDirTest, EndsWhenTheBufferIsTooSmallForAnyFreeName) {
  UseTimeZone("UTC0");
  char path[64];
  EXPECT_EQ(QUENDELGetDstDir(path, 5, kMoment), 1);
  EXPECT_STREQ(path, "/tmp");
  const std::string cut = "/tmp/quendel_20240305_070809_";
  mkdir(cut.c_str(), 0700);
  EXPECT_EQ(QUENDELGetDstDir(path, cut.size() + 1, kMoment), 1);
  EXPECT_EQ(path, cut);
}
