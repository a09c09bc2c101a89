// Who the device is: serial number, services, account.
#include "platform/device.h"

#include <gmock/gmock.h>

#include <cstring>
#include <string>
#include <vector>

#include "platform/account.h"
#include "platform/error.h"
#include "support/appliance.h"

using namespace quendel::test;

namespace {

constexpr char kDeviceConf[] = "/usr/arvo/etc/device.conf";

std::vector<char> EmptyRecord() {
  return std::vector<char>(platform::kAccountRecordBytes);
}

std::string TextAt(const std::vector<char>& record, size_t offset) {
  return &record[offset];
}

}  // namespace

TEST(GetSerialNumberTest, ReadsTheSerialNumber) {
  WriteFile(kDeviceConf, "serial_number=S1\n");
  char buf[36] = {};
  EXPECT_EQ(ALIBGetSerialNumber(buf, sizeof(buf)), 0);
  EXPECT_STREQ(buf, "S1");
}

TEST(GetSerialNumberTest, CutsALongOne) {
  WriteFile(kDeviceConf, "serial_number=0123456789\n");
  char buf[] = "_______";
  EXPECT_EQ(ALIBGetSerialNumber(buf, 5), 0);
  EXPECT_EQ(std::string(buf, 7), std::string("0123\0__", 7));
}

TEST(GetSerialNumberTest, FailsWithoutOne) {
  char buf[] = "old";
  EXPECT_LT(ALIBGetSerialNumber(buf, sizeof(buf)), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  for (const char* text : {"", "serial_number=\n", "other=1\n"}) {
    WriteFile(kDeviceConf, text);
    EXPECT_LT(ALIBGetSerialNumber(buf, sizeof(buf)), 0) << text;
    EXPECT_EQ(ALIBCErrGet(), 0x0301);
  }
  EXPECT_STREQ(buf, "old");
}

TEST(GetSerialNumberTest, RefusesNoRoom) {
  WriteFile(kDeviceConf, "serial_number=S1\n");
  char buf[] = "old";
  EXPECT_LT(ALIBGetSerialNumber(buf, 0), 0);
  EXPECT_LT(ALIBGetSerialNumber(nullptr, 4), 0);
  EXPECT_STREQ(buf, "old");
}

TEST(ServiceIsEnabledTest, TakesYesOnly) {
  WriteFile(kDeviceConf,
            "service_a=yes\nservice_b=no\nservice_c=YES\nservice_d=\nservice_e=yes!\n");
  EXPECT_EQ(ALIBServiceIsEnabled("a"), 1);
  for (const char* name : {"b", "c", "d", "e", "f", ""}) {
    EXPECT_EQ(ALIBServiceIsEnabled(name), 0) << name;
  }
}

TEST(ServiceIsEnabledTest, TakesNothingForDisabled) {
  EXPECT_EQ(ALIBServiceIsEnabled("a"), 0);
  EXPECT_EQ(ALIBServiceIsEnabled(nullptr), 0);
}

TEST(AccountGetTest, FillsTheTextsAtTheirPlaces) {
  SetIdentity();
  std::vector<char> record = EmptyRecord();
  EXPECT_EQ(ARVOMYHUBAccountGet(record.data()), 0);
  EXPECT_EQ(TextAt(record, 0), "mail1");
  EXPECT_EQ(TextAt(record, 8192), "a1");
  EXPECT_EQ(TextAt(record, 12288), "b2");
}

TEST(AccountGetTest, CutsEachTextToItsRoom) {
  SetIdentity({{"account_email", std::string(20000, 'm')},
               {"account_field_a", std::string(20000, 'a')},
               {"account_field_b", std::string(20000, 'b')}});
  std::vector<char> record = EmptyRecord();
  EXPECT_EQ(ARVOMYHUBAccountGet(record.data()), 0);
  EXPECT_EQ(TextAt(record, 0), std::string(8191, 'm'));
  EXPECT_EQ(TextAt(record, 8192), std::string(4095, 'a'));
  EXPECT_EQ(TextAt(record, 12288), std::string(7967, 'b'));
}

TEST(AccountGetTest, LeavesMissingFieldsEmpty) {
  SetIdentity({{"account_email", "mail1"}});
  std::vector<char> record(platform::kAccountRecordBytes, 'x');
  EXPECT_EQ(ARVOMYHUBAccountGet(record.data()), 0);
  EXPECT_EQ(TextAt(record, 0), "mail1");
  EXPECT_EQ(TextAt(record, 8192), "");
  EXPECT_EQ(TextAt(record, 12288), "");
}

TEST(AccountGetTest, FailsWithoutAnAccount) {
  std::vector<char> record = EmptyRecord();
  EXPECT_LT(ARVOMYHUBAccountGet(record.data()), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  SetIdentity({{"account_email", ""}, {"account_field_a", "a1"}});
  EXPECT_LT(ARVOMYHUBAccountGet(record.data()), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0700);
  EXPECT_EQ(record, EmptyRecord());
}

TEST(AccountGetTest, RefusesNoRecord) {
  SetIdentity();
  EXPECT_LT(ARVOMYHUBAccountGet(nullptr), 0);
}
