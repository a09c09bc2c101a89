// server, test-connection, facts and version: what they print and how they end.
#include <gmock/gmock.h>

#include "quendel.h"
#include "quendelctl/run_quendelctl.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;

namespace {

constexpr char kInfo[] = "/etc.defaults/arvoinfo.conf";

}  // namespace

TEST(ServerCommandTest, ShowsTheHost) {
  const Output output = Quendelctl({"server"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "support.test\n");
  EXPECT_THAT(output.err, IsEmpty());
}

TEST(ServerCommandTest, PrintsTheUrlAsJson) {
  const Output output = Quendelctl({"server", "--json"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out,
            "{\"host\":\"support.test\",\"success\":true,\"url\":\"https://support.test\"}\n");
}

TEST(TestConnectionCommandTest, SaysThatTheServerCanBeReached) {
  const Output output = Quendelctl({"test-connection"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "The server support.test can be reached.\n");
  EXPECT_THAT(output.err, IsEmpty());
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(TestConnectionCommandTest, FailsWhenTheServerCannotBeReached) {
  WriteFile(kInfo, "quendel_server=\"nowhere.test\"\n");
  const Output text = Quendelctl({"test-connection"});
  EXPECT_EQ(text.status, 1);
  EXPECT_EQ(text.out, "The server nowhere.test cannot be reached.\n");
  EXPECT_THAT(text.err, HasSubstr("Failed to get IP address of target hostname: nowhere.test\n"));
  const Output json = Quendelctl({"test-connection", "--json"});
  EXPECT_EQ(json.status, 1);
  EXPECT_EQ(json.out,
            "{\"error\":\"The server nowhere.test cannot be reached.\",\"host\":\"nowhere.test\","
            "\"reason\":\"failed\",\"success\":false}\n");
}

TEST(TestConnectionCommandTest, PrintsJson) {
  const Output output = Quendelctl({"test-connection", "--json"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "{\"host\":\"support.test\",\"success\":true}\n");
}

TEST(FactsCommandTest, ShowsEachFactOnALine) {
  SetIdentity({{"service_quendeld", "yes"}});
  WriteFile("/usr/arvo/etc/quendel.conf", "contact=[{\"name\":\"J\xC3\xB6rg\"}]\n");
  const Output output = Quendelctl({"facts"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.out, MatchesRegex("Model:           TEST-1\n"
                                       "Version:         HMX 3\\.2-2044\n"
                                       "Local time:      [0-9]{8}_[0-9]{6}\n"
                                       "Service enabled: yes\n"
                                       "Server host:     support\\.test\n"
                                       "Contact:         \\[\\{\"name\":\"J\xC3\xB6rg\"\\}\\]\n"));
  EXPECT_THAT(output.err, IsEmpty());
}

TEST(FactsCommandTest, PrintsJson) {
  SetIdentity({{"service_quendeld", "no"}});
  const Output output = Quendelctl({"facts", "--json"});
  EXPECT_EQ(output.status, 0);
  Json::Value facts = FromJsonLine(output.out);
  EXPECT_THAT(facts["local_time"].asString(), MatchesRegex("[0-9]{8}_[0-9]{6}"));
  facts.removeMember("local_time");
  EXPECT_EQ(facts, FromJsonLine("{\"contact\":[],\"model\":\"TEST-1\",\"server_host\":"
                                "\"support.test\",\"service_enabled\":false,\"success\":true,"
                                "\"version\":\"HMX 3.2-2044\",\"warnings\":[]}\n"));
}

TEST(FactsCommandTest, ShowsTheOtherFactsWhenOneIsUnknown) {
  RemoveFile(kInfo);
  const Output text = Quendelctl({"facts"});
  EXPECT_EQ(text.status, 1);
  EXPECT_THAT(text.out, HasSubstr("Model:           (unknown)\nVersion:         HMX 3.2-2044\n"));
  EXPECT_THAT(text.out, HasSubstr("Contact:         []\n"));
  EXPECT_THAT(text.err, HasSubstr("quendel_device_facts:"));
  EXPECT_THAT(text.err, HasSubstr("Failed to get model name\n"));
  const Json::Value facts = FromJsonLine(Quendelctl({"facts", "--json"}).out);
  EXPECT_EQ(facts["success"], false);
  EXPECT_TRUE(facts["model"].isNull());
  EXPECT_EQ(facts["version"], "HMX 3.2-2044");
}

TEST(FactsCommandTest, FailsWhenTheSettingsCannotBeRead) {
  WriteFile("/usr/arvo/etc/quendel.conf/inside", "");  // a folder where the file should be
  const Output output = Quendelctl({"facts"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.out, HasSubstr("Contact:         (unknown)\n"));
}

TEST(VersionCommandTest, ShowsTheVersion) {
  const Output text = Quendelctl({"version"});
  EXPECT_EQ(text.status, 0);
  EXPECT_EQ(text.out, QUENDEL_VERSION "\n");
  const Output json = Quendelctl({"version", "--json"});
  EXPECT_EQ(json.status, 0);
  EXPECT_EQ(json.out, "{\"success\":true,\"version\":\"" QUENDEL_VERSION "\"}\n");
}
