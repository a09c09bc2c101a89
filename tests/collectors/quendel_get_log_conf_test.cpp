// Reading the configuration and state of a log.
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

constexpr char kUnit[] = "quendel_get_log_conf";
constexpr char kConf[] = "/usr/arvo/etc/quendel/quendel.log.messages";

const std::string kHash = "0123456789abcdef0123456789abcdef";

// A complete file, but for one key.
std::string ConfWithout(const std::string& leftOut) {
  const std::pair<std::string, std::string> pairs[] = {
      {"name", "messages"},     {"path", "/var/log/messages"}, {"last_hash", kHash},
      {"tar_log_inode", "7,8"}, {"last_byte", "87"},           {"total_byte", "20480"},
      {"inode", "1835017"}};
  std::string text;
  for (const auto& [key, value] : pairs) {
    text += key == leftOut ? "" : key + "=" + value + "\n";
  }
  return text;
}

// A record in which every field is told from a field that was read.
QUENDELLogConf_t Untouched() {
  QUENDELLogConf_t conf = {};
  conf.inode = 1;
  conf.last_byte = 2;
  conf.total_byte = 3;
  for (char* text : {conf.last_hash, conf.name, conf.path, conf.tar_log_inode}) {
    snprintf(text, 8, "before");
  }
  return conf;
}

// Reads the file of this text into an untouched record and expects success.
QUENDELLogConf_t Read(const std::string& text) {
  WriteFile(kConf, text);
  QUENDELLogConf_t conf = Untouched();
  EXPECT_EQ(QUENDELGetLogConf(kConf, &conf), 0);
  EXPECT_THAT(Log(), IsEmpty());
  return conf;
}

// The fields of a record in the order in which they are read.
std::vector<std::string> Fields(const QUENDELLogConf_t& conf) {
  return {conf.name,
          conf.path,
          conf.last_hash,
          conf.tar_log_inode,
          std::to_string(conf.last_byte),
          std::to_string(conf.total_byte),
          std::to_string(conf.inode)};
}

std::string WithValue(const std::string& key, const std::string& value) {
  return ConfWithout(key) + key + "=" + value + "\n";
}

}  // namespace

TEST(GetLogConfTest, ReadsTheSevenKeys) {
  EXPECT_THAT(Fields(Read(ConfWithout(""))),
              ElementsAre("messages", "/var/log/messages", kHash, "7,8", "87", "20480", "1835017"));
}

TEST(GetLogConfTest, HasItsFieldsInTheirOrderAndSizes) {
  EXPECT_EQ(offsetof(QUENDELLogConf_t, inode), 0u);
  EXPECT_LT(offsetof(QUENDELLogConf_t, inode), offsetof(QUENDELLogConf_t, last_byte));
  EXPECT_LT(offsetof(QUENDELLogConf_t, last_byte), offsetof(QUENDELLogConf_t, total_byte));
  EXPECT_LT(offsetof(QUENDELLogConf_t, total_byte), offsetof(QUENDELLogConf_t, last_hash));
  EXPECT_LT(offsetof(QUENDELLogConf_t, last_hash), offsetof(QUENDELLogConf_t, name));
  EXPECT_LT(offsetof(QUENDELLogConf_t, name), offsetof(QUENDELLogConf_t, path));
  EXPECT_LT(offsetof(QUENDELLogConf_t, path), offsetof(QUENDELLogConf_t, tar_log_inode));
  EXPECT_EQ(sizeof(QUENDELLogConf_t::inode), 4u);
  EXPECT_EQ(sizeof(QUENDELLogConf_t::last_byte), 8u);
  EXPECT_EQ(sizeof(QUENDELLogConf_t::total_byte), 8u);
  EXPECT_EQ(sizeof(QUENDELLogConf_t::last_hash), 64u);
  EXPECT_EQ(sizeof(QUENDELLogConf_t::name), 64u);
  EXPECT_EQ(sizeof(QUENDELLogConf_t::path), 256u);
  EXPECT_EQ(sizeof(QUENDELLogConf_t::tar_log_inode), 256u);
}

TEST(GetLogConfTest, StopsAtTheFirstKeyThatIsMissing) {
  const std::pair<std::string, std::string> missing[] = {{"name", "log name"},
                                                         {"path", "log path"},
                                                         {"last_hash", "last hash"},
                                                         {"tar_log_inode", "tar log inode"},
                                                         {"last_byte", "last log length"},
                                                         {"total_byte", "total byte"},
                                                         {"inode", "inode"}};
  const std::vector<std::string> before = Fields(Untouched());
  const std::vector<std::string> read = Fields(Read(ConfWithout("")));
  On("ALIBCErrGet").Return(1234);
  size_t found = 0;
  for (const auto& [key, words] : missing) {
    ClearLog();
    WriteFile(kConf, ConfWithout(key));
    QUENDELLogConf_t conf = Untouched();
    EXPECT_EQ(QUENDELGetLogConf(kConf, &conf), -1) << key;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to find " + words + " in conf '" + kConf +
                                                     "', ret = 1234")));
    std::vector<std::string> expected = before;
    std::copy_n(read.begin(), found, expected.begin());
    EXPECT_EQ(Fields(conf), expected) << key;
    ++found;
  }
}

TEST(GetLogConfTest, TakesAnEmptyValueForAMissingKey) {
  WriteFile(kConf, WithValue("tar_log_inode", ""));
  QUENDELLogConf_t conf = Untouched();
  EXPECT_EQ(QUENDELGetLogConf(kConf, &conf), -1);
  EXPECT_EQ(Log().size(), 1u);
}

TEST(GetLogConfTest, FailsForAMissingFile) {
  QUENDELLogConf_t conf = Untouched();
  EXPECT_EQ(QUENDELGetLogConf(kConf, &conf), -1);
  EXPECT_EQ(Fields(conf), Fields(Untouched()));
  ASSERT_EQ(Log().size(), 1u);
  EXPECT_THAT(Log()[0].message, testing::StartsWith("Failed to find log name in conf '"));
}

TEST(GetLogConfTest, NeedsARecord) {
  WriteFile(kConf, ConfWithout(""));
  EXPECT_EQ(QUENDELGetLogConf(kConf, nullptr), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Bad parameter")));
}

TEST(GetLogConfTest, TakesTheResetValueForTextsAndForZero) {
  const QUENDELLogConf_t conf = Read(
      "name=m\npath=/m\nlast_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\ntotal_byte=\"\"\n"
      "inode=\"\"\n");
  EXPECT_THAT(Fields(conf), ElementsAre("m", "/m", "\"\"", "\"\"", "0", "0", "0"));
}

TEST(GetLogConfTest, ReadsNumbersFromTheStartOfTheText) {
  EXPECT_EQ(Read(WithValue("total_byte", "12abc")).total_byte, 12);
  EXPECT_EQ(Read(WithValue("total_byte", "abc12")).total_byte, 0);
  EXPECT_EQ(Read(WithValue("total_byte", "0x10")).total_byte, 0);
  EXPECT_EQ(Read(WithValue("last_byte", "010")).last_byte, 10);
  EXPECT_EQ(Read(WithValue("last_byte", "-5")).last_byte, 0);
  EXPECT_EQ(Read(WithValue("inode", "-5")).inode, 0u);
}

TEST(GetLogConfTest, HoldsOffsetsBeyondFourGibibytes) {
  EXPECT_EQ(Read(WithValue("total_byte", "9007199254740993")).total_byte, 9007199254740993);
  EXPECT_EQ(Read(WithValue("last_byte", "4294967296")).last_byte, 4294967296);
}

TEST(GetLogConfTest, KeepsTheLow32BitsOfAnInode) {
  EXPECT_EQ(Read(WithValue("inode", "4294967295")).inode, 4294967295u);
  EXPECT_EQ(Read(WithValue("inode", "4294967296")).inode, 0u);
  EXPECT_EQ(Read(WithValue("inode", "4294967303")).inode, 7u);
}

TEST(GetLogConfTest, CutsTextsToTheirFields) {
  const std::string longText(300, 'x');
  EXPECT_EQ(Read(WithValue("name", longText)).name, std::string(63, 'x'));
  EXPECT_EQ(Read(WithValue("last_hash", longText)).last_hash, std::string(63, 'x'));
  EXPECT_EQ(Read(WithValue("path", longText)).path, std::string(255, 'x'));
  EXPECT_EQ(Read(WithValue("tar_log_inode", longText)).tar_log_inode, std::string(255, 'x'));
}
