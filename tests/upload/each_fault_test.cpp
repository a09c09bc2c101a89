// Calls that can fail, each failed once: what is logged, what the result is, what lies on the disk
// afterwards, and that no descriptor stays open. Memory is the leak checker's, under its preset.
//
// The tables have a row for each call of the functions that ExpectRowForEachCall() names; such a
// call without a row fails the last test of a table.
#include <gmock/gmock.h>
#include <regex.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <map>
#include <set>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/json.h"
#include "support/log.h"
#include "support/server.h"

using namespace quendel::test;
using testing::ElementsAreArray;
using testing::IsEmpty;
using testing::StartsWith;

namespace {

namespace fs = std::filesystem;

using Texts = std::vector<std::string>;
using Lines = std::vector<testing::Matcher<std::string>>;

// One call that fails, and what comes of it.
struct Fault {
  const char* function;
  int nth;
  long failure;
  int result;
  Lines lines;  // "unit: message"
  Texts left;   // everything at the operation's places
};

Fault Row(const char* function, int nth, long failure, int result, const Lines& lines,
          const Texts& left) {
  return {function, nth, failure, result, lines, left};
}

void PrintTo(const Fault& fault, std::ostream* out) {
  *out << fault.function << fault.nth;
}

std::string NameOf(const testing::TestParamInfo<Fault>& info) {
  std::string name = info.param.function + std::to_string(info.param.nth);
  name.erase(std::remove(name.begin(), name.end(), ':'), name.end());
  return name;
}

Texts LoggedLines() {
  Texts lines;
  for (const LogLine& line : Log()) {
    lines.push_back(line.unit + ": " + line.message);
  }
  return lines;
}

// The places that exist, with everything below them.
Texts FilesAt(const Texts& places) {
  std::set<std::string> files;
  for (const std::string& place : places) {
    if (fs::exists(place)) {
      files.insert(place);
    }
    if (fs::is_directory(place)) {
      for (const auto& entry : fs::recursive_directory_iterator(place)) {
        files.insert(entry.path());
      }
    }
  }
  return {files.begin(), files.end()};
}

// Has the call fail during the operation and compares.
void ExpectConsequences(const Fault& fault, int (*operation)(), const Texts& places) {
  const auto descriptors = OpenDescriptors();
  ResetCalls();
  On(fault.function).Nth(fault.nth).Return(fault.failure);
  EXPECT_EQ(operation(), fault.result);
  EXPECT_THAT(LoggedLines(), ElementsAreArray(fault.lines));
  EXPECT_THAT(FilesAt(places), ElementsAreArray(fault.left));
  EXPECT_EQ(OpenDescriptors(), descriptors);
  EXPECT_GE(Calls(fault.function), fault.nth) << "this call is never made";
}

// Compares a table's rows with the calls that are made when nothing fails.
void ExpectRowForEachCall(const std::vector<Fault>& table, int (*operation)()) {
  std::map<std::string, int> rows;
  for (const Fault& fault : table) {
    ++rows[fault.function];
  }
  ResetCalls();
  EXPECT_EQ(operation(), 0);
  EXPECT_THAT(Log(), IsEmpty());
  for (const char* function : {"regcomp",
                               "calloc",
                               "chown",
                               "fchmod",
                               "fdopen",
                               "ALIBCExec",
                               "ALIBCExecl",
                               "ALIBCPopen",
                               "ARVOFSMkdirP",
                               "ALIBCFileCheckDir",
                               "ALIBCFileGetPair",
                               "ALIBCSzHashAlloc",
                               "ALIBCMResultAlloc",
                               "ARVOLocalAccountUserPrepareForQuendel",
                               "ARVOLocalAccountUserDelete",
                               "ARVOMYHUBAccountGet",
                               "ALIBGetSerialNumber",
                               "ARVO::APIRunner::Exec",
                               "curl_formadd",
                               "curl_slist_append",
                               "curl_easy_init",
                               "curl_easy_setopt",
                               "curl_easy_perform",
                               "curl_easy_getinfo"}) {
    EXPECT_EQ(rows[function], Calls(function)) << function;
  }
}

// ---- The upload of a crash dump and of the debug archive.

constexpr char kDump[] = "/volume1/@dumps/app.core";
constexpr char kWorkRoot[] = "/tmp/quendel";
constexpr char kDumpDir[] = "/tmp/quendel/coredump";
constexpr char kMovedDump[] = "/tmp/quendel/coredump/app.core.xz";
constexpr char kDebugDir[] = "/tmp/quendel/debugdat";
constexpr char kFacts[] = "/tmp/quendel/debugdat/facts.txt";
constexpr char kArchive[] = "/tmp/quendel/debugdat.zip";

constexpr char kDumpGivenUp[] =
    "quendel_upload_file: Prepare uploaded file failed [coredump]:[/volume1/@dumps/app.core]";
constexpr char kDebugGivenUp[] = "quendel_upload_file: Prepare uploaded file failed [debug.dat]:[]";
constexpr char kNotSent[] = "quendel_upload_file: Send collect data fail";
constexpr char kNotPosted[] = "quendel_send_upload_data: Failed to post file to server";

const Texts kUploadPlaces = {"/tmp/quendel", "/volume1/@dumps"};

// What is left below the work root, if that was made, and the dump, which always stays.
Texts UploadLeaves(Texts files) {
  files.insert(files.end(), {"/volume1/@dumps", kDump});
  return files;
}

// Nothing that the post does, or fails to do, changes what is left.
Fault PostFault(const char* function, int nth, long failure, const Lines& lines) {
  return {function, nth,   failure,
          -1,       lines, UploadLeaves({kWorkRoot, kDumpDir, kMovedDump, kArchive})};
}

Fault CurlFault(const char* function, int nth, long failure, const char* error) {
  return PostFault(
      function, nth, failure,
      {std::string("quendel_post_file_to_server: CURL Error") + error, kNotPosted, kNotSent});
}

std::vector<Fault> UploadFaults() {
  std::vector<Fault> faults = {
      Row("regcomp", 1, REG_ESPACE, -1,
          {"quendel_upload_file: Invalid file path '/volume1/@dumps/app.core'",
           "quendel_upload_file: Validate filepath failed"},
          UploadLeaves({})),
      Row("ARVOFSMkdirP", 1, -1, 0,
          {"quendel_upload_file: Fail to ARVOFSMkdirP for '/tmp/quendel/coredump'", kDumpGivenUp},
          UploadLeaves({kWorkRoot, kArchive})),
      Row("ALIBCExec", 1, -1, 0, {"quendel_upload_file: Fail to compress coredump", kDumpGivenUp},
          UploadLeaves({kWorkRoot, kDumpDir, kArchive})),
      Row("ALIBCExec", 2, -1, 0, {"quendel_upload_file: Fail to move coredump", kDumpGivenUp},
          UploadLeaves({kWorkRoot, kDumpDir, kArchive})),
      Row("ARVOFSMkdirP", 2, -1, 0,
          {"quendel_upload_file: Fail to ARVOFSMkdirP for '/tmp/quendel/debugdat'", kDebugGivenUp},
          UploadLeaves({kWorkRoot})),
      Row("ALIBCExec", 3, -1, 0,
          {"quendel_upload_file: Fail to do log collector /usr/arvo/bin/arvomsg_collector2 "
           "/tmp/quendel/debugdat",
           kDebugGivenUp},
          UploadLeaves({kWorkRoot, kDumpDir, kMovedDump})),
      Row("ALIBCExecl", 1, -1, 0,
          {"quendel_upload_file: Fail to zip attachment /tmp/quendel/debugdat.zip", kDebugGivenUp},
          UploadLeaves({kWorkRoot, kDumpDir, kMovedDump})),
      Row("ALIBCExecl", 2, -1, 0,
          {"quendel_upload_file: Fail to remove temp logs [/tmp/quendel/debugdat]"},
          UploadLeaves({kWorkRoot, kDumpDir, kMovedDump, kDebugDir, kArchive, kFacts})),
      PostFault("calloc", 1, 0,
                {"quendel_send_upload_data: Failed to malloc for pMyhubAccount", kNotSent}),
      PostFault("ARVOMYHUBAccountGet", 1, -1,
                {"quendel_send_upload_data: Failed to get account", kNotSent}),
      PostFault("ALIBGetSerialNumber", 1, -1,
                {"quendel_send_upload_data: Failed to get serial number", kNotSent}),
      Row("curl_formadd", 1, 1, 0,
          {"quendel_post_file_to_server: Failed to add curl form: "
           "'/tmp/quendel/coredump/app.core.xz'"},
          UploadLeaves({kWorkRoot, kDumpDir, kMovedDump, kArchive})),
      Row("curl_formadd", 2, 1, 0,
          {"quendel_post_file_to_server: Failed to add curl form: '/tmp/quendel/debugdat.zip'"},
          UploadLeaves({kWorkRoot, kDumpDir, kMovedDump, kArchive})),
      PostFault("curl_formadd", 3, 1,
                {StartsWith("quendel_post_file_to_server: Failed to add curl form: [{"), kNotPosted,
                 kNotSent}),
      PostFault("curl_easy_init", 1, 0,
                {"quendel_post_file_to_server: Failed to allocate memory for curl", kNotPosted,
                 kNotSent}),
      CurlFault("curl_easy_perform", 1, 7, "(7): Couldn't connect to server"),
      CurlFault("curl_easy_getinfo", 1, 48, "(48): An unknown option was passed in to libcurl"),
  };
  for (int nth = 1; nth <= 7; ++nth) {
    faults.push_back(CurlFault("curl_easy_setopt", nth, 27, "(27): Out of memory"));
  }
  return faults;
}

int UploadBoth() {
  return QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN,
                           JsonOf(R"([{"file_type":"coredump","file_uuid":"u1",
                                       "file_path":"/volume1/@dumps/app.core"},
                                      {"file_type":"debug.dat","file_uuid":"u2"}])"));
}

// The debug archive needs no real zip here.
void PrepareUpload() {
  SetIdentity();
  WriteFile(kDump, "what the program held in memory");
  InstallTool("/usr/arvo/bin/arvomsg_collector2", "echo facts > \"$1/facts.txt\"");
  InstallTool("/usr/bin/zip", "echo archive > /tmp/quendel/debugdat.zip");
}

// ---- The end of a support session.

constexpr char kConf[] = "/usr/arvo/etc/quendel.remote.conf";
constexpr char kHome[] = "/run/quendelhome";
constexpr char kSshDir[] = "/run/quendelhome/.ssh";
constexpr char kKeyFile[] = "/run/quendelhome/.ssh/authorized_keys";

const Texts kSessionPlaces = {kHome, kConf};
const Texts kHomeAndAll = {kHome, kSshDir, kKeyFile};

constexpr char kNotDeleted[] = "quendel_remote_close: Delete support account failed";
constexpr char kNotTold[] = "quendel_remote_close: Failed to update progress to server";
constexpr char kNotReported[] =
    "quendel_update_act_request_progress: Failed to post quendel config";

// What is left of a session: its home, its file.
Texts SessionLeaves(const Texts& home, bool conf) {
  Texts files = home;
  if (conf) {
    files.push_back(kConf);
  }
  return files;
}

// A report that fails leaves the session's file, so that the end can be repeated.
Fault ReportFault(const char* function, int nth, long failure, const Lines& lines) {
  Lines all = lines;
  all.push_back(kNotTold);
  return {function, nth, failure, -1, all, SessionLeaves({}, true)};
}

std::vector<Fault> CloseFaults() {
  std::vector<Fault> faults = {
      Row("ALIBCSzHashAlloc", 1, 0, -1,
          {"quendel_remote_close: Fail to allocate memory for alibc hash"},
          SessionLeaves(kHomeAndAll, true)),
      Row("ALIBCFileGetPair", 1, -1, -1,
          {"quendel_remote_close: Failed to get quendel key configuration file"},
          SessionLeaves(kHomeAndAll, true)),
      Row("ALIBCMResultAlloc", 1, 0, -1,
          {"quendel_support_account_user: ALIBCMResultCoreErrorsGet fail", kNotDeleted},
          SessionLeaves({}, true)),
      Row("ALIBCFileCheckDir", 1, -1, 0, {}, SessionLeaves(kHomeAndAll, false)),
      Row("ALIBCExec", 1, -1, -1,
          {"quendel_support_account_user: Failed to remove '/run/quendelhome'", kNotDeleted},
          SessionLeaves(kHomeAndAll, true)),
      Row("ARVOLocalAccountUserDelete", 1, -1, -1,
          {"quendel_support_account_user: ALIBCMResultCoreErrorsGet fail", kNotDeleted},
          SessionLeaves({}, true)),
      ReportFault("calloc", 1, 0,
                  {"quendel_update_act_request_progress: Failed to malloc for pMyhubAccount"}),
      ReportFault("ALIBGetSerialNumber", 1, -1,
                  {"quendel_update_act_request_progress: Failed to get serial number"}),
      ReportFault("ARVOMYHUBAccountGet", 1, -1,
                  {"quendel_update_act_request_progress: Failed to get account"}),
      ReportFault(
          "curl_easy_init", 1, 0,
          {"quendel_post_data_to_server: Failed to allocate memory for curl", kNotReported}),
      ReportFault(
          "curl_easy_perform", 1, 7,
          {"quendel_post_data_to_server: CURL Error(7): Couldn't connect to server", kNotReported}),
      ReportFault("curl_easy_getinfo", 1, 48,
                  {"quendel_post_data_to_server: CURL Error(48): An unknown option was passed in "
                   "to libcurl",
                   kNotReported}),
      Row("ARVO::APIRunner::Exec", 1, 0, 0, {"quendel_remote_close: Failed to stop ssh service"},
          SessionLeaves({}, false)),
      Row("ALIBCExec", 2, -1, -1,
          {"quendel_remote_close: Failed to rm dir '/usr/arvo/etc/quendel.remote.conf'"},
          SessionLeaves({}, true)),
  };
  for (int nth = 1; nth <= 3; ++nth) {
    faults.push_back(ReportFault(
        "curl_slist_append", nth, 0,
        {"quendel_post_data_to_server: Failed to allocate memory for curl", kNotReported}));
  }
  for (int nth = 1; nth <= 9; ++nth) {
    faults.push_back(
        ReportFault("curl_easy_setopt", nth, 27,
                    {"quendel_post_data_to_server: CURL Error(27): Out of memory", kNotReported}));
  }
  return faults;
}

std::vector<Fault> OpenFaults() {
  return {
      Row("ALIBCFileCheckDir", 1, 1, -1,
          {"quendel_support_account_user: Failed to chown '/run/quendelhome'"}, {}),
      Row("ALIBCExec", 1, -1, -1,
          {"quendel_support_account_user: Failed to mkdir '/run/quendelhome/.ssh'\n"}, {}),
      Row("chown", 1, -1, -1, {"quendel_support_account_user: Failed to chown '/run/quendelhome'"},
          {kHome, kSshDir}),
      Row("ARVOLocalAccountUserPrepareForQuendel", 1, -1, -1,
          {"quendel_support_account_user: Failed to prepare local account 'support'"},
          {kHome, kSshDir}),
      Row("fdopen", 1, 0, -1,
          {"quendel_support_account_user: Failed to open "
           "'/run/quendelhome/.ssh/authorized_keys'"},
          kHomeAndAll),
      Row("fchmod", 1, -1, -1,
          {"quendel_support_account_user: Failed to chmod "
           "'/run/quendelhome/.ssh/authorized_keys'"},
          kHomeAndAll),
  };
}

int OpenSession() {
  return QUENDELSupportAccountUserCreate("support", "key");
}

int CloseSession() {
  return QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE);
}

void PrepareClose() {
  SetIdentity();
  ASSERT_EQ(OpenSession(), 0);
  WriteFile(kConf, "remote_account=support\nstop_sshd_after_complete=yes\n");
}

}  // namespace

class UploadFaultTest : public testing::TestWithParam<Fault> {};

TEST_P(UploadFaultTest, HasItsConsequencesAndNoOthers) {
  PrepareUpload();
  ExpectConsequences(GetParam(), UploadBoth, kUploadPlaces);
}

INSTANTIATE_TEST_SUITE_P(, UploadFaultTest, testing::ValuesIn(UploadFaults()), NameOf);

TEST(UploadFaultsTest, HaveARowForEachCall) {
  PrepareUpload();
  ExpectRowForEachCall(UploadFaults(), UploadBoth);
  EXPECT_THAT(FilesAt(kUploadPlaces),
              ElementsAreArray(UploadLeaves({kWorkRoot, kDumpDir, kMovedDump, kArchive})));
}

class RemoteCloseFaultTest : public testing::TestWithParam<Fault> {};

TEST_P(RemoteCloseFaultTest, HasItsConsequencesAndNoOthers) {
  PrepareClose();
  ExpectConsequences(GetParam(), CloseSession, kSessionPlaces);
}

// Whatever went wrong, the same call again ends the session.
TEST_P(RemoteCloseFaultTest, IsMendedByRepeatingTheCall) {
  PrepareClose();
  ResetCalls();
  On(GetParam().function).Nth(GetParam().nth).Return(GetParam().failure);
  if (CloseSession() != 0) {
    ResetCalls();
    EXPECT_EQ(CloseSession(), 0);
    EXPECT_THAT(FilesAt(kSessionPlaces), IsEmpty());
  }
}

INSTANTIATE_TEST_SUITE_P(, RemoteCloseFaultTest, testing::ValuesIn(CloseFaults()), NameOf);

TEST(RemoteCloseFaultsTest, HaveARowForEachCall) {
  PrepareClose();
  ExpectRowForEachCall(CloseFaults(), CloseSession);
  EXPECT_THAT(FilesAt(kSessionPlaces), IsEmpty());
}

class OpenSessionFaultTest : public testing::TestWithParam<Fault> {};

TEST_P(OpenSessionFaultTest, HasItsConsequencesAndNoOthers) {
  ExpectConsequences(GetParam(), OpenSession, kSessionPlaces);
}

INSTANTIATE_TEST_SUITE_P(, OpenSessionFaultTest, testing::ValuesIn(OpenFaults()), NameOf);

TEST(OpenSessionFaultsTest, HaveARowForEachCall) {
  ExpectRowForEachCall(OpenFaults(), OpenSession);
  EXPECT_THAT(FilesAt(kSessionPlaces), ElementsAreArray(kHomeAndAll));
}
