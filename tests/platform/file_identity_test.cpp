// What tells one file from another, by number or by number and birth.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <set>

#include "platform/error.h"
#include "platform/file.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kFile[] = "/tmp/file";
constexpr char kDeviceConf[] = "/usr/arvo/etc/device.conf";

struct stat StatusOf(const char* path) {
  struct stat status = {};
  EXPECT_EQ(ALIBCFileStat(path, 1, &status), 0) << path;
  return status;
}

ino_t NumberOf(const char* path) {
  struct stat status = {};
  EXPECT_EQ(stat(path, &status), 0);
  return status.st_ino;
}

}  // namespace

TEST(FileStatTest, GivesTheNumberUnlessTheSettingsSayBirth) {
  WriteFile(kFile, "text");
  RemoveFile(kDeviceConf);
  EXPECT_EQ(StatusOf(kFile).st_ino, NumberOf(kFile));
  for (const std::string value : {"inode", "", "other"}) {
    WriteFile(kDeviceConf, "file_identity=" + value + "\n");
    EXPECT_EQ(StatusOf(kFile).st_ino, NumberOf(kFile)) << value;
  }
}

TEST(FileStatTest, TellsFilesApartByTheirBirth) {
  WriteFile(kDeviceConf, "file_identity=birth\n");
  WriteFile(kFile, "text");
  const ino_t first = StatusOf(kFile).st_ino;
  EXPECT_NE(first, NumberOf(kFile));
  EXPECT_GT(first, 0U);
  EXPECT_LE(first, 0xffffffffU);
  // What a file goes through does not change it.
  WriteFile(kFile, "a longer text");
  EXPECT_EQ(chmod(kFile, 0600), 0);
  EXPECT_EQ(utimensat(AT_FDCWD, kFile, nullptr, 0), 0);
  std::filesystem::rename(kFile, "/tmp/moved");
  EXPECT_EQ(StatusOf("/tmp/moved").st_ino, first);
  EXPECT_EQ(StatusOf("/tmp/moved").st_size, 13);
  symlink("moved", "/tmp/link");
  EXPECT_EQ(StatusOf("/tmp/link").st_ino, first);
  WriteFile(kFile, "text");
  EXPECT_NE(StatusOf(kFile).st_ino, first);
}

TEST(FileStatTest, UsesTheNumberOfAFileWithoutABirthAndSaysSoOnce) {
  WriteFile(kDeviceConf, "file_identity=birth\n");
  EXPECT_EQ(StatusOf("/proc/version").st_ino, NumberOf("/proc/version"));
  EXPECT_EQ(StatusOf("/proc/uptime").st_ino, NumberOf("/proc/uptime"));
  EXPECT_THAT(Log(), ElementsAre(Logged("file_identity",
                                        "'/proc/version' has no time of birth; it is known by its "
                                        "inode number alone")));
}

// 0 is what a log that was reset is recorded with.
TEST(FileStatTest, GivesNoFileTheIdentityZero) {
  WriteFile(kDeviceConf, "file_identity=birth\n");
  WriteFile(kFile, "");
  // A number and a birth whose mixture has 32 low bits that are 0.
  On("fstat").InPlatform().Replace([](int fd, struct stat* status) {
    const int result = fstat(fd, status);
    status->st_ino = 12;
    return result;
  });
  On("statx").InPlatform().Replace(
      [](int fd, const char* path, int flags, unsigned mask, struct statx* status) {
        const int result = statx(fd, path, flags, mask, status);
        status->stx_btime = {};
        status->stx_btime.tv_sec = 595246158893409017;
        return result;
      });
  EXPECT_EQ(StatusOf(kFile).st_ino, 1U);
}

TEST(FileStatTest, FailsUnderBirthAsUnderNumbers) {
  WriteFile(kDeviceConf, "file_identity=birth\n");
  struct stat status = {};
  EXPECT_LT(ALIBCFileStat("/tmp/nowhere", 1, &status), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_EQ(errno, ENOENT);
}

// Taking one identity for the other would make each log another file.
TEST(FileStatTest, FailsWhenTheSettingsCannotBeRead) {
  WriteFile(kFile, "");
  std::filesystem::create_directory(kDeviceConf);
  struct stat status = {};
  EXPECT_LT(ALIBCFileStat(kFile, 1, &status), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0400);
}
