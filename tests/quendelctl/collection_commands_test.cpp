// collect, perf, conf, tar and send: what they do, what they print and how they end.
#include <gmock/gmock.h>
#include <json/reader.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <ctime>
#include <filesystem>
#include <functional>
#include <thread>

#include "quendelctl/run_quendelctl.h"
#include "support/appliance.h"
#include "support/device.h"
#include "support/server.h"

using namespace quendel::test;
using testing::AllOf;
using testing::ContainsRegex;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;

namespace {

namespace fs = std::filesystem;

constexpr char kMessages[] = "/usr/arvo/etc/quendel/quendel.log.messages";
constexpr char kRaid[] = "/usr/arvo/etc/quendel/quendel.udc.raid";
constexpr char kPidFile[] = "/volume1/collector.pid";
constexpr char kHash[] = "0123456789abcdef0123456789abcdef";

std::string LogSettings(const std::string& name, const std::string& path, const std::string& hash,
                        const std::string& offset, const std::string& inode) {
  return "name=" + name + "\npath=" + path + "\nlast_hash=" + hash +
         "\ntar_log_inode=\"\"\nlast_byte=0\ntotal_byte=" + offset + "\ninode=" + inode + "\n";
}

void InstallLogOf(const std::string& name, const std::string& text) {
  WriteFile("/volume1/" + name, text);
  InstallLog(name, "/volume1/" + name);
}

std::vector<std::string> RunFiles() {
  std::vector<std::string> paths;
  for (const auto& entry : fs::directory_iterator("/tmp")) {
    if (entry.path().filename().string().rfind("quendel_", 0) == 0) {
      paths.push_back(entry.path());
    }
  }
  std::sort(paths.begin(), paths.end());
  return paths;
}

bool HasMarkers() {
  const auto isMarker = [](const fs::directory_entry& entry) {
    return entry.path().filename().string().find(".p.") != std::string::npos;
  };
  return std::any_of(fs::directory_iterator("/tmp/quendel"), fs::directory_iterator(), isMarker);
}

bool Within(std::chrono::seconds limit, const std::function<bool()>& holds) {
  const auto end = std::chrono::steady_clock::now() + limit;
  while (!holds()) {
    if (std::chrono::steady_clock::now() > end) {
      return false;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  return true;
}

pid_t CollectorPid() {
  const std::string text = Exists(kPidFile) ? ReadFile(kPidFile) : "";
  return !text.empty() && text.back() == '\n' ? std::stoi(text) : 0;
}

// A collector that writes its process id down and does not end by itself.
constexpr char kNeverEnds[] = "echo $$ > /volume1/collector.pid; exec sleep 1000";

bool CollectorEnds() {
  const pid_t collector = CollectorPid();
  return collector > 0 &&
         Within(std::chrono::seconds(5), [=] { return kill(collector, 0) != 0 && errno == ESRCH; });
}

// Sends the signal to quendelctl as soon as its collector is at work.
Output CollectAndSignal(const std::string& signalName, const std::string& arguments = "") {
  return Shell("$quendelctl collect " + arguments + " & tool=$!; i=0; while [ ! -s " + kPidFile +
               " ] && [ $i -lt 500 ]; do sleep 0.02; i=$((i+1)); done; kill -" + signalName +
               " $tool; wait $tool");
}

Json::Value FromJson(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(Json::Reader(Json::Features::strictMode()).parse(text, value)) << text;
  return value;
}

// Makes the next run fail before its collectors start: it finds files where its directories are to
// be, in any of the seconds that it may start in.
void OccupyRunNames() {
  const time_t now = time(nullptr);
  for (time_t second = now; second < now + 60; ++second) {
    char name[64];
    strftime(name, sizeof name, "/tmp/quendel_%Y%m%d_%H%M%S_0", localtime(&second));
    WriteFile(name, "");
  }
}

class CollectorsTest : public testing::Test {
 protected:
  void SetUp() override {
    SetIdentity();
    InstallLogOf("messages", "first\nsecond\n");
    InstallUdc("raid", "echo '{\"disks\":4}'");
  }
};

using CollectCommandTest = CollectorsTest;
using ConfCommandTest = CollectorsTest;
using SendCommandTest = CollectorsTest;

void ExpectUsageError(const std::vector<std::string>& arguments, const std::string& complaint,
                      const std::string& input = "") {
  const Output output = Quendelctl(arguments, input);
  EXPECT_EQ(output.status, 2) << complaint;
  EXPECT_THAT(output.out, IsEmpty());
  EXPECT_THAT(output.err, HasSubstr("quendelctl: " + complaint));
}

}  // namespace

TEST_F(CollectCommandTest, CollectsAndLeavesNothingBehind) {
  const Output output = Quendelctl({"collect"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "The collection is complete.\n1 log has something new: messages\n");
  EXPECT_THAT(output.err, StartsWith("quendelctl: "));
  EXPECT_THAT(ReadFile(kMessages), HasSubstr("total_byte=13\n"));
  EXPECT_THAT(ReadFile(kRaid), ContainsRegex("last_hash=[0-9a-f]{32}\n"));
  EXPECT_THAT(RunFiles(), IsEmpty());
  EXPECT_FALSE(HasMarkers());
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(CollectCommandTest, KeepsTheRunAndTellsWhereItIs) {
  const Output output = Quendelctl({"collect", "--keep"});
  EXPECT_EQ(output.status, 0);
  const std::vector<std::string> files = RunFiles();
  ASSERT_THAT(files, SizeIs(2));
  EXPECT_EQ(output.out,
            "The collection is complete.\n1 log has something new: messages\n"
            "Run directory: " +
                files[0] + "\nArchive: " + files[1] + "\n");
  EXPECT_EQ(files[1], files[0] + ".tar.xz");
  EXPECT_EQ(ReadFile(files[0] + "/log/messages"), "first\nsecond\n");
  EXPECT_EQ(Shell("tar -xOJf " + files[1] + " --wildcards '*/log/messages'").out,
            "first\nsecond\n");
}

TEST_F(CollectCommandTest, TellsTheArchiveOfThisRunAmongOthers) {
  ASSERT_EQ(Quendelctl({"collect", "--keep"}).status, 0);
  const std::vector<std::string> older = RunFiles();
  const Output output = Quendelctl({"collect", "--keep", "--json"});
  const std::string archive = FromJsonLine(output.out)["archive"].asString();
  EXPECT_TRUE(Exists(archive));
  EXPECT_EQ(std::count(older.begin(), older.end(), archive), 0);
}

TEST_F(CollectCommandTest, PrintsJson) {
  InstallLogOf("second", "x\n");
  WriteFile("/volume1/second.1", "old\n");
  ASSERT_EQ(Shell("xz /volume1/second.1").status, 0);
  const Output output = Quendelctl({"collect", "--keep", "--json"});
  EXPECT_EQ(output.status, 0);
  const std::vector<std::string> files = RunFiles();
  ASSERT_THAT(files, SizeIs(2));
  Json::Value expected;
  expected["success"] = true;
  expected["interrupted"] = false;
  expected["sent"] = false;
  expected["run_directory"] = files[0];
  expected["archive"] = files[1];
  expected["bytes"] = static_cast<Json::UInt64>(fs::file_size(files[1]));
  expected["logs_collected"].append("messages");
  expected["logs_collected"].append("second");  // once, though its archive came as well
  expected["logs_sent"] = Json::arrayValue;
  expected["not_recorded"] = Json::arrayValue;
  EXPECT_EQ(FromJsonLine(output.out), FromJson(expected.toStyledString()));
  EXPECT_TRUE(Exists(files[0] + "/log/second.1.xz"));
}

TEST_F(CollectCommandTest, SaysWhenNoLogHasAnythingNew) {
  ASSERT_EQ(Quendelctl({"collect"}).status, 0);
  const Output output = Quendelctl({"collect", "--keep"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.out, HasSubstr("\nNo log had anything new.\n"));
}

TEST_F(CollectCommandTest, SendsTheArchive) {
  const Output output = Quendelctl({"collect", "--send", "--keep", "--json"});
  EXPECT_EQ(output.status, 0);
  const Json::Value told = FromJsonLine(output.out);
  EXPECT_EQ(told["sent"], true);
  EXPECT_EQ(told["logs_sent"], FromJson("[\"messages\"]"));
  const std::vector<Request> requests = Requests();
  ASSERT_THAT(requests, SizeIs(1));
  EXPECT_EQ(requests[0].line, "POST /collect/a1/b2/S1 HTTP/1.1");
  EXPECT_THAT(requests[0].body, HasSubstr(ReadFile(told["archive"].asString())));
}

TEST_F(CollectCommandTest, TellsHowMuchTheServerAccepted) {
  const Output output = Quendelctl({"collect", "--send", "--keep"});
  EXPECT_THAT(output.out, HasSubstr("\nThe server accepted the archive of " +
                                    std::to_string(fs::file_size(RunFiles().at(1))) + " bytes.\n"));
}

TEST_F(CollectCommandTest, FailsWhenTheServerDeclines) {
  Answer({.body = R"({"success":false})"});
  const std::string settings = ReadFile(kMessages);
  const Output output = Quendelctl({"collect", "--send", "--json"});
  EXPECT_EQ(output.status, 1);
  const Json::Value told = FromJsonLine(output.out);
  EXPECT_EQ(told["success"], false);
  EXPECT_EQ(told["sent"], false);
  EXPECT_EQ(told["logs_sent"], Json::Value(Json::arrayValue));
  EXPECT_THAT(output.err, HasSubstr("quendel_start_collect:"));
  EXPECT_THAT(output.err, HasSubstr("Failed to send '/tmp/quendel_"));
  EXPECT_EQ(ReadFile(kMessages), settings);
  EXPECT_THAT(RunFiles(), IsEmpty());
}

TEST_F(CollectCommandTest, KeepsWhatTheServerDeclined) {
  Answer({.body = R"({"success":false})"});
  const Output output = Quendelctl({"collect", "--send", "--keep"});
  EXPECT_EQ(output.status, 1);
  ASSERT_THAT(RunFiles(), SizeIs(2));
  EXPECT_EQ(output.out, "The collection failed.\nRun directory: " + RunFiles()[0] +
                            "\nArchive: " + RunFiles()[1] + "\n");
}

TEST_F(CollectCommandTest, LeavesTheDirectoriesOfOtherRunsAlone) {
  InstallUdc("raid", "mkdir /tmp/quendel_other; echo '{}'");
  const Output output = Quendelctl({"collect"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out,
            "The collection is complete.\n"
            "Another run made a directory in /tmp meanwhile; both stay there.\n");
  EXPECT_THAT(RunFiles(), SizeIs(3));
}

TEST_F(CollectCommandTest, RemovesNothingWhenItsRunMadeNoDirectory) {
  WriteFile("/etc.defaults/arvoinfo.conf", "quendel_server=10.9.8.7\n");
  const Output output =
      Shell("(sleep 0.5; mkdir /tmp/quendel_other) & $quendelctl collect --send; exit $?");
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.err, HasSubstr("Failed to access server"));
  EXPECT_THAT(RunFiles(), ElementsAre("/tmp/quendel_other"));
}

TEST_F(CollectCommandTest, PutsThePerformanceSeriesIn) {
  const std::string series =
      R"({"perf_0":{"success":true,"perf_data":{"data":{"time":7,"Memory":{"free":1}}}}})";
  WriteFile("/volume1/series.json", series);
  for (const std::string& argument : {std::string("/volume1/series.json"), series}) {
    const Output output = Quendelctl({"collect", "--keep", "--json", "--perf", argument});
    EXPECT_EQ(output.status, 0);
    EXPECT_EQ(FromJson(ReadFile(FromJsonLine(output.out)["run_directory"].asString() +
                                "/perf/quendel.perf.Memory")),
              FromJson(R"([{"time":7,"data":{"free":1}}])"));
  }
}

TEST_F(CollectCommandTest, TakesWhatPerfPrints) {
  for (const std::string form : {"", " --json"}) {
    const Output output = Shell("$quendelctl perf --series 2" + form +
                                " | $quendelctl collect --keep --json --perf -");
    ASSERT_EQ(output.status, 0);
    const Json::Value figures = FromJson(ReadFile(
        FromJsonLine(output.out)["run_directory"].asString() + "/perf/quendel.perf.Memory"));
    ASSERT_EQ(figures.size(), 2U);
    EXPECT_GT(figures[1]["data"]["total_bytes"].asUInt64(), 0U);
  }
}

TEST_F(CollectCommandTest, RejectsASeriesThatIsNone) {
  ExpectUsageError({"collect", "--perf", "{"}, "--perf: not JSON: ");
  ExpectUsageError({"collect", "--perf", "-"}, "--perf: not a series of samples", "[1]");
  ExpectUsageError({"collect", "--perf", "/nowhere"}, "--perf: cannot read /nowhere");
  ExpectUsageError({"collect", "extra"}, "The following argument was not expected: extra");
  EXPECT_FALSE(Exists("/tmp/quendel"));
}

TEST_F(CollectCommandTest, SurvivesARunThatEndsItsGroup) {
  OccupyRunNames();
  const Output text = Quendelctl({"collect"});
  EXPECT_EQ(text.status, 1);
  EXPECT_EQ(text.out,
            "The collection failed: the run was ended by SIGTERM, which it sends itself when it "
            "fails before its collectors have started.\n");
  EXPECT_THAT(text.err, HasSubstr("Failed to create UDC collect dir '/tmp/quendel_"));
  const Output json = Quendelctl({"collect", "--json"});
  EXPECT_EQ(json.status, 1);
  EXPECT_EQ(FromJsonLine(json.out)["success"], false);
  EXPECT_EQ(FromJsonLine(json.out)["interrupted"], false);
}

TEST_F(CollectCommandTest, LeavesTheGroupOfItsCallerAlone) {
  OccupyRunNames();
  const Output output = Shell("$quendelctl collect >/dev/null 2>&1; echo status $?");
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "status 1\n");
}

TEST_F(CollectCommandTest, EndsTheCollectorsOfAWorkerThatWasKilled) {
  InstallUdc("raid",
             "echo $$ > /volume1/collector.pid; sleep 0.5; "
             "kill -KILL $(cut -d' ' -f4 /proc/$PPID/stat); exec sleep 1000");
  const std::string settings = ReadFile(kRaid);
  const Output output = Quendelctl({"collect"});
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.out, "The collection failed: the run was ended by signal 9 (Killed).\n");
  EXPECT_TRUE(CollectorEnds());
  EXPECT_EQ(ReadFile(kRaid), settings);
  EXPECT_THAT(RunFiles(), IsEmpty());
  EXPECT_FALSE(HasMarkers());
}

TEST_F(CollectCommandTest, EndsEverythingWhenInterrupted) {
  InstallUdc("raid", kNeverEnds);
  const std::string settings = ReadFile(kMessages);
  for (const char* name : {"TERM", "HUP"}) {
    RemoveFile(kPidFile);
    const Output output = CollectAndSignal(name);
    EXPECT_EQ(output.status, 1) << name;
    EXPECT_EQ(output.out, "The collection was interrupted.\n");
    EXPECT_TRUE(CollectorEnds()) << name;
    EXPECT_EQ(ReadFile(kMessages), settings);
    EXPECT_THAT(RunFiles(), IsEmpty());
    EXPECT_FALSE(HasMarkers());
  }
}

TEST_F(CollectCommandTest, EndsACollectorThatIgnoresSigterm) {
  InstallUdc("raid", std::string("trap '' TERM HUP\n") + kNeverEnds);
  EXPECT_EQ(CollectAndSignal("TERM").status, 1);
  EXPECT_TRUE(CollectorEnds());
}

TEST_F(CollectCommandTest, KeepsWhatAnInterruptedRunHas) {
  InstallUdc("raid", kNeverEnds);
  const Output output = CollectAndSignal("TERM", "--keep --json");
  EXPECT_EQ(output.status, 1);
  ASSERT_THAT(RunFiles(), SizeIs(1));
  const Json::Value told = FromJsonLine(output.out);
  EXPECT_EQ(told["interrupted"], true);
  EXPECT_EQ(told["run_directory"], RunFiles()[0]);
  EXPECT_TRUE(told["archive"].isNull());
}

TEST_F(CollectCommandTest, GoesOnWhenASignalIsIgnored) {
  InstallUdc("raid", "echo $$ > /volume1/collector.pid; sleep 1; echo '{}'");
  const Output output = Shell(
      "env --ignore-signal=HUP --ignore-signal=CHLD $quendelctl collect & tool=$!; "
      "while [ ! -s " +
      std::string(kPidFile) + " ]; do sleep 0.02; done; kill -HUP $tool; wait $tool");
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.out, StartsWith("The collection is complete.\n"));
}

TEST_F(CollectCommandTest, ShowsALineForEachPhase) {
  InstallLogOf("large", "x");
  ASSERT_EQ(Shell("head -c 3000000 /dev/urandom | base64 > /volume1/large").status, 0);
  Answer({.body = R"({"success":true})", .delay_ms = 500});
  const Output output = Quendelctl({"collect", "--send"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.err, MatchesRegex("quendelctl: checking the server\nquendelctl: collecting\n"
                                       "quendelctl: packing\nquendelctl: sending\n"
                                       "(quendelctl: committing\n)?"));
  EXPECT_THAT(output.out, HasSubstr("2 logs have something new: large messages\n"));
}

TEST_F(CollectCommandTest, RedrawsOneLineOnATerminal) {
  InstallLogOf("idle", "");
  InstallUdc("raid", "sleep 1; echo nonsense");
  const Terminal terminal = OnTerminal({"collect"});
  EXPECT_EQ(terminal.status, 0);
  EXPECT_THAT(terminal.shown, ContainsRegex("\rcollecting: [0-2] of 2 logs, [0-9]+ B, 0 s\x1b\\[K\r"
                                            "\rcollecting: 2 of 2 logs, "));
  EXPECT_THAT(
      terminal.shown,
      HasSubstr("\r\x1b[KThe collection is complete.\r\n1 log has something new: messages\r\n"));
}

TEST_F(CollectCommandTest, KeepsLogLinesApartFromTheLineOnATerminal) {
  InstallUdc("raid", "sleep 1; echo nonsense");
  const Terminal terminal = OnTerminal({"collect"});
  EXPECT_THAT(terminal.shown, HasSubstr("\x1b[K\r\x1b[Kquendelctl: quendel_collect_udc:"));
}

TEST_F(CollectCommandTest, FitsTheLineToTheTerminal) {
  const Terminal terminal = OnTerminal({"collect"}, 12);
  EXPECT_THAT(terminal.shown, AllOf(HasSubstr("\rcollecting:\x1b[K\r"), Not(HasSubstr(" of "))));
}

TEST_F(CollectCommandTest, ShowsPlainLinesOnADumbTerminal) {
  const Terminal terminal = OnTerminal({"collect"}, 80, "dumb");
  EXPECT_EQ(terminal.status, 0);
  EXPECT_THAT(terminal.shown, HasSubstr("quendelctl: collecting\r\n"));
  EXPECT_THAT(terminal.shown, Not(HasSubstr("\x1b")));
}

TEST_F(CollectCommandTest, EndsEverythingAtTheInterruptKey) {
  InstallUdc("raid", kNeverEnds);
  for (const char* key : {"\x03", "\x1c"}) {
    RemoveFile(kPidFile);
    const Terminal terminal = OnTerminal({"collect"}, 80, "xterm", [key](int master) {
      EXPECT_TRUE(Within(std::chrono::seconds(10), [] { return CollectorPid() > 0; }));
      EXPECT_EQ(write(master, key, 1), 1);
    });
    EXPECT_EQ(terminal.status, 1);
    EXPECT_THAT(terminal.shown, EndsWith("\r\x1b[KThe collection was interrupted.\r\n"));
    EXPECT_TRUE(CollectorEnds());
    EXPECT_THAT(RunFiles(), IsEmpty());
  }
}

TEST(PerfCommandTest, ShowsOneSample) {
  for (const char* form : {"text", "json"}) {
    const bool json = std::string(form) == "json";
    const Output output = json ? Quendelctl({"perf", "--json"}) : Quendelctl({"perf"});
    EXPECT_EQ(output.status, 0);
    EXPECT_THAT(output.err, IsEmpty());
    EXPECT_EQ(std::count(output.out.begin(), output.out.end(), '\n') == 1, json);
    const Json::Value sample = FromJson(output.out);
    EXPECT_THAT(sample.getMemberNames(), ElementsAre("perf_data", "success"));
    EXPECT_EQ(sample["success"], true);
    EXPECT_EQ(sample["perf_data"]["success"], true);
    EXPECT_GT(sample["perf_data"]["data"]["Memory"]["total_bytes"].asUInt64(), 0U);
  }
}

TEST(PerfCommandTest, ShowsASeriesAtItsPace) {
  const auto start = std::chrono::steady_clock::now();
  const Output output = Quendelctl({"perf", "--series", "3", "--every", "2"});
  const auto took = std::chrono::steady_clock::now() - start;
  EXPECT_EQ(output.status, 0);
  EXPECT_GE(took, std::chrono::seconds(4));
  const Json::Value series = FromJson(output.out);
  EXPECT_THAT(series.getMemberNames(), ElementsAre("perf_0", "perf_1", "perf_2"));
  for (const std::string& name : series.getMemberNames()) {
    EXPECT_THAT(series[name].getMemberNames(), ElementsAre("perf_data", "success"));
    EXPECT_EQ(series[name]["success"], true);
  }
  EXPECT_NEAR(static_cast<double>(series["perf_2"]["perf_data"]["data"]["time"].asInt64() -
                                  series["perf_0"]["perf_data"]["data"]["time"].asInt64()),
              4, 1);
}

TEST(PerfCommandTest, ShowsSamplesThatFailedAndFails) {
  for (const char* form : {"perf", "perf --json", "perf --series 1"}) {
    const Output output =
        Shell("ASAN_OPTIONS=$ASAN_OPTIONS:verify_asan_link_order=0 LD_PRELOAD=" SILENT_PERFORMANCE
              " $quendelctl " +
              std::string(form));
    EXPECT_EQ(output.status, 1);
    const Json::Value result = FromJson(output.out);
    const Json::Value& sample = result.isMember("perf_0") ? result["perf_0"] : result;
    EXPECT_EQ(sample["success"], false);
    EXPECT_TRUE(sample["perf_data"].isNull());
  }
}

TEST(PerfCommandTest, RejectsWhatIsNoCount) {
  for (const char* count : {"0", "-1"}) {
    ExpectUsageError({"perf", "--series", count}, std::string("--series: ") + count);
    ExpectUsageError({"perf", "--series", "1", "--every", count},
                     std::string("--every: ") + count + " is less than 1");
  }
  ExpectUsageError({"perf", "--series", "x"}, "--series: x is not a whole number");
  ExpectUsageError({"perf", "--every", "1"}, "--every: goes with --series only");
}

TEST_F(ConfCommandTest, ListsEachStateInWords) {
  const std::string folder = "/usr/arvo/etc/quendel/";
  RemoveFile(kRaid);
  InstallLogOf("aa_never", "12345");
  struct stat status = {};
  WriteFile("/volume1/log", "1234567890");
  ASSERT_EQ(stat("/volume1/log", &status), 0);
  const std::string inode = std::to_string(status.st_ino);
  const std::string other = std::to_string(status.st_ino + 1);
  WriteFile(folder + "quendel.log.changed",
            LogSettings("changed", "/volume1/log", kHash, "4", other));
  WriteFile(folder + "quendel.log.folder", LogSettings("folder", "/volume1", kHash, "4", other));
  WriteFile(folder + "quendel.log.gone", LogSettings("gone", "/volume1/gone", kHash, "4", other));
  WriteFile(kMessages, LogSettings("messages", "/volume1/log", kHash, "4", inode));
  WriteFile(folder + "quendel.log.short", LogSettings("short", "/volume1/log", kHash, "11", inode));
  WriteFile(folder + "quendel.log.under",
            LogSettings("under", "/volume1/log/x", kHash, "1", inode));

  const Output output = Quendelctl({"conf", "list"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.err, IsEmpty());
  ASSERT_EQ(stat("/volume1/aa_never", &status), 0);
  const std::string never = std::to_string(status.st_ino);
  ASSERT_EQ(stat("/volume1", &status), 0);
  EXPECT_EQ(output.out,
            "quendel.log.aa_never: aa_never, /volume1/aa_never\n"
            "  never collected; inode recorded none, present " +
                never +
                "\n"
                "  collected up to byte 0, 5 bytes behind; hash of the last line not known\n"
                "quendel.log.changed: changed, /volume1/log\n"
                "  another file since it was collected; inode recorded " +
                other + ", present " + inode +
                "\n  collected up to byte 4, 10 bytes behind; hash of the last line known\n"
                "quendel.log.folder: folder, /volume1\n"
                "  log is not a regular file; inode recorded " +
                other + ", present " + std::to_string(status.st_ino) +
                "\n  collected up to byte 4, 0 bytes behind; hash of the last line known\n"
                "quendel.log.gone: gone, /volume1/gone\n"
                "  log missing; inode recorded " +
                other +
                ", present none\n"
                "  collected up to byte 4; hash of the last line known\n"
                "quendel.log.messages: messages, /volume1/log\n"
                "  same file; inode recorded " +
                inode + ", present " + inode +
                "\n"
                "  collected up to byte 4, 6 bytes behind; hash of the last line known\n"
                "quendel.log.short: short, /volume1/log\n"
                "  same file, but shorter since it was collected; inode recorded " +
                inode + ", present " + inode +
                "\n"
                "  collected up to byte 11, 10 bytes behind; hash of the last line known\n"
                "quendel.log.under: under, /volume1/log/x\n"
                "  log unreadable: Not a directory; inode recorded " +
                inode +
                ", present none\n"
                "  collected up to byte 1; hash of the last line known\n");
}

TEST_F(ConfCommandTest, ListsPrograms) {
  RemoveFile(kMessages);
  InstallUdc("locked", "true");
  ASSERT_EQ(chmod("/volume1/locked", 0600), 0);
  InstallUdc("nowhere", "true");
  RemoveFile("/volume1/nowhere");
  WriteFile(kRaid, std::string("name=raid\npath=/volume1/raid\nlast_hash=") + kHash + "\n");
  const Output output = Quendelctl({"conf", "list"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out,
            "quendel.udc.locked: locked, /volume1/locked\n"
            "  program cannot be run; hash of the last output not known\n"
            "quendel.udc.nowhere: nowhere, /volume1/nowhere\n"
            "  program missing; hash of the last output not known\n"
            "quendel.udc.raid: raid, /volume1/raid\n"
            "  program ready; hash of the last output known\n");
}

TEST_F(ConfCommandTest, ListsAsJson) {
  WriteFile("/usr/arvo/etc/quendel/quendel.udc.zz", "name=zz\n");
  ASSERT_EQ(Quendelctl({"collect"}).status, 0);
  WriteFile("/volume1/messages.new", "");
  ASSERT_EQ(Shell("printf third >> /volume1/messages").status, 0);
  struct stat status = {};
  ASSERT_EQ(stat("/volume1/messages", &status), 0);
  const Output output = Quendelctl({"conf", "list", "--json"});
  EXPECT_EQ(output.status, 1);  // because of zz
  const std::string inode = std::to_string(status.st_ino);
  EXPECT_EQ(FromJsonLine(output.out), FromJson(R"({"success":false,"reason":"failed",
                "error":"Not every collector can be read.","collectors":[{"file":"quendel.log.messages","kind":"log",
                "name":"messages","path":"/volume1/messages","state":"same","offset":13,
                "lag_bytes":5,"last_hash_known":true,"recorded_inode":)" +
                                               inode + R"(,"present_inode":)" + inode + R"(},
                {"file":"quendel.udc.raid","kind":"udc","name":"raid","path":"/volume1/raid",
                "state":"ready","last_hash_known":true},
                {"file":"quendel.udc.zz","kind":"udc","state":"no-collector"}]})"));
}

TEST_F(ConfCommandTest, SaysWhichFileIsNoCollector) {
  WriteFile("/usr/arvo/etc/quendel/quendel.log.bad", "name=bad\n");
  WriteFile("/usr/arvo/etc/quendel/quendel.udc.bad", "");
  const Output output = Quendelctl({"conf", "list"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.out, HasSubstr("quendel.log.bad: cannot be read as a collector\n"));
  EXPECT_THAT(output.out, HasSubstr("quendel.udc.bad: cannot be read as a collector\n"));
  EXPECT_THAT(output.out, HasSubstr("quendel.log.messages: messages, "));  // the others are shown
  EXPECT_THAT(output.err, HasSubstr("Failed to find log path in conf"));
}

TEST_F(ConfCommandTest, ListsNothingWhereNothingIs) {
  RemoveFile(kMessages);
  RemoveFile(kRaid);
  WriteFile("/usr/arvo/etc/quendel/other", "");
  WriteFile("/usr/arvo/etc/quendel/quendel.log.folder/x", "");
  const Output none = Quendelctl({"conf", "list"});
  EXPECT_EQ(none.status, 0);
  EXPECT_EQ(none.out, "There are no collectors.\n");
  EXPECT_EQ(Quendelctl({"conf", "reset", "--all"}).out, "There are no collectors.\n");
  RemoveFile("/usr/arvo/etc/quendel");
  for (const std::vector<std::string>& arguments :
       {std::vector<std::string>{"conf", "list"}, {"conf", "reset", "--all"}}) {
    const Output missing = Quendelctl(arguments);
    EXPECT_EQ(missing.status, 1);
    EXPECT_EQ(missing.out,
              "The collectors in /usr/arvo/etc/quendel cannot be listed: No such file or "
              "directory.\n");
  }
}

TEST_F(ConfCommandTest, ResetsACollectorByItsFileOrItsName) {
  for (const std::string name : {"quendel.log.messages", "messages"}) {
    WriteFile(kMessages, LogSettings("messages", "/volume1/messages", kHash, "13", "7"));
    const Output output = Quendelctl({"conf", "reset", name});
    EXPECT_EQ(output.status, 0);
    EXPECT_EQ(output.out, "quendel.log.messages: reset\n");
    EXPECT_THAT(ReadFile(kMessages), HasSubstr("total_byte=\"\"\n"));
  }
  WriteFile(kRaid, std::string("name=raid\npath=/volume1/raid\nlast_hash=") + kHash + "\n");
  const Output json = Quendelctl({"conf", "reset", "raid", "--json"});
  EXPECT_EQ(json.status, 0);
  EXPECT_EQ(json.out, "{\"failed\":[],\"reset\":[\"quendel.udc.raid\"],\"success\":true}\n");
  EXPECT_THAT(ReadFile(kRaid), HasSubstr("last_hash=\"\"\n"));
}

TEST_F(ConfCommandTest, ResetsAll) {
  ASSERT_EQ(Quendelctl({"collect"}).status, 0);
  EXPECT_EQ(Quendelctl({"conf", "reset", "--all"}).out,
            "quendel.log.messages: reset\nquendel.udc.raid: reset\n");
  EXPECT_THAT(ReadFile(kMessages), HasSubstr("inode=\"\"\n"));
  EXPECT_THAT(ReadFile(kRaid), HasSubstr("last_hash=\"\"\n"));
}

TEST_F(ConfCommandTest, SaysWhatCouldNotBeReset) {
  RemoveFile("/usr/arvo/etc/quendel/.quendel.log.messages.lock");
  WriteFile("/usr/arvo/etc/quendel/.quendel.log.messages.lock/x", "");
  const Output output = Quendelctl({"conf", "reset", "--all"});
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.out, "quendel.log.messages: could not be reset\nquendel.udc.raid: reset\n");
  EXPECT_EQ(FromJsonLine(Quendelctl({"conf", "reset", "--all", "--json"}).out)["failed"],
            FromJson("[\"quendel.log.messages\"]"));
}

TEST_F(ConfCommandTest, RejectsANameThatIsNotOneCollector) {
  InstallUdc("messages", "true");
  const std::string settings = ReadFile(kMessages);
  ExpectUsageError({"conf", "reset", "messages"},
                   "NAME: messages can be quendel.log.messages or quendel.udc.messages");
  ExpectUsageError({"conf", "reset", "nosuch"}, "NAME: no collector is called nosuch");
  ExpectUsageError({"conf", "reset", "../quendel.conf"}, "NAME: no collector is called");
  ExpectUsageError({"conf", "reset"}, "NAME: either a NAME or --all is needed");
  ExpectUsageError({"conf", "reset", "raid", "--all"}, "NAME: either a NAME or --all is needed");
  ExpectUsageError({"conf"}, "conf: one of these commands is required: list, reset");
  ExpectUsageError({"conf", "list", "x"}, "The following argument was not expected: x");
  EXPECT_EQ(ReadFile(kMessages), settings);
}

TEST_F(ConfCommandTest, ExplainsItself) {
  for (const std::vector<std::string>& arguments :
       {std::vector<std::string>{"conf", "list", "--help"}, {"conf", "reset", "--help"}}) {
    const Output output = Quendelctl(arguments);
    EXPECT_EQ(output.status, 0);
    EXPECT_THAT(output.out, HasSubstr("Usage: quendelctl conf " + arguments[1] + " [OPTIONS]"));
    EXPECT_THAT(output.out, HasSubstr("--json "));
  }
}

TEST(TarCommandTest, PacksADirectory) {
  WriteFile("/volume1/run/log/a", "text");
  const Output output = Quendelctl({"tar", "/volume1/run", "/volume1/a.tar.xz"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "Packed /volume1/run into /volume1/a.tar.xz, " +
                            std::to_string(fs::file_size("/volume1/a.tar.xz")) + " bytes.\n");
  EXPECT_EQ(Shell("tar -tJf /volume1/a.tar.xz").out, "run/\nrun/log/\nrun/log/a\n");
  const Output json = Quendelctl({"tar", "/volume1/run", "/volume1/a.tar.xz", "--json"});
  EXPECT_EQ(FromJsonLine(json.out)["bytes"].asUInt64(), fs::file_size("/volume1/a.tar.xz"));
  EXPECT_EQ(FromJsonLine(json.out)["archive"], "/volume1/a.tar.xz");
}

TEST(TarCommandTest, TakesADirectoryHoweverItIsWritten) {
  WriteFile("/volume1/run/log/a", "text");
  WriteFile("/top/a", "text");
  const char* const kRows[][2] = {{"cd /volume1; $quendelctl tar run a:b", "run/"},
                                  {"cd /volume1; $quendelctl tar ./run/// a:b", "run/"},
                                  {"cd /volume1/run; $quendelctl tar . ../a:b", "run/"},
                                  {"cd /volume1/run/log; $quendelctl tar .. ../../a:b", "run/"},
                                  {"cd /; $quendelctl tar top volume1/a:b", "top/"}};
  for (const auto& [command, first] : kRows) {
    RemoveFile("/volume1/a:b");
    EXPECT_EQ(Shell(command).status, 0) << command;
    EXPECT_THAT(Shell("tar -tJf /volume1/a:b").out, StartsWith(first)) << command;
  }
}

TEST(TarCommandTest, FailsWhenTarFails) {
  const Output output = Quendelctl({"tar", "/volume1/nowhere", "/volume1/a.tar.xz"});
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.out, "/volume1/nowhere could not be packed.\n");
  EXPECT_THAT(output.err, HasSubstr("Failed to tar '/volume1/nowhere'"));
}

TEST(TarCommandTest, RejectsWhatHasNoNameToPackItUnder) {
  ExpectUsageError({"tar", "/", "/volume1/a"}, "DIR: a directory that has a name is needed");
  ExpectUsageError({"tar", "", "/volume1/a"}, "DIR: a directory that has a name is needed");
  ExpectUsageError({"tar", "/volume1/-v", "/volume1/a"}, "DIR: the name -v begins with a -");
  ExpectUsageError({"tar", "/volume1"}, "ARCHIVE is required");
  ExpectUsageError({"tar", "/volume1", ""}, "ARCHIVE: a file name is needed");
  EXPECT_FALSE(Exists("/volume1/a"));
}

TEST_F(SendCommandTest, SendsAnArchive) {
  WriteFile("/volume1/a.tar.xz", "archive");
  const Output output = Quendelctl({"send", "/volume1/a.tar.xz", "--time", "1709622489"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "The server accepted /volume1/a.tar.xz.\n");
  EXPECT_THAT(output.err, IsEmpty());
  const std::vector<Request> requests = Requests();
  ASSERT_THAT(requests, SizeIs(1));
  EXPECT_EQ(requests[0].line, "POST /collect/a1/b2/S1 HTTP/1.1");
  EXPECT_THAT(requests[0].body, HasSubstr("\"timestamp\":\"1709622489\""));
  EXPECT_THAT(requests[0].body, HasSubstr("\"filename\":\"a.tar.xz\""));
}

TEST_F(SendCommandTest, TakesTheTimeOfTheFile) {
  WriteFile("/volume1/a.tar.xz", "archive");
  ASSERT_EQ(Shell("touch -d @1600000000 /volume1/a.tar.xz").status, 0);
  const Output output = Quendelctl({"send", "/volume1/a.tar.xz", "--json"});
  EXPECT_EQ(output.out,
            "{\"file\":\"/volume1/a.tar.xz\",\"success\":true,\"timestamp\":1600000000}\n");
  EXPECT_THAT(Requests().back().body, HasSubstr("\"timestamp\":\"1600000000\""));
}

TEST_F(SendCommandTest, FailsWhenTheServerDeclinesOrTheFileIsMissing) {
  WriteFile("/volume1/a.tar.xz", "archive");
  Answer({.body = R"({"success":false})"});
  const Output declined = Quendelctl({"send", "/volume1/a.tar.xz"});
  EXPECT_EQ(declined.status, 1);
  EXPECT_EQ(declined.out, "The server did not get or accept /volume1/a.tar.xz.\n");
  EXPECT_THAT(declined.err, HasSubstr("Failed to post file to server"));
  EXPECT_EQ(Quendelctl({"send", "/volume1/nowhere"}).status, 1);
}

TEST_F(SendCommandTest, RejectsATimeThatIsNone) {
  WriteFile("/volume1/a.tar.xz", "archive");
  for (const char* text : {"-1", "x", "1.5", "9223372036854775808"}) {
    ExpectUsageError({"send", "/volume1/a.tar.xz", "--time", text},
                     std::string("--time: ") + text + " is not a number of seconds");
  }
  EXPECT_THAT(Requests(), IsEmpty());
}
