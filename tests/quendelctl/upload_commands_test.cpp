// upload: the request that it builds, what is sent, what it prints and how it ends.
#include <gmock/gmock.h>

#include "quendelctl/run_quendelctl.h"
#include "support/appliance.h"
#include "support/multipart.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::Not;
using testing::SizeIs;

namespace {

constexpr char kDump[] = "/var/crash/@x.core";
constexpr char kUuid[] = "[0-9a-f]{8}-[0-9a-f]{4}-4[0-9a-f]{3}-[89ab][0-9a-f]{3}-[0-9a-f]{12}";

class UploadCommandTest : public testing::Test {
 protected:
  void SetUp() override {
    SetIdentity();
    WriteFile(kDump, "dump");
  }
};

// The description of the files in the one post that the server got.
Json::Value Descriptions() {
  const std::vector<Request> requests = Requests();
  EXPECT_THAT(requests, SizeIs(1));
  const std::vector<Part> parts = requests.empty() ? std::vector<Part>() : Parts(requests[0]);
  EXPECT_FALSE(parts.empty());
  return parts.empty() ? Json::Value() : FromJsonLine(parts.back().body + "\n");
}

}  // namespace

TEST_F(UploadCommandTest, SendsACrashDump) {
  const Output output = Quendelctl({"upload", "17", kDump, "--uuid", "u1"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out,
            "Request 17 is answered. It asked for:\n  u1  coredump  /var/crash/@x.core\n");
  EXPECT_THAT(output.err, IsEmpty());
  EXPECT_THAT(RequestLines(), testing::ElementsAre("POST /upload_file/17/a1/b2/S1 HTTP/1.1"));
  const Json::Value files = Descriptions();
  ASSERT_EQ(files.size(), 1U);
  EXPECT_EQ(files[0]["filename"], "@x.core.xz");
  EXPECT_EQ(files[0]["type"], "coredump");
  EXPECT_EQ(files[0]["fileuuid"], "u1");
  EXPECT_EQ(ReadFile(kDump), "dump");
}

TEST_F(UploadCommandTest, SendsTheDebugArchive) {
  const Output output = Quendelctl({"upload", "17", "debug.dat", "--uuid", "u2"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "Request 17 is answered. It asked for:\n  u2  debug.dat\n");
  EXPECT_THAT(output.err, IsEmpty());
  const Json::Value files = Descriptions();
  ASSERT_EQ(files.size(), 1U);
  EXPECT_EQ(files[0]["filename"], "debugdat.zip");
  EXPECT_EQ(files[0]["type"], "debug.dat");
  EXPECT_EQ(files[0]["fileuuid"], "u2");
}

TEST_F(UploadCommandTest, GivesEachFileTheUuidOfItsPlace) {
  WriteFile("/volume1/@y/z.core", "other");
  const Output output = Quendelctl(
      {"upload", "--uuid", "u1", "17", "/volume1/@y/z.core", kDump, "--uuid", "u2", "--json"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(
      output.out,
      R"({"files":[{"file_path":"/volume1/@y/z.core","file_type":"coredump","file_uuid":"u1"},)"
      R"({"file_path":"/var/crash/@x.core","file_type":"coredump","file_uuid":"u2"}],)"
      R"("request_id":17,"success":true})"
      "\n");
  const Json::Value files = Descriptions();
  ASSERT_EQ(files.size(), 2U);
  EXPECT_EQ(files[0]["fileuuid"], "u1");
  EXPECT_EQ(files[1]["fileuuid"], "u2");
}

TEST_F(UploadCommandTest, MakesUpAUuidForEachFile) {
  const Output output = Quendelctl({"upload", "17", kDump, "debug.dat", "--json"});
  EXPECT_EQ(output.status, 0);
  const Json::Value request = FromJsonLine(output.out)["files"];
  const Json::Value files = Descriptions();
  ASSERT_EQ(files.size(), 2U);
  for (int i = 0; i < 2; ++i) {
    EXPECT_THAT(files[i]["fileuuid"].asString(), MatchesRegex(kUuid));
    EXPECT_EQ(files[i]["fileuuid"], request[i]["file_uuid"]);
  }
  EXPECT_NE(files[0]["fileuuid"], files[1]["fileuuid"]);
  EXPECT_EQ(request[1]["file_path"], "");
}

TEST_F(UploadCommandTest, TellsTheServerWhenNoFileIsLeft) {
  const Output output = Quendelctl({"upload", "17", "/var/crash/@missing.core", "--uuid", "u"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out,
            "Request 17 is answered. It asked for:\n  u  coredump  /var/crash/@missing.core\n");
  EXPECT_THAT(output.err, HasSubstr("Prepare uploaded file failed "
                                    "[coredump]:[/var/crash/@missing.core]\n"));
  EXPECT_THAT(RequestLines(),
              testing::ElementsAre("POST /action_progress/17/-3/a1/b2/S1 HTTP/1.1"));
}

TEST_F(UploadCommandTest, NamesTheFileThatMayNotBeSent) {
  for (const std::string path :
       {"/etc/passwd", "/var/crash/x.core", "/volume/@x.core", "/volume1/@x.core.gz",
        "/tmp/@x.core", "@x.core", "/var/crash/@.cor", "debug.dat2"}) {
    const Output output = Quendelctl({"upload", "17", kDump, path});
    EXPECT_EQ(output.status, 2) << path;
    EXPECT_THAT(output.out, IsEmpty());
    EXPECT_EQ(output.err, "quendelctl: FILE: " + path +
                              " is neither debug.dat nor /var/crash/@NAME.core or "
                              "/volumeN/@NAME.core\nRun with --help for more information.\n");
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

// What the program lets pass, the library takes as well.
TEST_F(UploadCommandTest, HasTheLibrarysRuleOfThePaths) {
  for (const std::string path : {"/var/crash/@missing.core", "/volume12/@a/missing.core",
                                 "/volume1/@\n.core", "/var/crash/@..core"}) {
    const Output output = Quendelctl({"upload", "17", path});
    EXPECT_EQ(output.status, 0) << path;
    EXPECT_THAT(output.err, Not(HasSubstr("Invalid file path")));
  }
  EXPECT_THAT(Quendelctl({"upload", "--help"}).out, HasSubstr("/volumeN/@NAME.core, where N is"));
}

TEST_F(UploadCommandTest, TakesFiveFilesAndNoMore) {
  std::vector<std::string> arguments = {"upload", "17", kDump, kDump, kDump, kDump, kDump};
  EXPECT_EQ(Quendelctl(arguments).status, 0);
  arguments.emplace_back("debug.dat");
  const Output output = Quendelctl(arguments);
  EXPECT_EQ(output.status, 2);
  EXPECT_THAT(output.err, HasSubstr("FILE: at most five can be sent at once\n"));
  EXPECT_THAT(Requests(), SizeIs(1));
}

TEST_F(UploadCommandTest, FailsWhenTheServerDeclines) {
  Answer({.body = R"({"success":false})"});
  const Output output = Quendelctl({"upload", "17", kDump, "--uuid", "u"});
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.out, "Request 17 failed. It asked for:\n  u  coredump  /var/crash/@x.core\n");
  EXPECT_THAT(output.err, HasSubstr("Send collect data fail\n"));
}

TEST_F(UploadCommandTest, RejectsAWrongCommandLine) {
  struct Row {
    std::vector<std::string> arguments;
    const char* complaint;
  };
  const Row rows[] = {
      {{"upload"}, "ID is required"},
      {{"upload", "17"}, "FILE is required"},
      {{"upload", "x", kDump}, "ID: x is not a whole number that fits 32 bits"},
      {{"upload", "17", kDump, "--uuid"}, "--uuid"},
      {{"upload", "17", kDump, kDump, "--uuid", "u"}, "--uuid: needed once for each FILE"},
      {{"upload", "17", kDump, "--uuid", "u", "--uuid", "v"}, "--uuid: needed once for each FILE"},
  };
  for (const Row& row : rows) {
    const Output output = Quendelctl(row.arguments);
    EXPECT_EQ(output.status, 2) << row.complaint;
    EXPECT_THAT(output.out, IsEmpty());
    EXPECT_THAT(output.err, HasSubstr(row.complaint));
  }
  EXPECT_THAT(Requests(), IsEmpty());
}
