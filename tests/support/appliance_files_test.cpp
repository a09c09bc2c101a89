// The files of a test's appliance.
#include "support/appliance.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

using namespace quendel::test;

TEST(WriteFileTest, MakesTheFoldersAboveTheFile) {
  WriteFile("/volume1/a/b/c", "text");
  EXPECT_EQ(ReadFile("/volume1/a/b/c"), "text");
}

TEST(WriteFileTest, ReplacesAFile) {
  WriteFile("/tmp/file", "a longer text");
  WriteFile("/tmp/file", std::string("\0\r\n", 3));
  EXPECT_EQ(ReadFile("/tmp/file"), std::string("\0\r\n", 3));
}

TEST(WriteFileDeathTest, EndsTheTestWhenItCannotWrite) {
  EXPECT_DEATH(WriteFile("/tmp", "text"), "cannot write /tmp");
  EXPECT_DEATH(WriteFile("/dev/full", "text"), "cannot write /dev/full");
}

TEST(ReadFileDeathTest, EndsTheTestWhenItCannotRead) {
  EXPECT_DEATH(ReadFile("/tmp/none"), "cannot read /tmp/none");
}

TEST(ExistsTest, TellsWhetherThereIsAnything) {
  EXPECT_TRUE(Exists("/tmp"));
  EXPECT_FALSE(Exists("/tmp/none"));
  ASSERT_EQ(symlink("/nowhere", "/tmp/link"), 0);
  EXPECT_TRUE(Exists("/tmp/link"));
}

TEST(RemoveFileTest, RemovesFilesAndTrees) {
  WriteFile("/tmp/a/b/c", "text");
  RemoveFile("/tmp/a/b/c");
  EXPECT_TRUE(Exists("/tmp/a/b"));
  RemoveFile("/tmp/a");
  EXPECT_FALSE(Exists("/tmp/a"));
  RemoveFile("/tmp/a");
}

TEST(SetIdentityTest, WritesTheStandardIdentity) {
  SetIdentity();
  EXPECT_EQ(ReadFile("/usr/arvo/etc/device.conf"),
            "account_email=mail1\naccount_field_a=a1\naccount_field_b=b2\nserial_number=S1\n"
            "timezone=Etc/UTC\n");
}

TEST(SetIdentityTest, WritesExactlyWhatIsGiven) {
  SetIdentity({{"serial_number", "S2"}});
  EXPECT_EQ(ReadFile("/usr/arvo/etc/device.conf"), "serial_number=S2\n");
}

TEST(ApplianceTest, HasNoIdentityAndNoServiceSettings) {
  EXPECT_FALSE(Exists("/usr/arvo/etc/device.conf"));
  EXPECT_FALSE(Exists("/usr/arvo/etc/quendel.conf"));
}
