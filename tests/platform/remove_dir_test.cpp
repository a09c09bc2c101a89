// Removing directories with everything below them.
#include <dirent.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdarg>
#include <functional>
#include <string>
#include <utility>

#include "platform/error.h"
#include "platform/file.h"
#include "support/appliance.h"
#include "support/calls.h"

using namespace quendel::test;

namespace {

constexpr char kTree[] = "/tmp/tree";

// Makes a directory inside a directory inside ..., and leaves the process where it was.
void MakeChain(int depth) {
  mkdir(kTree, 0700);
  const int start = open(".", O_RDONLY | O_DIRECTORY);
  ASSERT_EQ(chdir(kTree), 0);
  for (int i = 0; i < depth; ++i) {
    ASSERT_EQ(mkdir("deeper", 0700), 0);
    ASSERT_EQ(chdir("deeper"), 0);
  }
  ASSERT_EQ(fchdir(start), 0);
  close(start);
}

void LimitTo(int resource, rlim_t limit) {
  const rlimit limits = {limit, limit};
  ASSERT_EQ(setrlimit(static_cast<__rlimit_resource>(resource), &limits), 0);
}

}  // namespace

TEST(RemoveDirTest, RemovesEverythingBelow) {
  WriteFile("/tmp/tree/a/b/file", "1");
  WriteFile("/tmp/tree/a/.hidden", "2");
  WriteFile("/tmp/tree/..odd", "3");
  mkdir("/tmp/tree/empty", 0);
  mkfifo("/tmp/tree/fifo", 0600);
  EXPECT_EQ(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_FALSE(Exists(kTree));
}

TEST(RemoveDirTest, RemovesAnEmptyDirectory) {
  mkdir(kTree, 0700);
  EXPECT_EQ(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_FALSE(Exists(kTree));
}

TEST(RemoveDirTest, RemovesLinksAndNotWhatTheyLeadTo) {
  WriteFile("/tmp/outside/file", "kept");
  WriteFile("/tmp/tree/file", "");
  symlink("/tmp/outside", "/tmp/tree/dirlink");
  symlink("/tmp/outside/file", "/tmp/tree/filelink");
  symlink("nowhere", "/tmp/tree/dangling");
  EXPECT_EQ(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_FALSE(Exists(kTree));
  EXPECT_EQ(ReadFile("/tmp/outside/file"), "kept");
}

TEST(RemoveDirTest, RefusesALinkForTheDirectoryItself) {
  WriteFile("/tmp/outside/file", "kept");
  symlink("/tmp/outside", kTree);
  EXPECT_LT(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_EQ(errno, ENOTDIR);
  EXPECT_LT(ALIBCopyRemoveDir("/tmp/tree/"), 0);
  EXPECT_EQ(ReadFile("/tmp/outside/file"), "kept");
  EXPECT_TRUE(Exists(kTree));
}

TEST(RemoveDirTest, TakesSlashesAtTheEnd) {
  WriteFile("/tmp/tree/file", "");
  EXPECT_EQ(ALIBCopyRemoveDir("/tmp/tree//"), 0);
  EXPECT_FALSE(Exists(kTree));
}

TEST(RemoveDirTest, RefusesWhatIsNoDirectory) {
  WriteFile("/tmp/file", "kept");
  EXPECT_LT(ALIBCopyRemoveDir("/tmp/file"), 0);
  EXPECT_EQ(errno, ENOTDIR);
  EXPECT_EQ(ReadFile("/tmp/file"), "kept");
  EXPECT_LT(ALIBCopyRemoveDir("/tmp/nowhere"), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_EQ(errno, ENOENT);
}

TEST(RemoveDirTest, EmptiesNothingThatItCannotRemoveByName) {
  WriteFile("/tmp/tree/file", "kept");
  mkdir("/tmp/tree/below", 0700);
  ASSERT_EQ(chdir(kTree), 0);
  for (const char* path : {".", "./", "below/..", "/tmp/tree/.", "/", "//", ""}) {
    EXPECT_LT(ALIBCopyRemoveDir(path), 0) << path;
    EXPECT_EQ(ALIBCErrGet(), 0x0100);
  }
  EXPECT_LT(ALIBCopyRemoveDir(nullptr), 0);
  EXPECT_EQ(ReadFile("/tmp/tree/file"), "kept");
}

TEST(RemoveDirTest, TakesARelativePath) {
  WriteFile("/tmp/tree/file", "");
  ASSERT_EQ(chdir("/tmp"), 0);
  EXPECT_EQ(ALIBCopyRemoveDir("tree"), 0);
  EXPECT_FALSE(Exists(kTree));
}

TEST(RemoveDirTest, RemovesADeepTreeWithFewDescriptorsAndLittleStack) {
  MakeChain(20000);
  LimitTo(RLIMIT_NOFILE, 12);
  EXPECT_EQ(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_FALSE(Exists(kTree));
}

TEST(RemoveDirTest, RemovesAWideTree) {
  for (int i = 0; i < 3000; ++i) {
    const std::string dir = "/tmp/tree/" + std::to_string(i);
    WriteFile(dir + "/file", "");
  }
  EXPECT_EQ(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_FALSE(Exists(kTree));
}

TEST(RemoveDirTest, LeavesAMountedFileSystemAlone) {
  WriteFile("/tmp/tree/a/file", "");
  WriteFile("/tmp/tree/z/file", "");
  mkdir("/tmp/tree/m", 0700);
  mkdir("/tmp/tree/m/mounted", 0700);
  ASSERT_EQ(mount("other", "/tmp/tree/m/mounted", "tmpfs", 0, nullptr), 0);
  WriteFile("/tmp/tree/m/mounted/file", "kept");
  EXPECT_LT(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0602);
  EXPECT_EQ(errno, EBUSY);  // the first reason, not that folders above are not empty
  EXPECT_EQ(ReadFile("/tmp/tree/m/mounted/file"), "kept");
  // The rest is gone.
  EXPECT_FALSE(Exists("/tmp/tree/a"));
  EXPECT_FALSE(Exists("/tmp/tree/z"));
}

TEST(RemoveDirTest, LeavesAFolderThatIsMountedFromTheSameFileSystemAlone) {
  WriteFile("/tmp/elsewhere/below/file", "kept");
  mkdir(kTree, 0700);
  mkdir("/tmp/tree/bound", 0700);
  ASSERT_EQ(mount("/tmp/elsewhere", "/tmp/tree/bound", nullptr, MS_BIND, nullptr), 0);
  EXPECT_LT(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_EQ(errno, EBUSY);
  EXPECT_EQ(ReadFile("/tmp/elsewhere/below/file"), "kept");
}

TEST(RemoveDirTest, EmptiesAFolderThatIsMountedItself) {
  WriteFile("/tmp/elsewhere/below/file", "gone");
  mkdir(kTree, 0700);
  ASSERT_EQ(mount("/tmp/elsewhere", kTree, nullptr, MS_BIND, nullptr), 0);
  EXPECT_LT(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_EQ(errno, EBUSY);
  EXPECT_FALSE(Exists("/tmp/elsewhere/below"));
}

TEST(RemoveDirTest, PassesOverADirectoryThatSomebodyElseRemoves) {
  WriteFile("/tmp/tree/a/file", "");
  mkdir("/tmp/tree/a/b", 0700);
  On("openat").InPlatform().With("b").Nth(1).Before([] { rmdir("/tmp/tree/a/b"); });
  EXPECT_EQ(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_FALSE(Exists(kTree));
}

TEST(RemoveDirTest, DoesNotFollowADirectoryThatSomebodyMoves) {
  WriteFile("/tmp/tree/a/b/file", "");
  mkdir("/tmp/outside", 0700);
  On("openat").InPlatform().With("..").Nth(1).Before(
      [] { rename("/tmp/tree/a/b", "/tmp/outside/b"); });
  EXPECT_LT(ALIBCopyRemoveDir(kTree), 0);
  EXPECT_EQ(errno, ESTALE);
  EXPECT_TRUE(Exists("/tmp/outside/b"));
}

TEST(RemoveDirTest, FailsOnAReadOnlyFileSystem) {
  mkdir(kTree, 0700);
  ASSERT_EQ(mount("small", kTree, "tmpfs", 0, nullptr), 0);
  WriteFile("/tmp/tree/a/file", "kept");
  ASSERT_EQ(mount(nullptr, kTree, nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
  EXPECT_LT(ALIBCopyRemoveDir("/tmp/tree/a"), 0);
  EXPECT_EQ(errno, EROFS);
  EXPECT_EQ(ReadFile("/tmp/tree/a/file"), "kept");
}

TEST(RemoveDirTest, LeavesNoDescriptorOpen) {
  WriteFile("/tmp/tree/a/file", "");
  const int before = open("/dev/null", O_RDONLY);
  close(before);
  EXPECT_EQ(ALIBCopyRemoveDir(kTree), 0);
  const int after = open("/dev/null", O_RDONLY);
  close(after);
  EXPECT_EQ(after, before);
}
