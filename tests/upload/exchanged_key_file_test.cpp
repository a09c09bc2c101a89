// The key file's mode is that of the file that was opened, whatever its name leads to by then.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>

#include "quendel.h"
#include "support/appliance.h"

using namespace quendel::test;

namespace {

constexpr char kSshDir[] = "/run/quendelhome/.ssh";
constexpr char kKeyFile[] = "/run/quendelhome/.ssh/authorized_keys";
constexpr char kOpenedKeyFile[] = "/run/quendelhome/taken/authorized_keys";
constexpr char kSecret[] = "/volume1/secret";

bool exchange = false;

mode_t ModeOf(const char* path) {
  struct stat status = {};
  EXPECT_EQ(lstat(path, &status), 0) << path;
  return status.st_mode & 07777U;
}

// What a process of the support account, which owns the home, can do there at any moment.
void ExchangeKeyFile() {
  EXPECT_EQ(rename(kSshDir, "/run/quendelhome/taken"), 0);
  EXPECT_EQ(mkdir(kSshDir, 0755), 0);
  EXPECT_EQ(symlink(kSecret, kKeyFile), 0);
}

}  // namespace

// The library writes the key by this call, and sets the mode next.
extern "C" int __real_fputs(const char* text, FILE* stream);
extern "C" int __wrap_fputs(const char* text, FILE* stream) {
  const int written = __real_fputs(text, stream);
  if (exchange) {
    exchange = false;
    ExchangeKeyFile();
  }
  return written;
}

TEST(SupportAccountUserCreateTest, SetsTheModeOfTheFileItWroteAndOfNoOther) {
  WriteFile(kSecret, "root's own");
  ASSERT_EQ(chmod(kSecret, 0600), 0);
  umask(077);
  exchange = true;
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", "key"), 0);
  ASSERT_FALSE(exchange);
  EXPECT_EQ(ModeOf(kSecret), 0600U);
  EXPECT_EQ(ModeOf(kOpenedKeyFile), 0644U);
  EXPECT_EQ(ReadFile(kOpenedKeyFile), "key");
}
