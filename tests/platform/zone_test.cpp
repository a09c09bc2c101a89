// The device's time zone and its description.
#include "platform/zone.h"

#include <gmock/gmock.h>
#include <unistd.h>

#include <string>

#include "platform/error.h"
#include "support/appliance.h"

using namespace quendel::test;

namespace {

// What the description of a zone is, or "(failed)".
std::string Description(const std::string& zone) {
  char desc[256] = "old";
  return ARVOZoneDesc(zone.c_str(), desc, sizeof(desc)) < 0 ? "(failed)" : desc;
}

// What the configured zone is, or "(failed)".
std::string Configured() {
  char zone[256] = "old";
  int index = -2;
  return ARVOZoneGet(zone, sizeof(zone), &index) < 0 ? "(failed)" : zone;
}

int IndexOf(const std::string& zone) {
  SetIdentity({{"timezone", zone}});
  char name[256];
  int index = -2;
  EXPECT_EQ(ARVOZoneGet(name, sizeof(name), &index), 0);
  return index;
}

}  // namespace

TEST(ZoneGetTest, TakesTheDevicesOwnSetting) {
  SetIdentity({{"timezone", "Asia/Kolkata"}});
  EXPECT_EQ(Configured(), "Asia/Kolkata");
}

TEST(ZoneGetTest, TakesTheSystemsNameNext) {
  WriteFile("/etc/timezone", "Europe/Berlin\n");
  EXPECT_EQ(Configured(), "Europe/Berlin");
  SetIdentity({{"timezone", ""}});
  EXPECT_EQ(Configured(), "Europe/Berlin");
}

TEST(ZoneGetTest, TakesTheSystemsLinkLast) {
  RemoveFile("/etc/timezone");
  RemoveFile("/etc/localtime");
  ASSERT_EQ(symlink("/usr/share/zoneinfo/America/New_York", "/etc/localtime"), 0);
  EXPECT_EQ(Configured(), "America/New_York");
  RemoveFile("/etc/localtime");
  ASSERT_EQ(symlink("../usr/share/zoneinfo/Etc/UTC", "/etc/localtime"), 0);
  EXPECT_EQ(Configured(), "Etc/UTC");
}

TEST(ZoneGetTest, FailsWhereNoneIsConfigured) {
  RemoveFile("/etc/timezone");
  RemoveFile("/etc/localtime");
  EXPECT_EQ(Configured(), "(failed)");
  EXPECT_EQ(ALIBCErrGet(), 0x0900);
  WriteFile("/etc/localtime", "a copy of the data has no name");
  EXPECT_EQ(Configured(), "(failed)");
}

TEST(ZoneGetTest, FailsForASettingThatIsNoName) {
  for (const char* zone : {"../../etc/passwd", "/etc/passwd", "Europe/Ber lin", "a.b"}) {
    SetIdentity({{"timezone", zone}});
    EXPECT_EQ(Configured(), "(failed)") << zone;
  }
}

TEST(ZoneGetTest, CutsALongName) {
  SetIdentity({{"timezone", "Europe/Berlin"}});
  char zone[] = "_________";
  EXPECT_EQ(ARVOZoneGet(zone, 7, nullptr), 0);
  EXPECT_EQ(std::string(zone, 9), std::string("Europe\0__", 9));
}

TEST(ZoneGetTest, TellsThePlaceInTheTable) {
  // The table begins with Andorra and the Emirates; it has no row for a zone without a place.
  EXPECT_EQ(IndexOf("Europe/Andorra"), 0);
  EXPECT_EQ(IndexOf("Asia/Dubai"), 1);
  EXPECT_GT(IndexOf("Europe/Berlin"), 1);
  EXPECT_EQ(IndexOf("Etc/UTC"), -1);
}

TEST(ZoneGetTest, RefusesNoRoom) {
  SetIdentity({{"timezone", "Etc/UTC"}});
  char zone[] = "old";
  EXPECT_LT(ARVOZoneGet(nullptr, 4, nullptr), 0);
  EXPECT_LT(ARVOZoneGet(zone, 0, nullptr), 0);
  EXPECT_STREQ(zone, "old");
}

TEST(ZoneDescTest, TellsTheOffsetOfWinterTime) {
  EXPECT_EQ(Description("Europe/Berlin"), "(GMT+01:00) Europe/Berlin");
  EXPECT_EQ(Description("America/New_York"), "(GMT-05:00) America/New_York");
  EXPECT_EQ(Description("Australia/Sydney"), "(GMT+10:00) Australia/Sydney");
  EXPECT_EQ(Description("Asia/Tokyo"), "(GMT+09:00) Asia/Tokyo");
}

TEST(ZoneDescTest, TellsOffsetsThatAreNoWholeHours) {
  EXPECT_EQ(Description("Asia/Kolkata"), "(GMT+05:30) Asia/Kolkata");
  EXPECT_EQ(Description("Asia/Kathmandu"), "(GMT+05:45) Asia/Kathmandu");
  EXPECT_EQ(Description("America/St_Johns"), "(GMT-03:30) America/St_Johns");
  EXPECT_EQ(Description("Australia/Lord_Howe"), "(GMT+10:30) Australia/Lord_Howe");
}

TEST(ZoneDescTest, TellsGreenwichTime) {
  EXPECT_EQ(Description("Etc/UTC"), "(GMT+00:00) Etc/UTC");
  EXPECT_EQ(Description("UTC"), "(GMT+00:00) UTC");
  EXPECT_EQ(Description("Europe/London"), "(GMT+00:00) Europe/London");
  // Its data calls the winter time the one that is saved.
  EXPECT_EQ(Description("Europe/Dublin"), "(GMT+00:00) Europe/Dublin");
}

TEST(ZoneDescTest, TellsFixedOffsets) {
  EXPECT_EQ(Description("Etc/GMT+5"), "(GMT-05:00) Etc/GMT+5");
  EXPECT_EQ(Description("Etc/GMT-14"), "(GMT+14:00) Etc/GMT-14");
  EXPECT_EQ(Description("America/Argentina/Buenos_Aires"),
            "(GMT-03:00) America/Argentina/Buenos_Aires");
}

TEST(ZoneDescTest, FailsForWhatIsNoZone) {
  for (const char* zone :
       {"", "Nowhere/Town", "Europe", "zone.tab", "tzdata.zi", "../zoneinfo/Etc/UTC", "./Etc/UTC",
        "/usr/share/zoneinfo/Etc/UTC", "Etc/UTC ", "Etc/../Etc/UTC"}) {
    EXPECT_EQ(Description(zone), "(failed)") << zone;
    EXPECT_EQ(ALIBCErrGet(), 0x0900);
  }
}

TEST(ZoneDescTest, FailsForDataThatHoldsNoRule) {
  const std::string path = "/usr/share/zoneinfo/Test";
  for (const char* data :
       {"", "TZif", "TZif\n", "TZif2\n\n", "TZif2\nCET\n", "TZif2\n-1\n", "TZif2\n<+01-1\n",
        "TZif2\nCET-1000\n", "TZif2\nCET-1:\n", "TZif2\nCET-1+\n", "TZif2\nCET-1CEST+,M3\n",
        "xZif2\nCET-1\n", "TZif2\nCET-1"}) {
    WriteFile(path, data);
    EXPECT_EQ(Description("Test"), "(failed)") << data;
  }
  WriteFile(path, "TZif2\nCET-1\n");
  EXPECT_EQ(Description("Test"), "(GMT+01:00) Test");
  WriteFile(path, "TZif2\n<+0130>-1:30:30<+02>-1:45,M3.5.0,M10.5.0\n");
  EXPECT_EQ(Description("Test"), "(GMT+01:30) Test");
  WriteFile(path, "TZif2\n<x>+3\n");
  EXPECT_EQ(Description("Test"), "(GMT-03:00) Test");
}

TEST(ZoneDescTest, CutsALongDescription) {
  char desc[] = "______________";
  EXPECT_EQ(ARVOZoneDesc("Etc/UTC", desc, 12), 0);
  EXPECT_EQ(std::string(desc, 14), std::string("(GMT+00:00)\0__", 14));
}

TEST(ZoneDescTest, RefusesNoRoom) {
  char desc[] = "old";
  EXPECT_LT(ARVOZoneDesc("Etc/UTC", desc, 0), 0);
  EXPECT_LT(ARVOZoneDesc("Etc/UTC", nullptr, 4), 0);
  EXPECT_LT(ARVOZoneDesc(nullptr, desc, 4), 0);
  EXPECT_STREQ(desc, "old");
}
