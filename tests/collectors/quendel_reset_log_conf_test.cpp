// Forgetting what was sent of a log.
#include <gmock/gmock.h>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "quendel_reset_log_conf";
constexpr char kConf[] = "/usr/arvo/etc/quendel/quendel.log.messages";
constexpr char kText[] =
    "# of the installer\nname=m\npath=/m\nlast_hash=h\ntar_log_inode=7\nlast_byte=1\ntotal_byte=2\n"
    "inode=3\n";

}  // namespace

TEST(ResetLogConfTest, WritesTwoQuotesOverEveryStateKeyAndNothingElse) {
  WriteFile(kConf, kText);
  EXPECT_EQ(QUENDELResetLogConf(kConf), 0);
  EXPECT_EQ(ReadFile(kConf),
            "# of the installer\nname=m\npath=/m\nlast_hash=\"\"\ntar_log_inode=\"\"\n"
            "last_byte=\"\"\ntotal_byte=\"\"\ninode=\"\"\n");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ResetLogConfTest, LeavesAFileThatTheReaderAccepts) {
  WriteFile(kConf, kText);
  EXPECT_EQ(QUENDELResetLogConf(kConf), 0);
  QUENDELLogConf_t conf;
  EXPECT_EQ(QUENDELGetLogConf(kConf, &conf), 0);
}

TEST(ResetLogConfTest, DoesNothingForAMissingFile) {
  EXPECT_EQ(QUENDELResetLogConf(kConf), 0);
  EXPECT_FALSE(Exists(kConf));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ResetLogConfTest, StopsAtTheFirstKeyThatCannotBeWritten) {
  const std::pair<std::string, std::string> steps[] = {{"last_hash=\"\"", "last hash"},
                                                       {"tar_log_inode=\"\"", "tar log inode"},
                                                       {"last_byte=\"\"", "last log length"},
                                                       {"total_byte=\"\"", "total byte"},
                                                       {"inode=\"\"", "inode"}};
  On("ALIBCErrGet").Return(5);
  int nth = 1;
  for (const auto& [reset, words] : steps) {
    ClearLog();
    WriteFile(kConf, kText);
    const int before = Calls("ALIBCFileSetKeyValue");
    On("ALIBCFileSetKeyValue")
        .Nth(nth)
        .Return(nth % 2 == 0 ? 0 : -1);  // neither 0 nor less is success
    EXPECT_EQ(QUENDELResetLogConf(kConf), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to reset " + words + " in conf '" + kConf +
                                                     "', ret = 5")));
    int done = 0;
    for (const auto& [text, unused] : steps) {
      EXPECT_EQ(ReadFile(kConf).find("\n" + text) != std::string::npos, ++done < nth) << text;
    }
    EXPECT_EQ(Calls("ALIBCFileSetKeyValue") - before, nth) << "went on after a failure";
    ++nth;
  }
}
