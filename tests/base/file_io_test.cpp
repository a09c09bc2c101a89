// Files by their descriptors.
#include "base/file_io.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <utility>

#include "support/appliance.h"

using namespace quendel;
using namespace quendel::test;

namespace {

constexpr char kFile[] = "/tmp/file";

// Tells whether a descriptor is open.
bool IsOpen(int fd) {
  return fcntl(fd, F_GETFD) >= 0;
}

// Why a path is not opened; 0 when it is.
int ReasonAgainst(const char* path) {
  struct stat status;
  errno = 0;
  return OpenRegularFile(path, status) ? 0 : errno;
}

}  // namespace

TEST(OwnedFdTest, ClosesWhatItOwnsAndLeavesErrnoAlone) {
  int fd = -1;
  errno = 7;
  {
    const OwnedFd owner(open("/dev/null", O_RDONLY));
    fd = owner.get();
    EXPECT_TRUE(IsOpen(fd));
  }
  EXPECT_FALSE(IsOpen(fd));
  errno = 7;
  { const OwnedFd closedAlready(fd); }
  EXPECT_EQ(errno, 7);
}

TEST(OwnedFdTest, ClosesItsOwnBeforeItTakesAnother) {
  OwnedFd one(open("/dev/null", O_RDONLY));
  OwnedFd other(open("/dev/null", O_RDONLY));
  const int first = one.get();
  const int second = other.get();
  one = std::move(other);
  EXPECT_FALSE(IsOpen(first));
  EXPECT_EQ(one.get(), second);
  EXPECT_TRUE(IsOpen(second));
}

TEST(OwnedFdTest, GivesUpWhatIsReleased) {
  int fd = -1;
  {
    OwnedFd owner(open("/dev/null", O_RDONLY));
    fd = owner.Release();
    EXPECT_FALSE(owner);
  }
  EXPECT_TRUE(IsOpen(fd));
  close(fd);
}

TEST(OwnedFdTest, TellsWhetherClosingSucceeded) {
  OwnedFd owner(open("/dev/null", O_RDONLY));
  close(owner.get());
  EXPECT_FALSE(owner.Close());
  EXPECT_TRUE(owner.Close());
}

TEST(OpenRegularFileTest, OpensARegularFileAndTellsItsStatus) {
  WriteFile(kFile, "12345");
  struct stat status = {};
  EXPECT_TRUE(OpenRegularFile(kFile, status));
  EXPECT_EQ(status.st_size, 5);
}

TEST(OpenRegularFileTest, FollowsALink) {
  WriteFile(kFile, "12345");
  std::filesystem::create_symlink(kFile, "/tmp/link");
  EXPECT_EQ(ReasonAgainst("/tmp/link"), 0);
}

TEST(OpenRegularFileTest, RefusesEverythingElseAtOnce) {
  ASSERT_EQ(mkfifo("/tmp/fifo", 0600), 0);
  EXPECT_EQ(ReasonAgainst("/tmp/fifo"), EINVAL);
  EXPECT_EQ(ReasonAgainst("/dev/zero"), EINVAL);
  EXPECT_EQ(ReasonAgainst("/tmp"), EISDIR);
  EXPECT_EQ(ReasonAgainst("/tmp/missing"), ENOENT);
}

TEST(OpenRegularFileTest, KeepsTheDescriptorFromPrograms) {
  WriteFile(kFile, "");
  struct stat status = {};
  const OwnedFd file = OpenRegularFile(kFile, status);
  EXPECT_NE(fcntl(file.get(), F_GETFD) & FD_CLOEXEC, 0);
}

TEST(CopyRangeTest, CopiesAPartToThePositionOfTheSink) {
  WriteFile(kFile, "0123456789");
  struct stat status = {};
  const OwnedFd source = OpenRegularFile(kFile, status);
  const OwnedFd sink(open("/tmp/sink", O_RDWR | O_CREAT, 0600));
  EXPECT_EQ(CopyRange(source.get(), 2, 5, sink.get()), 3);
  EXPECT_EQ(CopyRange(source.get(), 8, 100, sink.get()), 2);
  EXPECT_EQ(CopyRange(source.get(), 10, 100, sink.get()), 0);
  EXPECT_EQ(ReadFile("/tmp/sink"), "23489");
}
