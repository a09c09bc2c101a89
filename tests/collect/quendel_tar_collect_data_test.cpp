// The packing of a run directory.
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include "collect/archive_entries.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/faults.h"
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
  FailCall("ALIBCExecl", 1, 0);
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
  FailCall("ALIBCExecl", 1, -1);
  ExpectFailure("/tmp/a/b");
}

TEST(TarCollectDataTest, FailsWhenTheArchiveCannotBeMade) {
  WriteFile("/tmp/a/b/f", "1");
  ExpectFailure("/tmp/a/b", "/tmp/none/out.tar.xz");
}

TEST(TarCollectDataTest, FailsWhenTheDiskIsFull) {
  WriteFile("/tmp/a/b/f", "1");
  ASSERT_EQ(symlink("/dev/full", kArchive), 0);
  ExpectFailure("/tmp/a/b");
}
