// Copying files.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <string>

#include "platform/error.h"
#include "platform/file.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/random.h"

using namespace quendel::test;

namespace {

constexpr char kFrom[] = "/tmp/from";
constexpr char kTo[] = "/tmp/to";

int Copy() {
  // The record that the library passes: two of its flag words are 1.
  unsigned int options[20] = {1, 0, 1};
  return ARVOFileCopy(kFrom, kTo, options);
}

std::string RandomBytes(size_t size) {
  return Random(static_cast<unsigned>(size)).Bytes(size);
}

void WriteAt(const char* path, off_t offset, const std::string& text) {
  const int fd = open(path, O_WRONLY | O_CREAT, 0600);
  ASSERT_EQ(pwrite(fd, text.data(), text.size(), offset), static_cast<ssize_t>(text.size()));
  close(fd);
}

std::string ReadAt(const char* path, off_t offset, size_t size) {
  std::string text(size, '\0');
  const int fd = open(path, O_RDONLY);
  const ssize_t got = pread(fd, text.data(), size, offset);
  close(fd);
  text.resize(got < 0 ? 0 : static_cast<size_t>(got));
  return text;
}

off_t BytesOnDisk(const char* path) {
  return StatusOf(path).st_blocks * 512;
}

}  // namespace

TEST(FileCopyTest, CopiesEveryByte) {
  for (const size_t size : {size_t{1}, size_t{4096}, size_t{262144}, size_t{1048583}}) {
    const std::string bytes = RandomBytes(size);
    WriteFile(kFrom, bytes);
    EXPECT_EQ(Copy(), 0);
    EXPECT_TRUE(ReadFile(kTo) == bytes) << size;
  }
}

TEST(FileCopyTest, CopiesAnEmptyFile) {
  WriteFile(kFrom, "");
  WriteFile(kTo, "old");
  EXPECT_EQ(Copy(), 0);
  EXPECT_TRUE(Exists(kTo));
  EXPECT_EQ(ReadFile(kTo), "");
}

TEST(FileCopyTest, TakesNoOptionsAtAll) {
  WriteFile(kFrom, "text");
  EXPECT_EQ(ARVOFileCopy(kFrom, kTo, nullptr), 0);
  EXPECT_EQ(ReadFile(kTo), "text");
}

TEST(FileCopyTest, TruncatesWhatIsThere) {
  WriteFile(kFrom, "short");
  WriteFile(kTo, "a much longer text");
  chmod(kTo, 0604);
  EXPECT_EQ(Copy(), 0);
  EXPECT_EQ(ReadFile(kTo), "short");
  EXPECT_EQ(StatusOf(kTo).st_mode & 07777, 0604U);
}

TEST(FileCopyTest, CreatesWithThePermissionsOfTheSource) {
  WriteFile(kFrom, "secret");
  umask(022);
  chmod(kFrom, 0600);
  EXPECT_EQ(Copy(), 0);
  EXPECT_EQ(StatusOf(kTo).st_mode & 07777, 0600U);
  RemoveFile(kTo);
  chmod(kFrom, 06777);
  EXPECT_EQ(Copy(), 0);
  EXPECT_EQ(StatusOf(kTo).st_mode & 07777, 0755U);
}

TEST(FileCopyTest, FollowsLinksOnBothSides) {
  WriteFile("/tmp/a", "text");
  WriteFile("/tmp/b", "old");
  symlink("a", kFrom);
  symlink("b", kTo);
  EXPECT_EQ(Copy(), 0);
  EXPECT_EQ(ReadFile("/tmp/b"), "text");
}

TEST(FileCopyTest, KeepsHolesAndSizesBeyondFourGibibytes) {
  constexpr off_t kFar = off_t{5} << 30;
  WriteAt(kFrom, 0, "begin");
  WriteAt(kFrom, off_t{1} << 30, RandomBytes(300000));
  WriteAt(kFrom, kFar, "end");
  ASSERT_EQ(truncate(kFrom, kFar + 1000000), 0);
  EXPECT_EQ(Copy(), 0);
  EXPECT_EQ(StatusOf(kTo).st_size, kFar + 1000000);
  EXPECT_EQ(ReadAt(kTo, 0, 8), std::string("begin\0\0\0", 8));
  EXPECT_TRUE(ReadAt(kTo, off_t{1} << 30, 300000) == RandomBytes(300000));
  EXPECT_EQ(ReadAt(kTo, kFar, 5), std::string("end\0\0", 5));
  EXPECT_LE(BytesOnDisk(kTo), BytesOnDisk(kFrom) + 65536);
}

TEST(FileCopyTest, CopiesAFileThatIsOneHole) {
  WriteFile(kFrom, "");
  ASSERT_EQ(truncate(kFrom, off_t{1} << 33), 0);
  WriteFile(kTo, "old");
  EXPECT_EQ(Copy(), 0);
  EXPECT_EQ(StatusOf(kTo).st_size, off_t{1} << 33);
  EXPECT_LT(BytesOnDisk(kTo), 65536);
  EXPECT_EQ(ReadAt(kTo, 0, 3), std::string("\0\0\0", 3));
}

TEST(FileCopyTest, CopiesBetweenFileSystems) {
  mkdir("/tmp/other", 0700);
  ASSERT_EQ(mount("other", "/tmp/other", "tmpfs", 0, nullptr), 0);
  const std::string bytes = RandomBytes(700000);
  WriteFile(kFrom, bytes);
  EXPECT_EQ(ARVOFileCopy(kFrom, "/tmp/other/to", nullptr), 0);
  EXPECT_TRUE(ReadFile("/tmp/other/to") == bytes);
}

TEST(FileCopyTest, ReadsAndWritesWhereTheKernelCannotCopy) {
  const std::string bytes = RandomBytes(700000);
  WriteFile(kFrom, bytes);
  for (const int reason : {EXDEV, EINVAL, ENOSYS, EOPNOTSUPP, EPERM, EIO, EINTR}) {
    ResetCalls();
    On("copy_file_range").InPlatform().Return(-1, reason == EINTR ? EXDEV : reason);
    On("sendfile").InPlatform().Nth(reason == EINTR ? 1 : 0).Return(-1, reason);
    EXPECT_EQ(Copy(), 0);
    EXPECT_TRUE(ReadFile(kTo) == bytes) << reason;
  }
  // Some file systems tell nothing but that they copied nothing.
  On("copy_file_range").InPlatform().Return(0);
  On("sendfile").InPlatform().Return(0);
  EXPECT_EQ(Copy(), 0);
  EXPECT_TRUE(ReadFile(kTo) == bytes);
}

TEST(FileCopyTest, CopiesInTheKernelWhereItCan) {
  WriteFile(kFrom, RandomBytes(700000));
  EXPECT_EQ(Copy(), 0);
  EXPECT_GT(CallsInPlatform("copy_file_range"), 0);
  EXPECT_EQ(CallsInPlatform("pread"), 0);
}

TEST(FileCopyTest, IsNotDisturbedBySignals) {
  const std::string bytes = RandomBytes(700000);
  WriteFile(kFrom, bytes);
  On("copy_file_range").InPlatform().Nth(1).Return(-1, EINTR);
  EXPECT_EQ(Copy(), 0);
  EXPECT_TRUE(ReadFile(kTo) == bytes);
  On("copy_file_range").InPlatform().Return(-1, EXDEV);
  On("sendfile").InPlatform().Return(-1, EINVAL);
  On("pread").InPlatform().Nth(2).Return(-1, EINTR);
  On("write").InPlatform().Nth(2).Return(-1, EINTR);
  EXPECT_EQ(Copy(), 0);
  EXPECT_TRUE(ReadFile(kTo) == bytes);
}

TEST(FileCopyTest, CopiesWhereTheFileSystemKnowsNoHoles) {
  const std::string bytes = RandomBytes(700000);
  WriteFile(kFrom, bytes);
  On("lseek").InPlatform().Nth(1).Return(-1, EINVAL);
  EXPECT_EQ(Copy(), 0);
  EXPECT_TRUE(ReadFile(kTo) == bytes);
}

TEST(FileCopyTest, EndsWhereASourceThatShrankEnds) {
  WriteFile(kFrom, RandomBytes(700000));
  On("lseek").InPlatform().Nth(1).Return(-1, EINVAL);
  On("copy_file_range").InPlatform().Return(-1, EXDEV);
  On("sendfile").InPlatform().Return(-1, EINVAL);
  On("pread").InPlatform().Nth(1).Return(0);  // the end, earlier than the size told
  EXPECT_EQ(Copy(), 0);
  EXPECT_EQ(StatusOf(kTo).st_size, 0);
}

TEST(FileCopyTest, CopiesAFileThatTellsNoSize) {
  EXPECT_EQ(StatusOf("/proc/version").st_size, 0);
  EXPECT_EQ(ARVOFileCopy("/proc/version", kTo, nullptr), 0);
  EXPECT_EQ(ReadFile(kTo), ReadFile("/proc/version"));
  EXPECT_NE(ReadFile(kTo), "");
}

TEST(FileCopyTest, CopiesWhatWasThereOfALogThatIsAppendedTo) {
  const std::string bytes = RandomBytes(40000000);
  WriteFile(kFrom, bytes);
  const pid_t writer = fork();
  if (writer == 0) {
    const int fd = open(kFrom, O_WRONLY | O_APPEND);
    for (;;) {
      if (write(fd, "more\n", 5) != 5) {
        _exit(1);
      }
    }
  }
  EXPECT_EQ(Copy(), 0);
  kill(writer, SIGKILL);
  waitpid(writer, nullptr, 0);
  const std::string copy = ReadFile(kTo);
  EXPECT_GE(copy.size(), bytes.size());
  EXPECT_LE(copy.size(), ReadFile(kFrom).size());
  EXPECT_TRUE(copy.compare(0, bytes.size(), bytes) == 0);
}

TEST(FileCopyTest, GivesWhatIsThereOfAFileThatShrinks) {
  const std::string bytes = RandomBytes(1000000);
  for (int round = 0; round < 20; ++round) {
    WriteFile(kFrom, bytes);
    RemoveFile(kTo);
    const pid_t cutter = fork();
    if (cutter == 0) {
      _exit(truncate(kFrom, 5000));
    }
    EXPECT_EQ(Copy(), 0);
    waitpid(cutter, nullptr, 0);
    const std::string copy = ReadFile(kTo);
    EXPECT_TRUE(copy.size() == 1000000 || copy.size() >= 5000);
  }
}

TEST(FileCopyTest, RefusesAFifoWithoutWaiting) {
  mkfifo(kFrom, 0600);
  WriteFile(kTo, "old");
  EXPECT_LT(Copy(), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0401);
  EXPECT_EQ(ReadFile(kTo), "old");
  EXPECT_LT(ARVOFileCopy(kTo, kFrom, nullptr), 0);
  EXPECT_EQ(errno, ENXIO);
}

TEST(FileCopyTest, RefusesAFifoThatIsRead) {
  WriteFile(kFrom, "text");
  mkfifo(kTo, 0600);
  const int reader = open(kTo, O_RDONLY | O_NONBLOCK);
  EXPECT_LT(Copy(), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0401);
  char byte;
  EXPECT_EQ(read(reader, &byte, 1), 0);
  close(reader);
}

TEST(FileCopyTest, RefusesDevicesAndDirectories) {
  WriteFile(kTo, "old");
  for (const char* path : {"/dev/zero", "/tmp"}) {
    EXPECT_LT(ARVOFileCopy(path, kTo, nullptr), 0) << path;
    EXPECT_LT(ARVOFileCopy(kTo, path, nullptr), 0) << path;
  }
  EXPECT_LT(ARVOFileCopy(kTo, "/dev/null", nullptr), 0);
  EXPECT_EQ(ReadFile(kTo), "old");
}

TEST(FileCopyTest, RefusesOneFileUnderBothNames) {
  WriteFile(kFrom, "kept");
  link(kFrom, kTo);
  EXPECT_LT(Copy(), 0);
  EXPECT_LT(ARVOFileCopy(kFrom, kFrom, nullptr), 0);
  EXPECT_EQ(errno, EINVAL);
  EXPECT_EQ(ReadFile(kFrom), "kept");
}

TEST(FileCopyTest, FailsForAMissingSourceAndCreatesNothing) {
  EXPECT_LT(Copy(), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(Exists(kTo));
}

TEST(FileCopyTest, FailsForAMissingDirectory) {
  WriteFile(kFrom, "text");
  EXPECT_LT(ARVOFileCopy(kFrom, "/tmp/nowhere/to", nullptr), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(errno, ENOENT);
}

TEST(FileCopyTest, CreatesNothingThroughALink) {
  WriteFile(kFrom, "text");
  symlink("/tmp/target", kTo);
  EXPECT_LT(Copy(), 0);
  EXPECT_FALSE(Exists("/tmp/target"));
}

TEST(FileCopyTest, RefusesNullArguments) {
  WriteFile(kFrom, "text");
  EXPECT_LT(ARVOFileCopy(nullptr, kTo, nullptr), 0);
  EXPECT_LT(ARVOFileCopy(kFrom, nullptr, nullptr), 0);
}

TEST(FileCopyTest, LeavesNothingOfACopyThatFailed) {
  mkdir("/tmp/full", 0700);
  ASSERT_EQ(mount("small", "/tmp/full", "tmpfs", 0, "size=8k"), 0);
  WriteFile(kFrom, RandomBytes(100000));
  EXPECT_LT(ARVOFileCopy(kFrom, "/tmp/full/new", nullptr), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(errno, ENOSPC);
  EXPECT_FALSE(Exists("/tmp/full/new"));
  WriteFile("/tmp/full/old", "old");
  EXPECT_LT(ARVOFileCopy(kFrom, "/tmp/full/old", nullptr), 0);
  EXPECT_EQ(errno, ENOSPC);
  EXPECT_EQ(StatusOf("/tmp/full/old").st_size, 0);
}

TEST(FileCopyTest, FailsWhenAReadFails) {
  // The memory of a process has nothing at address 0.
  EXPECT_LT(ARVOFileCopy("/proc/self/mem", kTo, nullptr), 0);
  EXPECT_EQ(errno, EIO);
  EXPECT_FALSE(Exists(kTo));
}

TEST(FileCopyTest, LeavesNoDescriptorOpen) {
  WriteFile(kFrom, "text");
  const int before = open("/dev/null", O_RDONLY);
  close(before);
  EXPECT_EQ(Copy(), 0);
  EXPECT_LT(ARVOFileCopy(kFrom, "/tmp", nullptr), 0);
  const int after = open("/dev/null", O_RDONLY);
  close(after);
  EXPECT_EQ(after, before);
}
