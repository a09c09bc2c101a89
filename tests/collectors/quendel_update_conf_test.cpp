// Committing what a collection staged.
#include <gmock/gmock.h>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "quendel_update_conf";
constexpr char kUpdateFile[] = "/tmp/quendel/quendel.log.update.conf";
constexpr char kFirst[] = "/usr/arvo/etc/quendel/quendel.log.a";
constexpr char kSecond[] = "/usr/arvo/etc/quendel/quendel.log.b";
constexpr char kFresh[] = "name=n\npath=/p\nlast_hash=\"\"\ntotal_byte=\"\"\n";

// Two collectors' files, and new values staged for both.
void Stage() {
  WriteFile(kFirst, kFresh);
  WriteFile(kSecond, kFresh);
  WriteFile(kUpdateFile, std::string("[") + kFirst + "]\nlast_hash=h1\ntotal_byte=11\n[" + kSecond +
                             "]\nlast_hash=h2\ntotal_byte=22\n");
}

std::string Committed(const std::string& hash, const std::string& total) {
  return "name=n\npath=/p\nlast_hash=" + hash + "\ntotal_byte=" + total + "\n";
}

}  // namespace

TEST(UpdateCollectConfTest, WritesEverySectionIntoTheFileItIsNamedBy) {
  Stage();
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  EXPECT_EQ(ReadFile(kFirst), Committed("h1", "11"));
  EXPECT_EQ(ReadFile(kSecond), Committed("h2", "22"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(UpdateCollectConfTest, LeavesTheStagedFile) {
  Stage();
  const std::string staged = ReadFile(kUpdateFile);
  QUENDELUpdateCollectConf(kUpdateFile);
  EXPECT_EQ(ReadFile(kUpdateFile), staged);
}

TEST(UpdateCollectConfTest, AddsAKeyThatTheFileLacks) {
  WriteFile(kFirst, "name=n\n");
  WriteFile(kUpdateFile, std::string("[") + kFirst + "]\ninode=5\n");
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  EXPECT_EQ(ReadFile(kFirst), "name=n\ninode=5\n");
}

TEST(UpdateCollectConfTest, DoesNothingWithoutAStagedFile) {
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  EXPECT_EQ(Calls("ALIBCSzListAlloc"), 0);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(UpdateCollectConfTest, DoesNothingWithoutASection) {
  WriteFile(kUpdateFile, "");
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  EXPECT_EQ(Calls("ALIBCFileSetKeyValue"), 0);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(UpdateCollectConfTest, FailsWithoutMemoryForEitherList) {
  Stage();
  for (const int nth : {1, 2}) {
    ClearLog();
    ResetCalls();
    On("ALIBCSzListAlloc").Nth(nth).Return(nullptr);
    EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to allocate memory for list")));
  }
  EXPECT_EQ(ReadFile(kFirst), kFresh);
}

TEST(UpdateCollectConfTest, FailsWithoutMemoryForTheHash) {
  Stage();
  On("ALIBCSzHashAlloc").Nth(1).Return(nullptr);
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to allocate memory for hash")));
  EXPECT_EQ(ReadFile(kFirst), kFresh);
}

TEST(UpdateCollectConfTest, AsksForItsContainersInTheirSizes) {
  Stage();
  Record("ALIBCSzListAlloc");
  Record("ALIBCSzHashAlloc");
  QUENDELUpdateCollectConf(kUpdateFile);
  EXPECT_THAT(Recorded(), ElementsAre("512", "128", "128"));
}

TEST(UpdateCollectConfTest, FailsWhenTheSectionsCannotBeListed) {
  Stage();
  On("ALIBCFileEnumSection").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(
                         kUnit, std::string("Failed to enum section of '") + kUpdateFile + "'")));
  EXPECT_EQ(ReadFile(kFirst), kFresh);
}

TEST(UpdateCollectConfTest, PassesOverASectionThatCannotBeRead) {
  for (const long answer : {0L, -1L}) {
    Stage();
    ClearLog();
    On("ALIBCFileGetSection").Nth(1).Return(answer);
    EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, std::string("Failed to get key-value pair of "
                                                             "section '") +
                                                     kFirst + "'")));
    EXPECT_EQ(ReadFile(kFirst), kFresh);
    EXPECT_EQ(ReadFile(kSecond), Committed("h2", "22"));
  }
}

TEST(UpdateCollectConfTest, PassesOverASectionWhoseKeysCannotBeListed) {
  Stage();
  On("ALIBCSzHashEnumKey").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, std::string("Failed to enum all key of section '") +
                                                   kFirst + "'")));
  EXPECT_EQ(ReadFile(kFirst), kFresh);
  EXPECT_EQ(ReadFile(kSecond), Committed("h2", "22"));
}

TEST(UpdateCollectConfTest, GivesUpOnlyTheSectionWhoseValueCannotBeWritten) {
  Stage();
  On("ALIBCFileSetKeyValue").Nth(2).Return(-1);
  On("ALIBCErrGet").Nth(1).Return(12);
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  EXPECT_THAT(Log(), ElementsAre(Logged(
                         kUnit, std::string("Failed to set key-value pair: (last_hash, h1) of "
                                            "config '") +
                                    kFirst + "', ret = 12")));
  EXPECT_EQ(ReadFile(kFirst), Committed("\"\"", "11"));
  EXPECT_EQ(ReadFile(kSecond), Committed("h2", "22"));
}

TEST(UpdateCollectConfTest, GoesOnAfterAWriteThatAnswersZero) {
  Stage();
  On("ALIBCFileSetKeyValue").Nth(1).Return(0);
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  EXPECT_EQ(ReadFile(kFirst), Committed("h1", "\"\""));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(UpdateCollectConfTest, GivesUpASectionWhoseFileIsGone) {
  Stage();
  RemoveFile(kFirst);
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  ASSERT_EQ(Log().size(), 1u);
  EXPECT_THAT(Log()[0].message,
              testing::StartsWith("Failed to set key-value pair: (total_byte, 11) of config '"));
  EXPECT_FALSE(Exists(kFirst));
  EXPECT_EQ(ReadFile(kSecond), Committed("h2", "22"));
}

TEST(UpdateCollectConfTest, KeepsNoPairOfOneSectionForTheNext) {
  WriteFile(kFirst, "name=n\n");
  WriteFile(kSecond, "name=n\n");
  WriteFile(kUpdateFile,
            std::string("[") + kFirst + "]\ninode=5\n[" + kSecond + "]\nlast_hash=h\n");
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  EXPECT_EQ(ReadFile(kSecond), "name=n\nlast_hash=h\n");
}

// A commit that ends anywhere leaves a state from which lines are repeated, never passed over: the
// inode, which alone says that a log was collected from its start, comes last.
TEST(UpdateCollectConfTest, WritesTheKeysInAnOrderThatIsSafeToStopIn) {
  WriteFile(kFirst, "name=n\n");
  WriteFile(kUpdateFile,
            std::string("[") + kFirst +
                "]\ninode=5\nlast_byte=1\nlast_hash=h\ntar_log_inode=3\ntotal_byte=9\n");
  Record("ALIBCFileSetKeyValue");
  EXPECT_EQ(QUENDELUpdateCollectConf(kUpdateFile), 0);
  const std::string conf = kFirst;
  EXPECT_THAT(Recorded(),
              ElementsAre(conf + "|total_byte|9|0", conf + "|tar_log_inode|3|0",
                          conf + "|last_hash|h|0", conf + "|last_byte|1|0", conf + "|inode|5|0"));
}
