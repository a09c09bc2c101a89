// Forgetting what a user-defined collector printed last.
#include <gmock/gmock.h>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kConf[] = "/usr/arvo/etc/quendel/quendel.udc.raid";

}  // namespace

TEST(ResetUDCConfTest, WritesTwoQuotesOverTheHash) {
  WriteFile(kConf, "name=n\nlast_hash=h\npath=/p\n");
  EXPECT_EQ(QUENDELResetUDCConf(kConf), 0);
  EXPECT_EQ(ReadFile(kConf), "name=n\nlast_hash=\"\"\npath=/p\n");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ResetUDCConfTest, DoesNothingForAMissingFile) {
  EXPECT_EQ(QUENDELResetUDCConf(kConf), 0);
  EXPECT_FALSE(Exists(kConf));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ResetUDCConfTest, FailsWhenTheHashCannotBeWritten) {
  for (const long answer : {0L, -1L}) {
    ClearLog();
    WriteFile(kConf, "name=n\nlast_hash=h\npath=/p\n");
    On("ALIBCFileSetKeyValue").Nth(1).Return(answer);
    On("ALIBCErrGet").Nth(1).Return(42);
    EXPECT_EQ(QUENDELResetUDCConf(kConf), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged("quendel_reset_udc_conf",
                                          std::string("Failed to reset lash hash value in conf '") +
                                              kConf + "', ret = 42")));
  }
}
