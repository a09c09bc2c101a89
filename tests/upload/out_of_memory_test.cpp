// Memory runs out at each allocation in turn. Whichever it is, nothing is thrown at the caller, and
// a failure is one of the documented ones, with its line in the log.
#include <gmock/gmock.h>

#include "base/json_text.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/device.h"
#include "support/log.h"
#include "support/scarce_memory.h"

namespace {

using namespace quendel::test;
using testing::AllOf;
using testing::Contains;
using testing::Field;
using testing::Gt;
using testing::HasSubstr;
using testing::MatchesRegex;
using testing::Not;
using testing::SizeIs;

struct Outcome {
  int result;
  std::string log;
};

std::string LogText() {
  std::string lines;
  for (const LogLine& line : Log()) {
    lines += "\n" + line.unit + ":" + std::to_string(line.line) + " " + line.message;
  }
  return lines;
}

// Returns what came of the operation with each of its allocations failed.
std::vector<Outcome> FailEachAllocation(
    void (*prepare)(), int (*operation)(), void (*inspect)() = [] {}) {
  std::vector<Outcome> outcomes;
  // What a process sets up once, libcurl for instance, is not to be counted.
  prepare();
  EXPECT_EQ(operation(), 0);
  const auto descriptors = OpenDescriptors();
  for (long nth = 1;; ++nth) {
    prepare();
    ClearLog();
    FailAllocation(nth);
    const int result = operation();
    if (!AllocateFreely()) {
      EXPECT_EQ(result, 0);
      return outcomes;
    }
    EXPECT_TRUE(result == 0 || result == -1) << nth << " gave " << result;
    EXPECT_TRUE(result == 0 || !Log().empty()) << nth;
    EXPECT_EQ(OpenDescriptors(), descriptors) << nth;
    inspect();
    outcomes.push_back({result, LogText()});
  }
}

const Json::Value& Request() {
  static const Json::Value request = [] {
    Json::Value files;
    quendel::JsonFromText(R"([{"file_type":"coredump","file_uuid":"the first of the files",
                               "file_path":"/var/crash/@app.core"},
                              {"file_type":"debug.dat","file_uuid":"the second of the files"}])",
                          files);
    return files;
  }();
  return request;
}

}  // namespace

TEST(OutOfMemoryTest, FailsAnUploadAsDocumented) {
  const auto prepare = [] {
    SetIdentity();
    WriteFile("/var/crash/@app.core", "dump");
    InstallTool("/usr/arvo/bin/arvomsg_collector2", "echo facts > \"$1/facts.txt\"");
    InstallTool("/usr/bin/zip", "echo archive > /tmp/quendel/debugdat.zip");
  };
  const std::vector<Outcome> outcomes = FailEachAllocation(
      prepare, [] { return QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN, Request()); });
  ASSERT_THAT(outcomes, SizeIs(Gt(50U)));
  // The first is the path that is to be matched, and costs the request.
  EXPECT_EQ(outcomes[0].result, -1);
  EXPECT_THAT(outcomes[0].log,
              MatchesRegex("\nquendel_upload_file:[0-9]+ Validate filepath failed"));
  // Later ones cost one file, or the delivery.
  EXPECT_THAT(
      outcomes,
      Contains(AllOf(
          Field(&Outcome::result, 0),
          Field(&Outcome::log, MatchesRegex("\nquendel_upload_file:[0-9]+ Prepare uploaded "
                                            "file failed .coredump.:..var.crash.@app.core.")))));
  EXPECT_THAT(outcomes, Contains(Field(&Outcome::log, HasSubstr("Send collect data fail"))));
}

TEST(OutOfMemoryTest, FailsAnUploadWithoutFilesAsDocumented) {
  const std::vector<Outcome> outcomes = FailEachAllocation(
      [] { SetIdentity(); },
      [] { return QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN, Json::Value()); });
  ASSERT_THAT(outcomes, SizeIs(Gt(10U)));
  for (const Outcome& outcome : outcomes) {
    EXPECT_THAT(outcome.log, Not(HasSubstr("Send collect data fail")));
    if (outcome.result != 0) {
      EXPECT_THAT(outcome.log, HasSubstr("Failed to update progress to server"));
    }
  }
}

TEST(OutOfMemoryTest, FailsTheDeliveryAsDocumented) {
  EXPECT_THAT(
      FailEachAllocation([] { SetIdentity(); }, [] { return QUENDELSendUploadData(17, {}); }),
      SizeIs(Gt(10U)));
}

// As long as there is an account, there is a session that can be closed.
TEST(OutOfMemoryTest, FailsTheEndOfASessionAsDocumented) {
  const auto prepare = [] {
    SetIdentity();
    ASSERT_EQ(QUENDELSupportAccountUserCreate("long-name-of-a-support-account", "key"), 0);
    WriteFile("/usr/arvo/etc/quendel.remote.conf",
              "remote_account=long-name-of-a-support-account\nstop_sshd_after_complete=yes\n");
  };
  const auto inspect = [] {
    EXPECT_TRUE(!Exists("/run/quendelhome") || Exists("/usr/arvo/etc/quendel.remote.conf"));
  };
  EXPECT_THAT(
      FailEachAllocation(
          prepare, [] { return QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE); }, inspect),
      SizeIs(Gt(10U)));
}

TEST(OutOfMemoryTest, FailsTheSupportAccountAsDocumented) {
  FailEachAllocation([] { RemoveFile("/run/quendelhome"); },
                     [] { return QUENDELSupportAccountUserCreate("support", "key"); });
  FailEachAllocation([] { ASSERT_EQ(QUENDELSupportAccountUserCreate("support", "key"), 0); },
                     [] { return QUENDELSupportAccountUserDelete("support"); });
}

TEST(OutOfMemoryTest, FailsTheSessionKeyAsDocumented) {
  FailEachAllocation([] { InstallTool("/usr/arvo/sbin/arvocloudserviceauth", "echo key"); },
                     [] {
                       char key[32] = {};
                       return QUENDELGetRemoteSessionKey(key, sizeof key - 1);
                     });
}
