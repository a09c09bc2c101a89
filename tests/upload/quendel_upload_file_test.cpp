// The upload action.
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <algorithm>
#include <iterator>
#include <string>

#include "base/json_text.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/json.h"
#include "support/log.h"
#include "support/random.h"
#include "support/server.h"

using namespace quendel::test;
using testing::AllOf;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;

namespace {

constexpr char kUnit[] = "quendel_upload_file";
constexpr char kDump[] = "/var/crash/@app.core";
constexpr char kMoved[] = "/tmp/quendel/coredump/@app.core.xz";
constexpr char kNoFile[] = "POST /action_progress/17/-3/a1/b2/S1 HTTP/1.1";
constexpr char kUpload[] = "POST /upload_file/17/a1/b2/S1 HTTP/1.1";

Json::Value File(const std::string& type, const std::string& path, const std::string& uuid = "u1") {
  Json::Value file(Json::objectValue);
  file["file_type"] = type;
  file["file_path"] = path;
  file["file_uuid"] = uuid;
  return file;
}

Json::Value List(std::initializer_list<Json::Value> files) {
  Json::Value list(Json::arrayValue);
  for (const Json::Value& file : files) {
    list.append(file);
  }
  return list;
}

// A device that is known to the server, with a dump on it and tools that work.
class UploadFileTest : public testing::Test {
 protected:
  void SetUp() override {
    SetIdentity();
    WriteFile(kDump, "what the program held in memory");
    InstallTool("/usr/arvo/bin/arvomsg_collector2", "echo facts > \"$1/facts.txt\"");
    InstallTool("/usr/bin/zip",
                "while [ $# -gt 2 ]; do shift; done; tar -cf \"$1\" \"$2\" 2>/dev/null");
    StartOver();
  }

  static void StartOver() {
    ClearLog();
    ResetCalls();
    Record("ALIBCExec");
    Record("ALIBCExecl");
  }

  static int Upload(const Json::Value& files) {
    return QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN, files);
  }
};

using Step = testing::Matcher<LogLine>;

Step GivenUp(const std::string& type, const std::string& path) {
  return Logged(kUnit, "Prepare uploaded file failed [" + type + "]:[" + path + "]");
}

std::string Xz(const std::string& dump) {
  return "/bin/xz|-kf|" + dump;
}

std::string Mv(const std::string& dump) {
  return "/bin/mv|" + dump + ".xz|/tmp/quendel/coredump";
}

constexpr char kCollector[] = "/usr/arvo/bin/arvomsg_collector2|/tmp/quendel/debugdat";
constexpr char kZip[] =
    "/usr/bin/zip|-q|-9|-UN=UTF8|-E|-yf|-r|/tmp/quendel/debugdat.zip|/tmp/quendel/debugdat";
constexpr char kRemoveDumps[] = "/bin/rm|-rf|/tmp/quendel/coredump";
constexpr char kRemoveDebug[] = "/bin/rm|-rf|/tmp/quendel/debugdat";

}  // namespace

// ---- What is asked for.

TEST_F(UploadFileTest, DoesNothingUnlessItIsToRun) {
  const Json::Value hostile("not even a list");
  for (const auto progress : {QUENDEL_ACT_PROGRESS_DONE, QUENDEL_ACT_PROGRESS_FAILED,
                              QUENDEL_ACT_PROGRESS_NO_FILE, QuendelActionProgress_t(2)}) {
    EXPECT_EQ(QUENDELUploadFile(17, progress, hostile), 0);
  }
  EXPECT_THAT(Log(), IsEmpty());
  EXPECT_THAT(Recorded(), IsEmpty());
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(UploadFileTest, TellsTheServerThatAnEmptyListHasNoFile) {
  EXPECT_EQ(Upload(Json::Value(Json::arrayValue)), 0);
  ASSERT_THAT(RequestLines(), ElementsAre(kNoFile));
  EXPECT_EQ(Requests()[0].body, "{}");
  EXPECT_THAT(Recorded(), IsEmpty());
  EXPECT_THAT(Log(), IsEmpty());
}

TEST_F(UploadFileTest, TakesNullForAnEmptyList) {
  EXPECT_EQ(Upload(Json::Value()), 0);
  EXPECT_THAT(RequestLines(), ElementsAre(kNoFile));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST_F(UploadFileTest, RefusesAnythingElseThatIsNoList) {
  for (const Json::Value& files :
       {Json::Value("x"), Json::Value(12), Json::Value(1.5), Json::Value(true), Json::Value(""),
        Json::Value(Json::objectValue), File("debug.dat", "")}) {
    ClearLog();
    EXPECT_EQ(Upload(files), -1) << quendel::JsonToText(files);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path ''"),
                                   Logged(kUnit, "Validate filepath failed")))
        << quendel::JsonToText(files);
  }
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_THAT(Recorded(), IsEmpty());
}

TEST_F(UploadFileTest, RefusesElementsThatAreNoObjects) {
  for (const Json::Value& element :
       {Json::Value(), Json::Value("/var/crash/@x.core"), Json::Value(12), Json::Value(false),
        Json::Value(Json::arrayValue), List({File("debug.dat", "")})}) {
    ClearLog();
    EXPECT_EQ(Upload(List({File("debug.dat", ""), element})), -1) << quendel::JsonToText(element);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path ''"),
                                   Logged(kUnit, "Validate filepath failed")))
        << quendel::JsonToText(element);
  }
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_THAT(Recorded(), IsEmpty());
}

TEST_F(UploadFileTest, ReadsMembersOfOtherKindsAsText) {
  for (const Json::Value& path : {Json::Value(), Json::Value(Json::arrayValue),
                                  Json::Value(Json::objectValue), Json::Value("")}) {
    ClearLog();
    Json::Value file = File("coredump", "");
    file["file_path"] = path;
    EXPECT_EQ(Upload(List({file})), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path ''"),
                                   Logged(kUnit, "Validate filepath failed")));
  }
  ClearLog();
  Json::Value number = File("coredump", "");
  number["file_path"] = 12;
  EXPECT_EQ(Upload(List({number})), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path '12'"),
                                 Logged(kUnit, "Validate filepath failed")));
}

TEST_F(UploadFileTest, DropsATypeOfAnotherKind) {
  Json::Value file = File("", kDump);
  file["file_type"] = List({File("debug.dat", "")});
  EXPECT_EQ(Upload(List({file})), 0);
  EXPECT_THAT(
      Log(), ElementsAre(Logged(kUnit, "Get unknown upload file type: \"\"."), GivenUp("", kDump)));
  EXPECT_THAT(RequestLines(), ElementsAre(kNoFile));
}

TEST_F(UploadFileTest, DropsAMissingTypeWhosePathIsValid) {
  Json::Value file = File("", kDump);
  file.removeMember("file_type");
  EXPECT_EQ(Upload(List({file})), 0);
  EXPECT_THAT(
      Log(), ElementsAre(Logged(kUnit, "Get unknown upload file type: \"\"."), GivenUp("", kDump)));
}

TEST_F(UploadFileTest, RefusesAMissingTypeWhosePathIsNot) {
  Json::Value file = File("", "/etc/shadow");
  file.removeMember("file_type");
  EXPECT_EQ(Upload(List({file})), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path '/etc/shadow'"),
                                 Logged(kUnit, "Validate filepath failed")));
}

TEST_F(UploadFileTest, AcceptsPathsThatMatchThePattern) {
  for (const std::string path :
       {"/var/crash/@x.core", "/volume12/@a/b.core", "/volume0/@.core.core", "/volume1/@a\nb.core",
        "/volume1/@a/../b.core", "/volume1/@ .core", "/volume1/@-rf.core"}) {
    ClearLog();
    EXPECT_EQ(Upload(List({File("coredump", path)})), 0) << path;
    // It got as far as xz, which does not find such a dump.
    EXPECT_THAT(Log(),
                ElementsAre(Logged(kUnit, "Fail to compress coredump"), GivenUp("coredump", path)));
  }
}

TEST_F(UploadFileTest, RefusesPathsThatDoNot) {
  for (const std::string path :
       {"/var/crash/x.core", "/volume/@x.core", "/volume1/@x.core.gz", "/tmp/@x.core",
        "/var/crash/@.core", "/volume1/a/@x.core", "/var/crash//@x.core", "/var/crash/@x.core\n",
        "\n/var/crash/@x.core", " /var/crash/@x.core", "var/crash/@x.core", "/volume1/@xcore",
        "/volume1/@xxcore", "/VAR/crash/@x.core", "/etc/passwd\n/var/crash/@x.core",
        "../var/crash/@x.core", "@x.core"}) {
    ClearLog();
    EXPECT_EQ(Upload(List({File("coredump", path)})), -1) << path;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path '" + path + "'"),
                                   Logged(kUnit, "Validate filepath failed")));
  }
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_THAT(Recorded(), IsEmpty());
}

TEST_F(UploadFileTest, OneInvalidPathFailsTheWholeRequest) {
  EXPECT_EQ(Upload(List({File("debug.dat", ""), File("coredump", kDump),
                         File("coredump", "/etc/shadow"), File("coredump", "/etc/passwd")})),
            -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path '/etc/shadow'"),
                                 Logged(kUnit, "Validate filepath failed")));
  EXPECT_THAT(Recorded(), IsEmpty());
}

TEST_F(UploadFileTest, ChecksThePathOfUnknownTypesToo) {
  EXPECT_EQ(Upload(List({File("core", "/etc/shadow")})), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path '/etc/shadow'"),
                                 Logged(kUnit, "Validate filepath failed")));
}

TEST_F(UploadFileTest, PutsAPathThatEndsAtANulToUseUpToThere) {
  const std::string path("/var/crash/@app.core\0/../../etc/shadow", 37);
  EXPECT_EQ(Upload(List({File("coredump", path)})), 0);
  EXPECT_THAT(Recorded(), ElementsAre(Xz(kDump), Mv(kDump), kRemoveDumps));
  EXPECT_THAT(RequestLines(), ElementsAre(kUpload));
}

TEST_F(UploadFileTest, RefusesAPathThatMatchesOnlyBehindANul) {
  EXPECT_EQ(Upload(List({File("coredump", std::string("/etc/shadow\0@x.core", 19))})), -1);
  EXPECT_EQ(Upload(List({File("coredump", std::string("\0/var/crash/@x.core", 19))})), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path '/etc/shadow'"),
                                 Logged(kUnit, "Validate filepath failed"),
                                 Logged(kUnit, "Invalid file path ''"),
                                 Logged(kUnit, "Validate filepath failed")));
}

TEST_F(UploadFileTest, DebugTypeMustBeExact) {
  for (const std::string& type : {std::string("debug.dat\0", 10), std::string("DEBUG.DAT"),
                                  std::string("debug.dat "), std::string("debugxdat")}) {
    ClearLog();
    EXPECT_EQ(Upload(List({File(type, "")})), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path ''"),
                                   Logged(kUnit, "Validate filepath failed")));
  }
}

TEST_F(UploadFileTest, BearsAPathOfOneMebibyte) {
  const std::string longPath = "/volume1/@" + std::string(1 << 20, 'a') + ".core";
  EXPECT_EQ(Upload(List({File("coredump", longPath)})), 0);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(
                  kUnit, AllOf(StartsWith("Prepare uploaded file failed [coredump]:[/volume1/@aaa"),
                               EndsWith("aaa...]")))));
  EXPECT_THAT(Recorded(), ElementsAre(kRemoveDumps));
  ClearLog();
  EXPECT_EQ(Upload(List({File("coredump", longPath + "x")})), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, AllOf(StartsWith("Invalid file path '/volume1/@aaa"),
                                                     EndsWith("aaa...'"))),
                                 Logged(kUnit, "Validate filepath failed")));
}

// Any JSON at all, with a liking for what nearly passes.
class AnyRequest {
 public:
  explicit AnyRequest(unsigned int seed) : random_(seed) {}

  Json::Value Files() {
    if (Pick(8) == 0) {
      return Value(3);
    }
    Json::Value files(Json::arrayValue);
    // One bad element fails all, so most lists are short.
    for (int count = Pick(3) == 0 ? Pick(7) : 1; count > 0; --count) {
      files.append(Pick(16) == 0 ? Value(2) : Element());
    }
    return files;
  }

 private:
  int Pick(int choices) { return random_.Below(choices); }

  Json::Value Element() {
    Json::Value element(Json::objectValue);
    for (const char* key : {"file_path", "file_type", "file_uuid"}) {
      if (Pick(10) != 0) {
        element[key] = Pick(10) == 0 ? Value(2) : Json::Value(Text());
      }
    }
    return element;
  }

  Json::Value Value(int depth) {
    switch (Pick(depth > 0 ? 8 : 6)) {
      case 0:
        return Json::Value();
      case 1:
        return Pick(2) == 0;
      case 2:
        return Pick(1000) - 500;
      case 3:
        return 1e308 * Pick(3);
      case 6: {
        Json::Value list(Json::arrayValue);
        for (int count = Pick(4); count > 0; --count) {
          list.append(Value(depth - 1));
        }
        return list;
      }
      case 7:
        return Element();
      default:
        return Text();
    }
  }

  std::string Text() {
    static const std::string pieces[] = {"/var/crash/", "/volume1/",
                                         "/volume12/",  "/volume/",
                                         "@",           "@",
                                         "a",           ".core",
                                         ".core",       "/",
                                         "..",          "\n",
                                         "core",        std::string(1, '\0'),
                                         "\xff\xfe",    "debug.dat",
                                         "coredump",    "/etc/passwd",
                                         "%s%n",        ";rm",
                                         "-rf"};
    if (Pick(3) == 0) {
      return Pick(2) == 0 ? "debug.dat" : "coredump";
    }
    static const char* const fronts[] = {"", "/var/crash/@", "/volume1/@", "/etc/var/crash/@"};
    std::string text = fronts[Pick(4)];
    for (int count = Pick(5); count > 0; --count) {
      text += pieces[Pick(static_cast<int>(std::size(pieces)))];
    }
    return text + (Pick(4) == 0 ? "" : ".core");
  }

  Random random_;
};

bool IsDumpPath(std::string path) {
  const auto takeFront = [&path](const std::string& front) {
    const bool has = path.compare(0, front.size(), front) == 0;
    path.erase(0, has ? front.size() : 0);
    return has;
  };
  if (!takeFront("/var/crash/")) {
    if (!takeFront("/volume")) {
      return false;
    }
    const size_t digits = std::min(path.find_first_not_of("0123456789"), path.size());
    path.erase(0, digits);
    if (digits == 0 || !takeFront("/")) {
      return false;
    }
  }
  const std::string end = ".core";
  return takeFront("@") && path.size() > end.size() &&
         path.compare(path.size() - end.size(), end.size(), end) == 0;
}

// Whatever the server asks for, the tools see fixed texts and paths that the pattern allows.
TEST_F(UploadFileTest, GivesTheToolsNoOtherPathWhateverIsAskedFor) {
  int compressed = 0;
  for (unsigned int seed = 0; seed < 20000; ++seed) {
    StartOver();
    On("ALIBCExec").Return(1);
    On("ALIBCExecl").Return(-1);
    On("ARVOFSMkdirP").Return(0);
    On("ARVOMYHUBAccountGet").Return(-1);
    const int result = Upload(AnyRequest(seed).Files());
    EXPECT_EQ(result, -1);  // nothing can be told without an account
    for (const std::string& command : Recorded()) {
      if (command.rfind("/bin/xz|-kf|", 0) == 0) {
        EXPECT_TRUE(IsDumpPath(command.substr(12))) << command;
        ++compressed;
      } else {
        EXPECT_THAT(command, testing::AnyOf(kCollector, kRemoveDumps, kRemoveDebug));
      }
    }
  }
  EXPECT_GT(compressed, 100);
}

// ---- How many.

TEST_F(UploadFileTest, RefusesMoreThanFive) {
  Json::Value files(Json::arrayValue);
  for (int i = 0; i < 6; ++i) {
    files.append(File("debug.dat", ""));
  }
  EXPECT_EQ(Upload(files), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Upload files exceed the max limit")));
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_THAT(Recorded(), IsEmpty());
}

TEST_F(UploadFileTest, RefusesTenThousand) {
  Json::Value files(Json::arrayValue);
  for (int i = 0; i < 10000; ++i) {
    files.append(File("coredump", kDump));
  }
  EXPECT_EQ(Upload(files), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Upload files exceed the max limit")));
}

TEST_F(UploadFileTest, ChecksThePathsBeforeTheLimit) {
  Json::Value files(Json::arrayValue);
  for (int i = 0; i < 5; ++i) {
    files.append(File("coredump", kDump));
  }
  files.append(File("coredump", "/etc/shadow"));
  EXPECT_EQ(Upload(files), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Invalid file path '/etc/shadow'"),
                                 Logged(kUnit, "Validate filepath failed")));
}

TEST_F(UploadFileTest, AcceptsFive) {
  Json::Value files(Json::arrayValue);
  for (int i = 0; i < 5; ++i) {
    const std::string dump = "/volume1/@d/" + std::to_string(i) + ".core";
    WriteFile(dump, "dump");
    files.append(File("coredump", dump));
  }
  EXPECT_EQ(Upload(files), 0);
  EXPECT_THAT(Log(), IsEmpty());
  EXPECT_THAT(RequestLines(), ElementsAre(kUpload));
}

// ---- A crash dump.

TEST_F(UploadFileTest, SendsADumpCompressedAndKeepsIt) {
  EXPECT_EQ(Upload(List({File("coredump", kDump, "u7")})), 0);
  EXPECT_THAT(Log(), IsEmpty());
  EXPECT_THAT(Recorded(), ElementsAre(Xz(kDump), Mv(kDump), kRemoveDumps));
  ASSERT_THAT(RequestLines(), ElementsAre(kUpload));
  const std::string body = Requests()[0].body;
  EXPECT_THAT(body, HasSubstr("\xFD"
                              "7zXZ"));
  EXPECT_THAT(body, HasSubstr("\"filename\":\"@app.core.xz\""));
  EXPECT_THAT(body, HasSubstr("\"type\":\"coredump\""));
  EXPECT_THAT(body, HasSubstr("\"fileuuid\":\"u7\""));
  EXPECT_EQ(ReadFile(kDump), "what the program held in memory");
  EXPECT_FALSE(Exists(std::string(kDump) + ".xz"));
  EXPECT_FALSE(Exists("/tmp/quendel/coredump"));
}

TEST_F(UploadFileTest, MakesItsDirectoriesForItselfAlone) {
  ResetCalls();
  Record("ARVOFSMkdirP");
  EXPECT_EQ(Upload(List({File("coredump", kDump), File("debug.dat", "")})), 0);
  EXPECT_THAT(Recorded(), ElementsAre("/tmp/quendel/coredump|0|1|-1|-1|448",
                                      "/tmp/quendel/debugdat|0|1|-1|-1|448"));
}

TEST_F(UploadFileTest, TakesTheTimeBeforeItPreparesAFile) {
  Record("time");  // without arguments, so that its record is empty
  EXPECT_EQ(Upload(List({File("coredump", kDump)})), 0);
  EXPECT_THAT(Recorded(), ElementsAre("", Xz(kDump), Mv(kDump), kRemoveDumps));
}

TEST_F(UploadFileTest, TakesTheTimeOfEachFile) {
  On("time").Nth(1).Return(1700000001);
  On("time").Nth(2).Return(1700000002);
  EXPECT_EQ(Upload(List({File("coredump", kDump), File("coredump", kDump)})), 0);
  ASSERT_THAT(Requests(), SizeIs(1));
  EXPECT_THAT(Requests()[0].body, HasSubstr("\"timestamp\":\"1700000001\""));
  EXPECT_THAT(Requests()[0].body, HasSubstr("\"timestamp\":\"1700000002\""));
}

TEST_F(UploadFileTest, GivesADumpUpWithoutItsDirectory) {
  for (const long result : {-1L, -2L}) {
    StartOver();
    On("ARVOFSMkdirP").Nth(1).Return(result);
    EXPECT_EQ(Upload(List({File("coredump", kDump)})), 0);
    EXPECT_THAT(Log(),
                ElementsAre(Logged(kUnit, "Fail to ARVOFSMkdirP for '/tmp/quendel/coredump'"),
                            GivenUp("coredump", kDump)));
    EXPECT_THAT(Recorded(), IsEmpty());
  }
  EXPECT_THAT(RequestLines(), ElementsAre(kNoFile, kNoFile));
}

TEST_F(UploadFileTest, TakesAnyResultButANegativeOneForADirectory) {
  WriteFile("/tmp/quendel/coredump/file", "");
  WriteFile("/tmp/quendel/debugdat/file", "");
  On("ARVOFSMkdirP").Return(1);
  EXPECT_EQ(Upload(List({File("coredump", kDump), File("debug.dat", "")})), 0);
  EXPECT_THAT(Log(), IsEmpty());
  EXPECT_THAT(RequestLines(), ElementsAre(kUpload));
}

TEST_F(UploadFileTest, GivesADumpUpThatCannotBeCompressed) {
  for (const long status : {1L, -1L, 137L}) {
    StartOver();
    On("ALIBCExec").Nth(1).Return(status);
    EXPECT_EQ(Upload(List({File("coredump", kDump)})), 0);
    EXPECT_THAT(
        Log(), ElementsAre(Logged(kUnit, "Fail to compress coredump"), GivenUp("coredump", kDump)));
    EXPECT_THAT(Recorded(), ElementsAre(Xz(kDump), kRemoveDumps));
  }
  EXPECT_THAT(RequestLines(), ElementsAre(kNoFile, kNoFile, kNoFile));
}

TEST_F(UploadFileTest, TakesTheCopyAwayThatCannotBeMoved) {
  for (const long status : {1L, -1L}) {
    StartOver();
    On("ALIBCExec").Nth(2).Return(status);
    EXPECT_EQ(Upload(List({File("coredump", kDump)})), 0);
    EXPECT_THAT(Log(),
                ElementsAre(Logged(kUnit, "Fail to move coredump"), GivenUp("coredump", kDump)));
    EXPECT_THAT(Recorded(), ElementsAre(Xz(kDump), Mv(kDump), "/bin/rm|-rf|/var/crash/@app.core.xz",
                                        kRemoveDumps));
    EXPECT_FALSE(Exists(std::string(kDump) + ".xz"));
    EXPECT_TRUE(Exists(kDump));
  }
}

TEST_F(UploadFileTest, TellsOfACopyThatCannotBeTakenAway) {
  On("ALIBCExec").Nth(2).Return(1);
  On("ALIBCExecl").Nth(1).Return(-1);
  EXPECT_EQ(Upload(List({File("coredump", kDump)})), 0);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Fail to move coredump"),
                          Logged(kUnit, "Fail to remove temp log zip [/var/crash/@app.core.xz]"),
                          GivenUp("coredump", kDump)));
}

TEST_F(UploadFileTest, LooksOnlyWhetherTheRemovalOfACopyCouldRun) {
  for (const long result : {1L, -2L}) {
    StartOver();
    On("ALIBCExec").Nth(2).Return(1);
    On("ALIBCExecl").Nth(1).Return(result);
    EXPECT_EQ(Upload(List({File("coredump", kDump)})), 0);
    EXPECT_THAT(Log(),
                ElementsAre(Logged(kUnit, "Fail to move coredump"), GivenUp("coredump", kDump)));
  }
}

// With its ".xz" a path of 1,020 bytes is the longest that the buffer of 1,024 holds whole.
TEST_F(UploadFileTest, GivesADumpUpWhosePathFillsTheBuffer) {
  for (const size_t length : {1020U, 1021U, 1023U, 1024U, 4000U}) {
    StartOver();
    std::string path = "/volume1/@d";
    while (path.size() < length - 205) {
      path += "/" + std::string(99, 'd');
    }
    path += "/";
    WriteFile(path + "keep", "");
    path += std::string(length - path.size() - 5, 'x') + ".core";
    ASSERT_EQ(path.size(), length);
    WriteFile(path, "dump");
    EXPECT_EQ(Upload(List({File("coredump", path)})), 0);
    if (length <= 1020) {
      EXPECT_THAT(Log(), IsEmpty());
      EXPECT_THAT(Recorded(), ElementsAre(Xz(path), Mv(path), kRemoveDumps));
    } else {
      EXPECT_THAT(Log(), ElementsAre(GivenUp("coredump", path))) << length;
      EXPECT_THAT(Recorded(), ElementsAre(kRemoveDumps));
    }
    EXPECT_EQ(ReadFile(path), "dump");
    EXPECT_FALSE(Exists(path + ".xz"));
  }
}

// ---- The debug archive.

TEST_F(UploadFileTest, CollectsAndSendsTheDebugArchive) {
  EXPECT_EQ(Upload(List({File("debug.dat", "/etc/shadow", "u8")})), 0);
  EXPECT_THAT(Log(), IsEmpty());
  EXPECT_THAT(Recorded(), ElementsAre(kCollector, kZip, kRemoveDebug));
  ASSERT_THAT(RequestLines(), ElementsAre(kUpload));
  EXPECT_THAT(Requests()[0].body, HasSubstr("\"filename\":\"debugdat.zip\""));
  EXPECT_THAT(Requests()[0].body, HasSubstr("\"type\":\"debug.dat\""));
  EXPECT_THAT(Requests()[0].body, HasSubstr("\"fileuuid\":\"u8\""));
  EXPECT_THAT(Requests()[0].body, HasSubstr("facts"));
  EXPECT_FALSE(Exists("/tmp/quendel/debugdat"));
  EXPECT_TRUE(Exists("/tmp/quendel/debugdat.zip"));  // outside the directory, so it stays
}

TEST_F(UploadFileTest, GivesTheDebugArchiveUpWithoutItsDirectory) {
  On("ARVOFSMkdirP").Nth(1).Return(-1);
  EXPECT_EQ(Upload(List({File("debug.dat", "p")})), 0);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Fail to ARVOFSMkdirP for '/tmp/quendel/debugdat'"),
                                 GivenUp("debug.dat", "p")));
  EXPECT_THAT(Recorded(), IsEmpty());
  EXPECT_THAT(RequestLines(), ElementsAre(kNoFile));
}

TEST_F(UploadFileTest, GivesTheDebugArchiveUpWhenNothingCouldBeCollected) {
  for (const long status : {1L, -1L}) {
    StartOver();
    On("ALIBCExec").Nth(1).Return(status);
    EXPECT_EQ(Upload(List({File("debug.dat", "p")})), 0);
    EXPECT_THAT(Log(),
                ElementsAre(Logged(kUnit,
                                   "Fail to do log collector /usr/arvo/bin/arvomsg_collector2 "
                                   "/tmp/quendel/debugdat"),
                            GivenUp("debug.dat", "p")));
    EXPECT_THAT(Recorded(), ElementsAre(kCollector, kRemoveDebug));
  }
}

TEST_F(UploadFileTest, GivesTheDebugArchiveUpThatCouldNotBePacked) {
  for (const long result : {-1L, -2L}) {
    StartOver();
    On("ALIBCExecl").Nth(1).Return(result);
    EXPECT_EQ(Upload(List({File("debug.dat", "p")})), 0);
    EXPECT_THAT(Log(),
                ElementsAre(Logged(kUnit, "Fail to zip attachment /tmp/quendel/debugdat.zip"),
                            GivenUp("debug.dat", "p")));
    EXPECT_THAT(Recorded(), ElementsAre(kCollector, kZip, kRemoveDebug));
    EXPECT_FALSE(Exists("/tmp/quendel/debugdat"));
  }
}

TEST_F(UploadFileTest, LooksOnlyWhetherThePackingCouldRun) {
  InstallTool("/usr/bin/zip", "echo half > /tmp/quendel/debugdat.zip; exit 18");
  EXPECT_EQ(Upload(List({File("debug.dat", "")})), 0);
  EXPECT_THAT(Log(), IsEmpty());
  ASSERT_THAT(RequestLines(), ElementsAre(kUpload));
  EXPECT_THAT(Requests()[0].body, HasSubstr("half"));
}

// As with a zip that does not know the options.
TEST_F(UploadFileTest, FailsTheWholePostWithoutTheArchive) {
  InstallTool("/usr/bin/zip", "exit 16");
  EXPECT_EQ(Upload(List({File("coredump", kDump), File("debug.dat", "")})), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged("quendel_post_file_to_server", HasSubstr("CURL Error(26): ")),
                          Logged("quendel_send_upload_data", "Failed to post file to server"),
                          Logged(kUnit, "Send collect data fail")));
  EXPECT_THAT(Requests(), IsEmpty());
}

// ---- Several files.

TEST_F(UploadFileTest, SendsAllFilesInOnePostInTheirOrder) {
  WriteFile("/volume2/@two.core", "two");
  EXPECT_EQ(Upload(List({File("coredump", kDump, "first"), File("debug.dat", "", "second"),
                         File("coredump", "/volume2/@two.core", "third")})),
            0);
  ASSERT_THAT(RequestLines(), ElementsAre(kUpload));
  const std::string body = Requests()[0].body;
  const size_t first = body.find("\"fileuuid\":\"first\"");
  const size_t second = body.find("\"fileuuid\":\"second\"");
  const size_t third = body.find("\"fileuuid\":\"third\"");
  EXPECT_NE(third, std::string::npos);
  EXPECT_LT(first, second);
  EXPECT_LT(second, third);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST_F(UploadFileTest, OneFailedFileDoesNotStopTheOthers) {
  EXPECT_EQ(Upload(List({File("coredump", "/var/crash/@gone.core"), File("core", kDump),
                         File("coredump", kDump, "found")})),
            0);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Fail to compress coredump"),
                                 GivenUp("coredump", "/var/crash/@gone.core"),
                                 Logged(kUnit, "Get unknown upload file type: \"core\"."),
                                 GivenUp("core", kDump)));
  ASSERT_THAT(RequestLines(), ElementsAre(kUpload));
  EXPECT_THAT(Requests()[0].body, HasSubstr("\"fileuuid\":\"found\""));
  EXPECT_THAT(Requests()[0].body, Not(HasSubstr("gone")));
}

TEST_F(UploadFileTest, RemovesOnlyTheDirectoryOfTheKindPreparedLast) {
  EXPECT_EQ(Upload(List({File("coredump", kDump), File("debug.dat", "")})), 0);
  EXPECT_THAT(Recorded(), ElementsAre(Xz(kDump), Mv(kDump), kCollector, kZip, kRemoveDebug));
  EXPECT_TRUE(Exists(kMoved));
  EXPECT_FALSE(Exists("/tmp/quendel/debugdat"));

  EXPECT_EQ(Upload(List({File("debug.dat", ""), File("coredump", kDump)})), 0);
  EXPECT_FALSE(Exists("/tmp/quendel/coredump"));
  EXPECT_TRUE(Exists("/tmp/quendel/debugdat"));
}

TEST_F(UploadFileTest, AFileGivenUpStillDecidesWhichDirectoryGoes) {
  EXPECT_EQ(Upload(List({File("debug.dat", ""), File("coredump", "/var/crash/@gone.core")})), 0);
  EXPECT_FALSE(Exists("/tmp/quendel/coredump"));
  EXPECT_TRUE(Exists("/tmp/quendel/debugdat"));
}

// ---- What becomes of it.

TEST_F(UploadFileTest, FailsWhenTheServerRefusesTheFiles) {
  Answer({.body = R"({"success":false,"code":111000})"});
  EXPECT_EQ(Upload(List({File("coredump", kDump)})), -1);
  EXPECT_EQ(Log().back().message, "Send collect data fail");
  EXPECT_EQ(Log().back().unit, kUnit);
  EXPECT_FALSE(Exists("/tmp/quendel/coredump"));
  EXPECT_THAT(RequestLines(), ElementsAre(kUpload));
}

TEST_F(UploadFileTest, FailsWhenTheServerCannotBeToldThatThereIsNoFile) {
  Answer({.body = R"({"success":false})"});
  EXPECT_EQ(Upload(List({File("coredump", "/var/crash/@gone.core")})), -1);
  EXPECT_EQ(Log().back().message, "Failed to update progress to server");
  EXPECT_EQ(Log().back().unit, kUnit);
  EXPECT_FALSE(Exists("/tmp/quendel/coredump"));
}

TEST_F(UploadFileTest, TellsOfADirectoryThatCannotBeRemoved) {
  On("ALIBCExecl").Nth(1).Return(-1);
  EXPECT_EQ(Upload(List({File("coredump", kDump)})), 0);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Fail to remove temp logs [/tmp/quendel/coredump]")));
}

TEST_F(UploadFileTest, LooksOnlyWhetherTheRemovalCouldRun) {
  for (const long result : {1L, -2L}) {
    StartOver();
    On("ALIBCExecl").Nth(1).Return(result);
    EXPECT_EQ(Upload(List({File("coredump", kDump)})), 0);
    EXPECT_THAT(Log(), IsEmpty());
  }
}

TEST_F(UploadFileTest, RemovalThatFailsDoesNotChangeTheResult) {
  On("ALIBCExecl").Nth(1).Return(-1);
  Answer({.status = 500, .body = "oops"});
  EXPECT_EQ(Upload(List({File("coredump", kDump)})), -1);
  EXPECT_EQ(Log().back().message, "Fail to remove temp logs [/tmp/quendel/coredump]");
}
