// The packing of a run directory.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>

#include "collect/archive_entries.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;

namespace {

constexpr char kUnit[] = "quendel_tar_collect_data";
constexpr char kArchive[] = "/tmp/out.tar.xz";

// Notes how tar would be run, without running it.
std::vector<std::string> RunFor(const char* dir) {
  Record("ALIBCExecl");
  On("ALIBCExecl").Nth(1).Return(0);
  EXPECT_EQ(QUENDELTarCollectData(dir, kArchive), 0);
  return Recorded();
}

void ExpectFailure(const std::string& dir, const char* archive = kArchive) {
  EXPECT_EQ(QUENDELTarCollectData(dir.c_str(), archive), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to tar '" + dir + "'")));
}

}  // namespace

TEST(TarCollectDataTest, PacksTheDirectoryUnderItsLastComponent) {
  WriteFile("/tmp/a/b/log/messages", "line\n");
  WriteFile("/tmp/a/b/udc/udc.result", std::string("\0\xff", 2));
  ASSERT_EQ(mkdir("/tmp/a/b/perf", 0700), 0);
  WriteFile("/tmp/a/beside", "not packed");
  EXPECT_EQ(QUENDELTarCollectData("/tmp/a/b", kArchive), 0);
  EXPECT_THAT(ArchiveEntries(kArchive),
              ElementsAre(Pair("b/", ""), Pair("b/log/", ""), Pair("b/log/messages", "line\n"),
                          Pair("b/perf/", ""), Pair("b/udc/", ""),
                          Pair("b/udc/udc.result", std::string("\0\xff", 2))));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(TarCollectDataTest, RunsTarOnTheParentAndTheLastComponent) {
  EXPECT_THAT(RunFor("/tmp/a/b"), ElementsAre("/bin/tar|-C|/tmp/a|-Jcvf|/tmp/out.tar.xz|b"));
}

TEST(TarCollectDataTest, TakesAPathWithoutASlashForBoth) {
  EXPECT_THAT(RunFor("b"), ElementsAre("/bin/tar|-C|b|-Jcvf|/tmp/out.tar.xz|b"));
}

TEST(TarCollectDataTest, HandsOnTheEmptyNameAfterATrailingSlash) {
  EXPECT_THAT(RunFor("/tmp/a/b/"), ElementsAre("/bin/tar|-C|/tmp/a/b|-Jcvf|/tmp/out.tar.xz|"));
}

TEST(TarCollectDataTest, HandsOnTheEmptyParentOfATopDirectory) {
  EXPECT_THAT(RunFor("/b"), ElementsAre("/bin/tar|-C||-Jcvf|/tmp/out.tar.xz|b"));
}

TEST(TarCollectDataTest, TakesAnyCharacterInANameForItself) {
  const std::string odd = "/tmp/a/$(touch gone) ; 'x' \"y\"\n*";
  WriteFile(odd + "/f", "1");
  EXPECT_EQ(QUENDELTarCollectData(odd.c_str(), kArchive), 0);
  EXPECT_EQ(ArchiveEntries(kArchive).count(odd.substr(7) + "/f"), 1U);
}

TEST(TarCollectDataTest, ReplacesAnOlderArchive) {
  WriteFile(kArchive, std::string(99999, 'x'));
  WriteFile("/tmp/a/b/f", "1");
  EXPECT_EQ(QUENDELTarCollectData("/tmp/a/b", kArchive), 0);
  EXPECT_THAT(ArchiveEntries(kArchive), ElementsAre(Pair("b/", ""), Pair("b/f", "1")));
}

TEST(TarCollectDataTest, FailsWhenThereIsNothingToPack) {
  ExpectFailure("/tmp/none/b");
}

TEST(TarCollectDataTest, FailsOnATrailingSlash) {
  WriteFile("/tmp/a/b/f", "1");
  ExpectFailure("/tmp/a/b/");
}

TEST(TarCollectDataTest, FailsWhenTarCannotBeStarted) {
  WriteFile("/tmp/a/b/f", "1");
  On("ALIBCExecl").Nth(1).Return(-1);
  ExpectFailure("/tmp/a/b");
}

TEST(TarCollectDataTest, FailsWhenTheArchiveCannotBeMade) {
  WriteFile("/tmp/a/b/f", "1");
  ExpectFailure("/tmp/a/b", "/tmp/none/out.tar.xz");
}

TEST(TarCollectDataTest, FailsWhenTheDiskIsFull) {
  WriteFile("/tmp/a/b/f", "1");
  ASSERT_EQ(mkdir("/tmp/full", 0700), 0);
  ASSERT_EQ(mount("tmpfs", "/tmp/full", "tmpfs", 0, "size=4k"), 0);
  WriteFile("/tmp/full/f", std::string(4096, 'x'));
  ExpectFailure("/tmp/a/b", "/tmp/full/out.tar.xz");
  EXPECT_FALSE(Exists("/tmp/full/out.tar.xz"));
}

// ---- Who may read the archive, and what may lie in its place.

TEST(TarCollectDataTest, MakesTheArchiveForItsOwnerOnly) {
  umask(0);
  WriteFile("/tmp/a/b/f", "1");
  EXPECT_EQ(QUENDELTarCollectData("/tmp/a/b", kArchive), 0);
  EXPECT_EQ(ModeOf(kArchive), S_IFREG | 0600U);
}

TEST(TarCollectDataTest, MakesItsFileBeforeItRunsTar) {
  WriteFile("/tmp/bin/tar", "#!/bin/sh\nstat -c '%a %s' \"$4\" >/tmp/seen\n");
  ASSERT_EQ(chmod("/tmp/bin/tar", 0755), 0);
  ASSERT_EQ(mount("/tmp/bin/tar", "/bin/tar", nullptr, MS_BIND, nullptr), 0);
  umask(0);
  EXPECT_EQ(QUENDELTarCollectData("/tmp/a/b", kArchive), 0);
  EXPECT_EQ(ReadFile("/tmp/seen"), "600 0\n");
}

TEST(TarCollectDataTest, ClosesAnOlderArchiveToOthers) {
  WriteFile(kArchive, "old");
  ASSERT_EQ(chmod(kArchive, 0644), 0);
  WriteFile("/tmp/a/b/f", "1");
  EXPECT_EQ(QUENDELTarCollectData("/tmp/a/b", kArchive), 0);
  EXPECT_EQ(ModeOf(kArchive), S_IFREG | 0600U);
}

TEST(TarCollectDataTest, RemovesAnEmptyArchiveAgain) {
  for (const long status : {-1, 2}) {
    On("ALIBCExecl").Nth(1).Return(status);
    ClearLog();
    ExpectFailure("/tmp/a/b");
    EXPECT_FALSE(Exists(kArchive)) << status;
  }
}

TEST(TarCollectDataTest, KeepsWhatTarWroteBeforeItFailed) {
  WriteFile("/tmp/a/b/f", "1");
  WriteFile("/tmp/bin/tar", "#!/bin/sh\necho half >\"$4\"\nexit 2\n");
  ASSERT_EQ(chmod("/tmp/bin/tar", 0755), 0);
  ASSERT_EQ(mount("/tmp/bin/tar", "/bin/tar", nullptr, MS_BIND, nullptr), 0);
  ExpectFailure("/tmp/a/b");
  EXPECT_EQ(ReadFile(kArchive), "half\n");
}

TEST(TarCollectDataTest, KeepsAnOlderArchiveWhenTarCannotBeRun) {
  WriteFile(kArchive, "");
  On("ALIBCExecl").Nth(1).Return(-1);
  ExpectFailure("/tmp/a/b");
  EXPECT_TRUE(Exists(kArchive));
}

// The file that the link or the second name leads to is somebody's secret.
TEST(TarCollectDataTest, RefusesWhatIsNoFileOfItsOwn) {
  WriteFile("/tmp/a/b/f", "1");
  const std::vector<std::function<int()>> plants = {
      [] { return symlink("/tmp/secret", kArchive); },
      [] { return symlink("/tmp/none", kArchive); },
      [] { return link("/tmp/secret", kArchive); },
      [] { return mkfifo(kArchive, 0666); },
      [] { return mkdir(kArchive, 0777); },
      [] {
        WriteFile(kArchive, "");
        return chown(kArchive, 1234, 1234);
      },
  };
  for (size_t i = 0; i < plants.size(); ++i) {
    RemoveFile(kArchive);
    WriteFile("/tmp/secret", "secret");
    ASSERT_EQ(plants[i](), 0);
    ResetCalls();
    ClearLog();
    ExpectFailure("/tmp/a/b");
    EXPECT_EQ(Calls("ALIBCExecl"), 0) << i;
    EXPECT_TRUE(Exists(kArchive)) << i;
    EXPECT_EQ(ReadFile("/tmp/secret"), "secret") << i;
    EXPECT_FALSE(Exists("/tmp/none")) << i;
  }
}

TEST(TarCollectDataTest, WaitsForNobodyWhoReadsAFifoInItsPlace) {
  ASSERT_EQ(mkfifo(kArchive, 0666), 0);
  const int reader = open(kArchive, O_RDONLY | O_NONBLOCK);
  ASSERT_GE(reader, 0);
  ExpectFailure("/tmp/a/b");
  EXPECT_EQ(Calls("ALIBCExecl"), 0);
  close(reader);
}
