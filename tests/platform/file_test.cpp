// File tests, listing, touching, creating directories.
#include "platform/file.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "platform/containers.h"
#include "platform/error.h"
#include "platform/owned.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr uid_t kNobody = 65534;

int Enum(const char* dir, const char* prefix, platform::OwnedList& names) {
  return ALIBCFileEnumDir(dir, prefix, names.slot(), 130);
}

int MakePath(const char* path, unsigned int mode, int uid = -1, int gid = -1) {
  return ARVOFSMkdirP(path, 0, 1, uid, gid, mode);
}

}  // namespace

TEST(FileExistTest, TakesAnythingThatIsThere) {
  WriteFile("/tmp/file", "");
  mkfifo("/tmp/fifo", 0600);
  symlink("file", "/tmp/link");
  for (const char* path : {"/tmp/file", "/tmp/fifo", "/tmp/link", "/tmp", "/dev/null"}) {
    EXPECT_EQ(ALIBCFileExist(path), 1) << path;
  }
}

TEST(FileExistTest, DoesNotTakeWhatIsNot) {
  symlink("nowhere", "/tmp/dangling");
  symlink("loop", "/tmp/loop");
  WriteFile("/tmp/file", "");
  for (const char* path : {"/tmp/nowhere", "/tmp/dangling", "/tmp/loop", "/tmp/file/below", ""}) {
    EXPECT_EQ(ALIBCFileExist(path), 0) << path;
  }
  EXPECT_EQ(ALIBCFileExist(("/tmp/" + std::string(300, 'n')).c_str()), 0);
  EXPECT_EQ(ALIBCFileExist(nullptr), 0);
}

TEST(FileExistTest, FailsWhereItCannotTell) {
  mkdir("/tmp/closed", 0700);
  WriteFile("/tmp/closed/file", "");
  ASSERT_EQ(seteuid(kNobody), 0);
  EXPECT_LT(ALIBCFileExist("/tmp/closed/file"), 0);
  EXPECT_EQ(errno, EACCES);
  EXPECT_EQ(ALIBCErrGet(), 0x0400);
  EXPECT_EQ(seteuid(0), 0);
}

TEST(FileCheckDirTest, TellsADirectoryFromTheRest) {
  WriteFile("/tmp/file", "");
  symlink("/run", "/tmp/link");
  symlink("nowhere", "/tmp/dangling");
  symlink("loop", "/tmp/loop");
  EXPECT_EQ(ALIBCFileCheckDir("/tmp"), 1);
  EXPECT_EQ(ALIBCFileCheckDir("/tmp/link"), 1);
  for (const char* path :
       {"/tmp/file", "/tmp/nowhere", "/tmp/dangling", "/tmp/loop", "/tmp/file/below", ""}) {
    EXPECT_EQ(ALIBCFileCheckDir(path), 0) << path;
  }
  EXPECT_EQ(ALIBCFileCheckDir(("/tmp/" + std::string(300, 'n')).c_str()), 0);
}

TEST(FileCheckDirTest, FailsWhereItCannotTell) {
  mkdir("/tmp/closed", 0700);
  ASSERT_EQ(seteuid(kNobody), 0);
  EXPECT_LT(ALIBCFileCheckDir("/tmp/closed/below"), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0400);
  EXPECT_EQ(errno, EACCES);
  EXPECT_EQ(seteuid(0), 0);
  EXPECT_LT(ALIBCFileCheckDir(nullptr), 0);
}

TEST(FileUnlockTest, TakesALockThatIsNotHeld) {
  EXPECT_EQ(ALIBCFileUnlock(0x800), 0);
  EXPECT_EQ(ALIBCFileUnlock(0x800), 0);
}

TEST(FileUnlockTest, RefusesANumberThatIsNone) {
  EXPECT_LT(ALIBCFileUnlock(-1), 0);
}

TEST(FileStatTest, FollowsLinks) {
  WriteFile("/tmp/file", "12345");
  symlink("file", "/tmp/link");
  struct stat status = {};
  EXPECT_EQ(ALIBCFileStat("/tmp/link", 1, &status), 0);
  EXPECT_TRUE(S_ISREG(status.st_mode));
  EXPECT_EQ(status.st_size, 5);
  EXPECT_EQ(status.st_ino, StatusOf("/tmp/file").st_ino);
}

TEST(FileStatTest, FailsForWhatIsNotThere) {
  struct stat status = {};
  EXPECT_LT(ALIBCFileStat("/tmp/nowhere", 1, &status), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_EQ(errno, ENOENT);
  symlink("loop", "/tmp/loop");
  EXPECT_LT(ALIBCFileStat("/tmp/loop", 1, &status), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0400);
}

TEST(FileStatTest, RefusesOtherArguments) {
  struct stat status = {};
  EXPECT_LT(ALIBCFileStat(nullptr, 1, &status), 0);
  EXPECT_LT(ALIBCFileStat("/tmp", 1, nullptr), 0);
  EXPECT_LT(ALIBCFileStat("/tmp", 0, &status), 0);
}

TEST(FileTouchTest, CreatesAnEmptyFile) {
  umask(022);
  EXPECT_EQ(ALIBCFileTouch("/tmp/new"), 0);
  EXPECT_EQ(ReadFile("/tmp/new"), "");
  EXPECT_EQ(ModeOf("/tmp/new"), S_IFREG | 0644U);
}

TEST(FileTouchTest, SetsTheTimesOfWhatIsThere) {
  WriteFile("/tmp/file", "kept");
  const timespec old[2] = {{1000, 0}, {1000, 0}};
  utimensat(AT_FDCWD, "/tmp/file", old, 0);
  EXPECT_EQ(ALIBCFileTouch("/tmp/file"), 0);
  EXPECT_EQ(ReadFile("/tmp/file"), "kept");
  EXPECT_GT(StatusOf("/tmp/file").st_mtime, 1000);
}

TEST(FileTouchTest, TakesAFileThatSomebodyElseCreatesMeanwhile) {
  WriteFile("/tmp/file", "kept");
  On("utimensat").InPlatform().Nth(1).Return(-1, ENOENT);  // as long as it was not there
  EXPECT_EQ(ALIBCFileTouch("/tmp/file"), 0);
  EXPECT_EQ(ReadFile("/tmp/file"), "kept");
}

TEST(FileTouchTest, DoesNotWaitForAFifo) {
  mkfifo("/tmp/fifo", 0600);
  EXPECT_EQ(ALIBCFileTouch("/tmp/fifo"), 0);
}

TEST(FileTouchTest, CreatesNothingThroughALink) {
  symlink("/tmp/target", "/tmp/dangling");
  EXPECT_LT(ALIBCFileTouch("/tmp/dangling"), 0);
  EXPECT_FALSE(Exists("/tmp/target"));
}

TEST(FileTouchTest, FailsWhereNothingCanBeCreated) {
  EXPECT_LT(ALIBCFileTouch("/tmp/nowhere/file"), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_LT(ALIBCFileTouch(nullptr), 0);
}

TEST(FileEnumDirTest, ListsRegularFilesByPrefixInByteOrder) {
  for (const char* name : {"b.2", "b.10", "b.1", "a.1", "b", "B.1", "b.\xC3\xA4"}) {
    WriteFile(std::string("/tmp/dir/") + name, "");
  }
  platform::OwnedList names(0);
  EXPECT_EQ(Enum("/tmp/dir", "b.", names), 4);
  EXPECT_THAT(Texts(names), ElementsAre("b.1", "b.10", "b.2", "b.\xC3\xA4"));
}

TEST(FileEnumDirTest, ListsLinksToRegularFilesOnly) {
  WriteFile("/tmp/file", "");
  mkdir("/tmp/dir", 0700);
  symlink("/tmp/file", "/tmp/dir/x.link");
  symlink("/tmp", "/tmp/dir/x.dirlink");
  symlink("nowhere", "/tmp/dir/x.dangling");
  symlink("x.loop", "/tmp/dir/x.loop");
  mkdir("/tmp/dir/x.dir", 0700);
  mkfifo("/tmp/dir/x.fifo", 0600);
  platform::OwnedList names(0);
  EXPECT_EQ(Enum("/tmp/dir", "x.", names), 1);
  EXPECT_THAT(Texts(names), ElementsAre("x.link"));
}

TEST(FileEnumDirTest, NeverListsHiddenNames) {
  WriteFile("/tmp/dir/.x", "");
  WriteFile("/tmp/dir/x", "");
  platform::OwnedList names(0);
  EXPECT_EQ(Enum("/tmp/dir", "", names), 1);
  EXPECT_EQ(Enum("/tmp/dir", ".", names), 0);
  EXPECT_THAT(Texts(names), ElementsAre("x"));
}

TEST(FileEnumDirTest, AppendsToWhatTheListHolds) {
  WriteFile("/tmp/dir/a", "");
  platform::OwnedList names(0);
  ALIBCSzListPush(names.slot(), "z");
  EXPECT_EQ(Enum("/tmp/dir", "a", names), 1);
  EXPECT_THAT(Texts(names), ElementsAre("z", "a"));
}

TEST(FileEnumDirTest, ListsTenThousandNames) {
  for (int i = 0; i < 10000; ++i) {
    const std::string path = "/tmp/dir/n." + std::to_string(i);
    if (i == 0) {
      WriteFile(path, "");
    } else {
      link("/tmp/dir/n.0", path.c_str());
    }
  }
  platform::OwnedList names(512);
  EXPECT_EQ(Enum("/tmp/dir", "n.", names), 10000);
}

TEST(FileEnumDirTest, FindsNone) {
  mkdir("/tmp/dir", 0700);
  platform::OwnedList names(0);
  EXPECT_EQ(Enum("/tmp/dir", "a", names), 0);
}

TEST(FileEnumDirTest, FailsForWhatIsNoDirectory) {
  platform::OwnedList names(0);
  EXPECT_LT(Enum("/tmp/nowhere", "a", names), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_EQ(errno, ENOENT);
  WriteFile("/tmp/file", "");
  EXPECT_LT(Enum("/tmp/file", "a", names), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_THAT(Texts(names), IsEmpty());
}

TEST(FileEnumDirTest, RefusesOtherArguments) {
  platform::OwnedList names(0);
  ALIBSZLIST* none = nullptr;
  WriteFile("/tmp/dir/a", "");
  EXPECT_LT(Enum(nullptr, "a", names), 0);
  EXPECT_LT(Enum("/tmp/dir", nullptr, names), 0);
  EXPECT_LT(ALIBCFileEnumDir("/tmp/dir", "a", nullptr, 130), 0);
  EXPECT_LT(ALIBCFileEnumDir("/tmp/dir", "a", &none, 130), 0);
  EXPECT_LT(ALIBCFileEnumDir("/tmp/dir", "a", names.slot(), 0), 0);
}

TEST(FSMkdirPTest, CreatesADirectoryAndItsParents) {
  umask(077);
  EXPECT_EQ(MakePath("/tmp/a/b/c", 0755), 0);
  EXPECT_EQ(ModeOf("/tmp/a"), S_IFDIR | 0755U);
  EXPECT_EQ(ModeOf("/tmp/a/b"), S_IFDIR | 0755U);
  EXPECT_EQ(ModeOf("/tmp/a/b/c"), S_IFDIR | 0755U);
}

TEST(FSMkdirPTest, GivesExactlyTheMode) {
  umask(0);
  EXPECT_EQ(MakePath("/tmp/a", 0700), 0);
  EXPECT_EQ(ModeOf("/tmp/a"), S_IFDIR | 0700U);
  EXPECT_EQ(MakePath("/tmp/b/c", 01311), 0);
  EXPECT_EQ(ModeOf("/tmp/b/c"), S_IFDIR | 01311U);
}

TEST(FSMkdirPTest, LeavesWhatIsThereAsItIs) {
  mkdir("/tmp/a", 0750);
  EXPECT_EQ(MakePath("/tmp/a", 0700, 50001, 100), 0);
  EXPECT_EQ(MakePath("/tmp/a/b", 0700), 0);
  EXPECT_EQ(ModeOf("/tmp/a"), S_IFDIR | 0750U);
  EXPECT_EQ(StatusOf("/tmp/a").st_uid, 0U);
}

TEST(FSMkdirPTest, SetsOwnerAndGroupThatAreGiven) {
  EXPECT_EQ(MakePath("/tmp/a/b", 0700, 50001, 100), 0);
  for (const char* path : {"/tmp/a", "/tmp/a/b"}) {
    EXPECT_EQ(StatusOf(path).st_uid, 50001U);
    EXPECT_EQ(StatusOf(path).st_gid, 100U);
  }
  EXPECT_EQ(MakePath("/tmp/c", 0700, -1, 100), 0);
  EXPECT_EQ(StatusOf("/tmp/c").st_uid, 0U);
  EXPECT_EQ(StatusOf("/tmp/c").st_gid, 100U);
}

TEST(FSMkdirPTest, TakesRelativePathsAndSpareSlashes) {
  chdir("/tmp");
  EXPECT_EQ(MakePath("a//b/./c/", 0700), 0);
  EXPECT_EQ(MakePath("a/b/../d", 0700), 0);
  EXPECT_EQ(MakePath("//tmp//e", 0700), 0);
  EXPECT_EQ(MakePath("/", 0700), 0);
  for (const char* path : {"/tmp/a/b/c", "/tmp/a/d", "/tmp/e"}) {
    EXPECT_EQ(ALIBCFileCheckDir(path), 1) << path;
  }
}

TEST(FSMkdirPTest, FollowsALinkToADirectory) {
  symlink("/run", "/tmp/link");
  EXPECT_EQ(MakePath("/tmp/link/a", 0700), 0);
  EXPECT_EQ(ALIBCFileCheckDir("/run/a"), 1);
}

TEST(FSMkdirPTest, TakesADirectoryThatSomebodyElseMakesMeanwhile) {
  On("mkdirat").InPlatform().Nth(1).Before([] { mkdir("/tmp/a", 0750); });
  EXPECT_EQ(MakePath("/tmp/a/b", 0700), 0);
  EXPECT_EQ(ModeOf("/tmp/a"), S_IFDIR | 0750U);
  EXPECT_EQ(ModeOf("/tmp/a/b"), S_IFDIR | 0700U);
}

TEST(FSMkdirPTest, FailsWhereAFileIsInTheWay) {
  WriteFile("/tmp/file", "");
  EXPECT_LT(MakePath("/tmp/file", 0700), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(errno, ENOTDIR);
  EXPECT_LT(MakePath("/tmp/file/a", 0700), 0);
  symlink("/tmp/target", "/tmp/dangling");
  EXPECT_LT(MakePath("/tmp/dangling", 0700), 0);
  EXPECT_FALSE(Exists("/tmp/target"));
}

TEST(FSMkdirPTest, FailsOnAReadOnlyFileSystem) {
  mkdir("/tmp/a", 0700);
  ASSERT_EQ(mount("small", "/tmp/a", "tmpfs", MS_RDONLY, nullptr), 0);
  EXPECT_LT(MakePath("/tmp/a/b", 0700), 0);
  EXPECT_EQ(errno, EROFS);
}

TEST(FSMkdirPTest, RefusesNoPath) {
  EXPECT_LT(MakePath(nullptr, 0700), 0);
  EXPECT_LT(MakePath("", 0700), 0);
}
