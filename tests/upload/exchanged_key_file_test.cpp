// The key file's mode is that of the file that was opened, whatever its name leads to by then.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"

using namespace quendel::test;

namespace {

constexpr char kSshDir[] = "/run/quendelhome/.ssh";
constexpr char kKeyFile[] = "/run/quendelhome/.ssh/authorized_keys";
constexpr char kOpenedKeyFile[] = "/run/quendelhome/taken/authorized_keys";
constexpr char kSecret[] = "/volume1/secret";

// What a process of the support account, which owns the home, can do there at any moment.
void ExchangeKeyFile() {
  EXPECT_EQ(rename(kSshDir, "/run/quendelhome/taken"), 0);
  EXPECT_EQ(mkdir(kSshDir, 0755), 0);
  EXPECT_EQ(symlink(kSecret, kKeyFile), 0);
}

}  // namespace

TEST(SupportAccountUserCreateTest, SetsTheModeOfTheFileItWroteAndOfNoOther) {
  WriteFile(kSecret, "root's own");
  ASSERT_EQ(chmod(kSecret, 0600), 0);
  umask(077);
  // The library writes the key by this call, and sets the mode next.
  On("fputs").Nth(1).Replace([](const char* text, FILE* stream) {
    const int written = fputs(text, stream);
    ExchangeKeyFile();
    return written;
  });
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", "key"), 0);
  ASSERT_EQ(Calls("fputs"), 1);
  EXPECT_EQ(ModeOf(kSecret), S_IFREG | 0600U);
  EXPECT_EQ(ModeOf(kOpenedKeyFile), S_IFREG | 0644U);
  EXPECT_EQ(ReadFile(kOpenedKeyFile), "key");
}
