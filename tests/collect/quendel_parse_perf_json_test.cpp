// The files that are made of a performance series.
#include <gmock/gmock.h>
#include <unistd.h>

#include "quendel.h"
#include "support/appliance.h"
#include "support/json.h"
#include "support/log.h"

using namespace quendel::test;
using testing::AllOf;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

constexpr char kUnit[] = "quendel_parse_perf_json";
constexpr char kDir[] = "/tmp/perf";
constexpr char kNoTime[] = "Failed to get perf time in json";
const std::vector<std::string> kCategories = {"iSCSI",   "System",  "DiskIO",
                                              "SpaceIO", "Network", "Memory"};

std::string PathOf(const std::string& category) {
  return std::string(kDir) + "/quendel.perf." + category;
}

// A sample with figures of every category, marked with a number.
Json::Value Sample(int mark) {
  Json::Value sample;
  sample["success"] = true;
  Json::Value& data = sample["perf_data"]["data"];
  data["time"] = 1000 + mark;
  for (const std::string& category : kCategories) {
    data[category]["figure"] = category + std::to_string(mark);
  }
  return sample;
}

// What Sample(mark) gives in the file of a category.
Json::Value EntryOf(int mark, const std::string& category) {
  Json::Value entry;
  entry["time"] = 1000 + mark;
  entry["data"]["figure"] = category + std::to_string(mark);
  return entry;
}

Json::Value EntriesOf(const std::vector<int>& marks, const std::string& category) {
  Json::Value entries;
  for (int mark : marks) {
    entries.append(EntryOf(mark, category));
  }
  return entries;
}

void MakeDir() {
  WriteFile(std::string(kDir) + "/.keep", "");
}

int Parse(const Json::Value& series) {
  MakeDir();
  return QUENDELParsePerfJson(kDir, series);
}

void ExpectEveryFileNull() {
  for (const std::string& category : kCategories) {
    EXPECT_EQ(ReadFile(PathOf(category)), "null");
  }
}

// Parses one sample that has nothing to offer and no fault to log.
void ExpectSkipped(const Json::Value& sample) {
  Json::Value series;
  series["perf_0"] = sample;
  EXPECT_EQ(Parse(series), 0);
  ExpectEveryFileNull();
  EXPECT_THAT(Log(), IsEmpty()) << sample.toStyledString();
}

// Parses one sample that counts and has no time.
void ExpectNoTime(const Json::Value& perfData) {
  ClearLog();
  Json::Value series;
  series["perf_0"]["success"] = true;
  series["perf_0"]["perf_data"] = perfData;
  EXPECT_EQ(Parse(series), 0);
  ExpectEveryFileNull();
  EXPECT_THAT(Log(), AllOf(SizeIs(6), Each(Logged(kUnit, kNoTime)))) << perfData.toStyledString();
}

}  // namespace

TEST(ParsePerfJsonTest, WritesAnEntryOfEverySampleIntoEveryFile) {
  Json::Value series;
  series["perf_0"] = Sample(0);
  series["perf_1"] = Sample(1);
  EXPECT_EQ(Parse(series), 0);
  for (const std::string& category : kCategories) {
    EXPECT_EQ(JsonOf(ReadFile(PathOf(category))), EntriesOf({0, 1}, category));
  }
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ParsePerfJsonTest, WritesNullsForAnEmptySeries) {
  EXPECT_EQ(Parse(Json::Value(Json::objectValue)), 0);
  ExpectEveryFileNull();
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ParsePerfJsonTest, TakesASeriesThatIsNoObjectForAnEmptyOne) {
  for (const char* series : {"null", "[{}]", "\"perf_0\"", "7", "true"}) {
    EXPECT_EQ(Parse(JsonOf(series)), 0);
    ExpectEveryFileNull();
    EXPECT_THAT(Log(), IsEmpty()) << series;
  }
}

TEST(ParsePerfJsonTest, StopsAtTheFirstMissingNumber) {
  Json::Value series;
  series["perf_0"] = Sample(0);
  series["perf_2"] = Sample(2);
  EXPECT_EQ(Parse(series), 0);
  for (const std::string& category : kCategories) {
    EXPECT_EQ(JsonOf(ReadFile(PathOf(category))), EntriesOf({0}, category));
  }
}

TEST(ParsePerfJsonTest, CountsFromZero) {
  Json::Value series;
  series["perf_1"] = Sample(1);
  EXPECT_EQ(Parse(series), 0);
  ExpectEveryFileNull();
}

TEST(ParsePerfJsonTest, KeepsTheOrderOfManySamples) {
  Json::Value series;
  std::vector<int> marks;
  for (int mark = 0; mark < 120; ++mark) {
    series["perf_" + std::to_string(mark)] = Sample(mark);
    marks.push_back(mark);
  }
  EXPECT_EQ(Parse(series), 0);
  EXPECT_EQ(JsonOf(ReadFile(PathOf("DiskIO"))), EntriesOf(marks, "DiskIO"));
}

TEST(ParsePerfJsonTest, SkipsASampleWithoutSuccessInSilence) {
  Json::Value sample = Sample(0);
  for (const char* success : {"false", "null", "0", "0.0", "\"true\"", "[true]", "{}"}) {
    sample["success"] = JsonOf(success);
    ExpectSkipped(sample);
  }
  sample.removeMember("success");
  ExpectSkipped(sample);
}

TEST(ParsePerfJsonTest, SkipsASampleThatIsNoObjectInSilence) {
  for (const char* sample : {"null", "[]", "[true]", "\"success\"", "1", "true", "{}"}) {
    ExpectSkipped(JsonOf(sample));
  }
}

TEST(ParsePerfJsonTest, TakesANumberOtherThanZeroForSuccess) {
  Json::Value series;
  series["perf_0"] = Sample(0);
  series["perf_0"]["success"] = 1;
  EXPECT_EQ(Parse(series), 0);
  EXPECT_EQ(JsonOf(ReadFile(PathOf("Memory"))), EntriesOf({0}, "Memory"));
}

TEST(ParsePerfJsonTest, GoesOnAfterASkippedSample) {
  Json::Value series;
  series["perf_0"]["success"] = false;
  series["perf_1"] = Sample(1);
  EXPECT_EQ(Parse(series), 0);
  EXPECT_EQ(JsonOf(ReadFile(PathOf("System"))), EntriesOf({1}, "System"));
}

TEST(ParsePerfJsonTest, LeavesASampleOutOfTheFileItHasNoFiguresFor) {
  Json::Value series;
  series["perf_0"] = Sample(0);
  series["perf_0"]["perf_data"]["data"].removeMember("SpaceIO");
  EXPECT_EQ(Parse(series), 0);
  for (const char* category : {"iSCSI", "System", "DiskIO", "Network", "Memory"}) {
    EXPECT_EQ(JsonOf(ReadFile(PathOf(category))), EntriesOf({0}, category));
  }
  EXPECT_EQ(ReadFile(PathOf("SpaceIO")), "null");
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to ger SpaceIO perf object in json")));
}

TEST(ParsePerfJsonTest, LogsMissingFiguresSampleBySample) {
  Json::Value series;
  series["perf_0"] = Sample(0);
  series["perf_0"]["perf_data"]["data"].removeMember("Memory");
  series["perf_0"]["perf_data"]["data"].removeMember("iSCSI");
  series["perf_1"] = series["perf_0"];
  EXPECT_EQ(Parse(series), 0);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to ger iSCSI perf object in json"),
                                 Logged(kUnit, "Failed to ger Memory perf object in json"),
                                 Logged(kUnit, "Failed to ger iSCSI perf object in json"),
                                 Logged(kUnit, "Failed to ger Memory perf object in json")));
}

TEST(ParsePerfJsonTest, LeavesASampleWithoutATimeOutOfEveryFile) {
  Json::Value perfData = Sample(0)["perf_data"];
  perfData["data"].removeMember("time");
  ExpectNoTime(perfData);
}

TEST(ParsePerfJsonTest, TakesWhatIsNoObjectOnTheWayForAMissingTime) {
  for (const char* perfData :
       {"null", "[]", "7", "\"data\"", "true", "{}", R"({"data":null})", R"({"data":[]})",
        R"({"data":[{"time":1}]})", R"({"data":"time"})", R"({"data":1})"}) {
    ExpectNoTime(JsonOf(perfData));
  }
}

TEST(ParsePerfJsonTest, CopiesTimesAndFiguresOfAnyKind) {
  for (const char* any : {"null", "true", "-1.5", "\"text \\u0000 \\u00e9\"", "[1,[]]", "{}"}) {
    Json::Value series;
    series["perf_0"] = Sample(0);
    series["perf_0"]["perf_data"]["data"]["time"] = JsonOf(any);
    series["perf_0"]["perf_data"]["data"]["Network"] = JsonOf(any);
    EXPECT_EQ(Parse(series), 0);
    Json::Value entry;
    entry["time"] = JsonOf(any);
    entry["data"] = JsonOf(any);
    EXPECT_EQ(JsonOf(ReadFile(PathOf("Network")))[0], entry);
    EXPECT_THAT(Log(), IsEmpty()) << any;
  }
}

TEST(ParsePerfJsonTest, ReplacesAnOlderFile) {
  WriteFile(PathOf("iSCSI"), std::string(9999, 'x'));
  EXPECT_EQ(Parse(Json::Value()), 0);
  ExpectEveryFileNull();
}

TEST(ParsePerfJsonTest, FailsForEveryFileOfAMissingDirectory) {
  EXPECT_EQ(QUENDELParsePerfJson("/tmp/none", Json::Value()), -1);
  std::vector<testing::Matcher<LogLine>> lines;
  for (const std::string& category : kCategories) {
    lines.push_back(Logged(kUnit, "Failed to open file '/tmp/none/quendel.perf." + category + "'"));
    lines.push_back(Logged(kUnit, "Failed to write " + category + " perf data"));
  }
  EXPECT_THAT(Log(), testing::ElementsAreArray(lines));
}

TEST(ParsePerfJsonTest, WritesTheOtherFilesWhenOneCannotBeOpened) {
  WriteFile(PathOf("System") + "/a-folder-now", "");
  EXPECT_EQ(Parse(Json::Value()), -1);
  for (const char* category : {"iSCSI", "DiskIO", "SpaceIO", "Network", "Memory"}) {
    EXPECT_EQ(ReadFile(PathOf(category)), "null");
  }
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to open file '" + PathOf("System") + "'"),
                                 Logged(kUnit, "Failed to write System perf data")));
}

TEST(ParsePerfJsonTest, NoticesAFullDiskWhenASmallFileIsClosed) {
  MakeDir();
  ASSERT_EQ(symlink("/dev/full", PathOf("DiskIO").c_str()), 0);
  EXPECT_EQ(Parse(Json::Value()), -1);
  EXPECT_EQ(ReadFile(PathOf("Memory")), "null");
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to write DiskIO perf data")));
}

TEST(ParsePerfJsonTest, NoticesAFullDiskWhileALargeFileIsWritten) {
  MakeDir();
  ASSERT_EQ(symlink("/dev/full", PathOf("DiskIO").c_str()), 0);
  Json::Value series;
  series["perf_0"] = Sample(0);
  series["perf_0"]["perf_data"]["data"]["DiskIO"] = std::string(1 << 20, 'x');
  EXPECT_EQ(Parse(series), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to write DiskIO perf data")));
}
