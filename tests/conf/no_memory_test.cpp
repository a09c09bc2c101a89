// What the settings and the small helpers make of a lack of memory.
#include <gmock/gmock.h>

#include "platform/owned.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/log.h"
#include "support/scarce_memory.h"

using namespace quendel::test;
using testing::ElementsAre;

namespace {

// Longer than what a std::string holds without memory of its own.
constexpr char kHost[] = "a-host-of-more-than-15.bytes";

}  // namespace

TEST(ConfNoMemoryTest, IsNoEmptyContactList) {
  WriteFile("/usr/arvo/etc/quendel.conf", "contact=[{\"name\":\"more than fifteen bytes\"}]\n");
  QUENDELConf_t conf;
  WithEachAllocationFailing(
      [&] {
        conf.contact = "before";
        return QUENDELGetConf(&conf);
      },
      [&](int result) {
        EXPECT_EQ(result, -1);
        EXPECT_EQ(conf.contact, "before");
        EXPECT_THAT(
            Log(), ElementsAre(Logged("quendel_get_conf",
                                      testing::AnyOf("Fail to allocate memory for alibc hash",
                                                     "Failed to get quendel configuration file"))));
      });
}

TEST(ConfNoMemoryTest, GivesNoHost) {
  WriteFile("/etc.defaults/arvoinfo.conf", std::string("quendel_server=") + kHost + "\n");
  ASSERT_EQ(QUENDELGetServerHost(), kHost);
  FailAllocation(1);
  const std::string host = QUENDELGetServerHost();
  EXPECT_TRUE(AllocateFreely());
  EXPECT_EQ(host, "");
}

// A URL without its host would name a machine by the first piece of its path.
TEST(ConfNoMemoryTest, LeavesNoUrlWithoutItsHost) {
  WriteFile("/etc.defaults/arvoinfo.conf", std::string("quendel_server=") + kHost + "\n");
  ASSERT_EQ(QUENDELGetServerHost(), kHost);
  const std::vector<std::string> pieces = {"heartbeat", "S1"};
  WithEachAllocationFailing(
      [&] { return QUENDELGenerateReq(pieces).empty() ? -1 : 0; },
      [](int result) { EXPECT_EQ(result, -1) << "a URL that lacks something"; });
  EXPECT_EQ(QUENDELGenerateReq(pieces), std::string("https://") + kHost + "/heartbeat/S1");
}

TEST(ConfNoMemoryTest, LeavesAnEmptyHashValue) {
  platform::OwnedHash hash(16);
  ASSERT_GE(ALIBCSzHashSetValue(hash.slot(), "key", "a value of more than fifteen bytes"), 0);
  FailAllocation(1);
  const std::string value = QUENDELGetHashValue(hash.get(), "key");
  EXPECT_TRUE(AllocateFreely());
  EXPECT_EQ(value, "");
}

TEST(ConfNoMemoryTest, LeavesNoDigits) {
  const unsigned char bytes[64] = {};
  std::string hex = "what was there";
  FailAllocation(1);
  QUENDELBytesToHex(hex, bytes, sizeof bytes);
  EXPECT_TRUE(AllocateFreely());
  EXPECT_EQ(hex, "");
}
