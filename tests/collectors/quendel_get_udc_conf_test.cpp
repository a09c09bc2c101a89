// Reading the configuration and state of a user-defined collector.
#include <gmock/gmock.h>

#include <cstddef>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "quendel_get_udc_conf";
constexpr char kConf[] = "/usr/arvo/etc/quendel/quendel.udc.raid";

// Fails to read the file of this text. Returns the fields, in the order in which they are read.
std::vector<std::string> FailToRead(const std::string& text) {
  WriteFile(kConf, text);
  QUENDELUDCConf_t conf = {"hash before", "name before", "path before"};
  On("ALIBCErrGet").Nth(1).Return(99);
  EXPECT_EQ(QUENDELGetUDCConf(kConf, &conf), -1);
  return {conf.name, conf.path, conf.last_hash};
}

}  // namespace

TEST(GetUDCConfTest, ReadsTheThreeKeys) {
  WriteFile(kConf, "name=raid\npath=/usr/bin/raid\nlast_hash=\"\"\n");
  QUENDELUDCConf_t conf = {};
  EXPECT_EQ(QUENDELGetUDCConf(kConf, &conf), 0);
  EXPECT_STREQ(conf.name, "raid");
  EXPECT_STREQ(conf.path, "/usr/bin/raid");
  EXPECT_STREQ(conf.last_hash, "\"\"");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(GetUDCConfTest, HasItsFieldsInTheirOrderAndSizes) {
  EXPECT_EQ(offsetof(QUENDELUDCConf_t, last_hash), 0u);
  EXPECT_EQ(offsetof(QUENDELUDCConf_t, name), 64u);
  EXPECT_EQ(offsetof(QUENDELUDCConf_t, path), 128u);
  EXPECT_EQ(sizeof(QUENDELUDCConf_t), 384u);
}

TEST(GetUDCConfTest, StopsAtAMissingName) {
  EXPECT_THAT(FailToRead("path=/p\nlast_hash=h\n"),
              ElementsAre("name before", "path before", "hash before"));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, std::string("Failed to find bin name in conf '") +
                                                   kConf + "', ret = 99")));
}

TEST(GetUDCConfTest, StopsAtAMissingPath) {
  EXPECT_THAT(FailToRead("name=n\nlast_hash=h\n"), ElementsAre("n", "path before", "hash before"));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, std::string("Failed to find bin path in conf '") +
                                                   kConf + "', ret = 99")));
}

TEST(GetUDCConfTest, StopsAtAMissingHash) {
  EXPECT_THAT(FailToRead("name=n\npath=/p\n"), ElementsAre("n", "/p", "hash before"));
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, std::string("Failed to find last hash value in conf '") +
                                            kConf + "', ret = 99")));
}

TEST(GetUDCConfTest, TakesAnEmptyValueForAMissingKey) {
  FailToRead("name=n\npath=/p\nlast_hash=\n");
  EXPECT_EQ(Log().size(), 1u);
}

TEST(GetUDCConfTest, NeedsARecord) {
  EXPECT_EQ(QUENDELGetUDCConf(kConf, nullptr), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Bad parameter")));
}

TEST(GetUDCConfTest, CutsTextsToTheirFields) {
  const std::string longText(300, 'x');
  WriteFile(kConf, "name=" + longText + "\npath=" + longText + "\nlast_hash=" + longText + "\n");
  QUENDELUDCConf_t conf = {};
  EXPECT_EQ(QUENDELGetUDCConf(kConf, &conf), 0);
  EXPECT_EQ(conf.name, longText.substr(0, 63));
  EXPECT_EQ(conf.path, longText.substr(0, 255));
  EXPECT_EQ(conf.last_hash, longText.substr(0, 63));
}
