// heartbeat, event and progress: what they send, what they print and how they end.
#include <gmock/gmock.h>

#include "quendelctl/run_quendelctl.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::IsEmpty;

namespace {

constexpr char kEnableBody[] =
    R"({"action":"enable","contact":[],"hmx_account_email":"mail1","hmx_info":{"model":"X"}})";

// What the heartbeat prints when the server's reply has this "actions" member.
std::string TextForActions(const std::string& actions) {
  Answer({.body = R"({"success":true,"actions":)" + actions + "}"});
  const Output output = Quendelctl({"heartbeat"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.err, IsEmpty());
  return output.out;
}

Json::Value LastBody() {
  Json::Value body;
  const std::vector<Request> requests = Requests();
  EXPECT_FALSE(requests.empty());
  return requests.empty() ? body : FromJsonLine(requests.back().body + "\n");
}

std::string LastLine() {
  const std::vector<Request> requests = Requests();
  EXPECT_FALSE(requests.empty());
  return requests.empty() ? "" : requests.back().line;
}

class ConversationCommandTest : public testing::Test {
 protected:
  void SetUp() override { SetIdentity(); }
};

// One class for each command, so that a test's name begins with the command's.
using HeartbeatCommandTest = ConversationCommandTest;
using EventCommandTest = ConversationCommandTest;
using ProgressCommandTest = ConversationCommandTest;

}  // namespace

TEST_F(HeartbeatCommandTest, SendsAHeartbeat) {
  EXPECT_EQ(Quendelctl({"heartbeat"}).status, 0);
  EXPECT_EQ(LastLine(), "POST /heartbeat/S1 HTTP/1.1");
}

TEST_F(HeartbeatCommandTest, SaysWhenThereAreNoActions) {
  constexpr char kNone[] = "The server has queued no actions.\n";
  EXPECT_EQ(Quendelctl({"heartbeat"}).out, kNone);
  EXPECT_EQ(TextForActions("[]"), kNone);
  EXPECT_EQ(TextForActions("{}"), kNone);
  EXPECT_EQ(TextForActions("null"), kNone);
}

TEST_F(HeartbeatCommandTest, ShowsOneActionALine) {
  EXPECT_EQ(TextForActions(R"([{"x":1}])"), "The server has queued 1 action:\n  {\"x\":1}\n");
  EXPECT_EQ(TextForActions(R"([ {"id": 1, "a": []}, 7, "z" ])"),
            "The server has queued 3 actions:\n  {\"a\":[],\"id\":1}\n  7\n  \"z\"\n");
}

TEST_F(HeartbeatCommandTest, ShowsActionsOfAnyKind) {
  EXPECT_EQ(TextForActions(R"({"x":1})"), "The server has queued: {\"x\":1}\n");
  EXPECT_EQ(TextForActions("\"\""), "The server has queued: \"\"\n");
  EXPECT_EQ(TextForActions("false"), "The server has queued: false\n");
}

TEST_F(HeartbeatCommandTest, PrintsJson) {
  Answer({.body = R"({"success":true,"actions":[{"x":1}]})"});
  const Output output = Quendelctl({"heartbeat", "--json"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "{\"actions\":[{\"x\":1}],\"success\":true}\n");
  EXPECT_THAT(output.err, IsEmpty());
}

TEST_F(HeartbeatCommandTest, FailsWhenTheServerDeclines) {
  for (const char* form : {"text", "--json"}) {
    Answer({.body = R"({"success":false,"actions":[1]})"});
    const bool json = std::string(form) == "--json";
    const Output output = json ? Quendelctl({"heartbeat", "--json"}) : Quendelctl({"heartbeat"});
    EXPECT_EQ(output.status, 1);
    EXPECT_EQ(
        output.out,
        json ? "{\"error\":\"The heartbeat failed.\",\"reason\":\"failed\",\"success\":false}\n"
             : "The heartbeat failed.\n");
    EXPECT_THAT(output.err, ContainsRegex("^quendelctl: quendel_heartbeat:[0-9]+ Failed to send "
                                          "heartbeat, server return failed\\. \\[.*\\]\n$"));
  }
}

TEST_F(EventCommandTest, ReportsEachEventUnderItsName) {
  for (const std::string name :
       {"enable", "disable", "poweroff", "reboot", "logout", "update_info"}) {
    const Output output = Quendelctl({"event", name});
    EXPECT_EQ(output.status, 0);
    EXPECT_EQ(output.out, "The server accepted the event " + name + ".\n");
    EXPECT_THAT(output.err, IsEmpty());
    EXPECT_EQ(LastLine(), "POST /action/a1/b2/S1 HTTP/1.1");
    EXPECT_EQ(LastBody()["action"], name);
  }
  EXPECT_EQ(Requests().size(), 6U);
}

TEST_F(EventCommandTest, SendsTheDescriptionGivenAsText) {
  EXPECT_EQ(Quendelctl({"event", "enable", "--info", R"({"model": "X"})"}).status, 0);
  EXPECT_EQ(LastBody(), FromJsonLine(std::string(kEnableBody) + "\n"));
}

TEST_F(EventCommandTest, SendsTheDescriptionFromAFile) {
  WriteFile("/tmp/info.json", "{\"model\":\n\"X\"}\n");
  EXPECT_EQ(Quendelctl({"event", "enable", "--info", "/tmp/info.json"}).status, 0);
  EXPECT_EQ(LastBody(), FromJsonLine(std::string(kEnableBody) + "\n"));
}

TEST_F(EventCommandTest, SendsTheDescriptionFromTheStandardInput) {
  EXPECT_EQ(Quendelctl({"event", "enable", "--info", "-"}, R"({"model": "X"})").status, 0);
  EXPECT_EQ(LastBody(), FromJsonLine(std::string(kEnableBody) + "\n"));
}

TEST_F(EventCommandTest, SendsADescriptionFromAFileOfAnyKindAndLength) {
  const std::string text(20000, 'x');
  WriteFile("/tmp/info.json", "\"" + text + "\"");
  EXPECT_EQ(Quendelctl({"event", "enable", "--info", "/tmp/info.json"}).status, 0);
  EXPECT_EQ(LastBody()["hmx_info"], text);
}

TEST_F(EventCommandTest, SendsAnEmptyDescriptionWhenNoneIsGiven) {
  EXPECT_EQ(Quendelctl({"event", "enable"}).status, 0);
  EXPECT_EQ(LastBody()["hmx_info"], Json::Value(Json::objectValue));
}

TEST_F(EventCommandTest, TakesNoDescriptionForOtherEvents) {
  const Output output = Quendelctl({"event", "reboot", "--info", "{}"});
  EXPECT_EQ(output.status, 2);
  EXPECT_THAT(output.out, IsEmpty());
  EXPECT_THAT(output.err, HasSubstr("--info: goes with the event enable only"));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(EventCommandTest, RejectsAnUnknownName) {
  for (const char* name : {"upgrade", "", "Reboot", "0", "rebootx"}) {
    const Output output = Quendelctl({"event", name});
    EXPECT_EQ(output.status, 2) << name;
    EXPECT_THAT(output.out, IsEmpty());
    EXPECT_THAT(output.err, HasSubstr("enable,disable,poweroff,reboot,logout,update_info"));
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(EventCommandTest, RejectsADescriptionThatIsNotJson) {
  WriteFile("/tmp/bad.json", "{} {}");
  for (const char* info : {"{", "{}x", "{\"a\":1,}", "/tmp/bad.json", "/dev/null"}) {
    const Output output = Quendelctl({"event", "enable", "--info", info});
    EXPECT_EQ(output.status, 2) << info;
    EXPECT_THAT(output.err, ContainsRegex("^quendelctl: --info: not JSON: [^\n]+\n"
                                          "Run with --help for more information\\.\n$"))
        << info;
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(EventCommandTest, RejectsADescriptionThatCannotBeRead) {
  const Output missing = Quendelctl({"event", "enable", "--info", "/tmp/missing"});
  EXPECT_EQ(missing.status, 2);
  EXPECT_THAT(missing.err, HasSubstr("cannot read /tmp/missing: No such file or directory"));
  const Output folder = Quendelctl({"event", "enable", "--info", "/tmp"});
  EXPECT_EQ(folder.status, 2);
  EXPECT_THAT(folder.err, HasSubstr("cannot read /tmp: Is a directory"));
  const Output closed = Shell("$quendelctl event enable --info - <&-");
  EXPECT_EQ(closed.status, 2);
  EXPECT_THAT(closed.err, HasSubstr("cannot read the standard input: Bad file descriptor"));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(EventCommandTest, PrintsTheReplyAsJson) {
  Answer({.body = R"({"success":true,"note":1})"});
  const Output output = Quendelctl({"event", "logout", "--json"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out,
            "{\"event\":\"logout\",\"reply\":{\"note\":1,\"success\":true},\"success\":true}\n");
}

TEST_F(EventCommandTest, ShowsTheReplyOfAServerThatDeclines) {
  Answer({.body = R"({"success":false,"code":111000})"});
  const Output text = Quendelctl({"event", "reboot"});
  EXPECT_EQ(text.status, 1);
  EXPECT_EQ(text.out,
            "The event reboot was not accepted.\n"
            "The server answered: {\"code\":111000,\"success\":false}\n");
  EXPECT_THAT(text.err, HasSubstr("Failed to post event, server return failed."));

  Answer({.body = R"({"success":false,"code":111000})"});
  const Output json = Quendelctl({"event", "reboot", "--json"});
  EXPECT_EQ(json.status, 1);
  EXPECT_EQ(FromJsonLine(json.out)["reply"]["code"], 111000);
  EXPECT_EQ(FromJsonLine(json.out)["success"], false);
}

TEST_F(EventCommandTest, HasNoReplyWhenTheServerSentNoJson) {
  Answer({.body = "<html>"});
  const Output text = Quendelctl({"event", "reboot"});
  EXPECT_EQ(text.status, 1);
  EXPECT_EQ(text.out, "The event reboot was not accepted.\n");
  Answer({.body = "<html>"});
  const Output json = Quendelctl({"event", "reboot", "--json"});
  EXPECT_EQ(json.status, 1);
  EXPECT_EQ(json.out,
            "{\"error\":\"The event reboot was not accepted.\",\"event\":\"reboot\","
            "\"reason\":\"failed\",\"reply\":null,\"success\":false}\n");
}

TEST_F(EventCommandTest, FailsWithoutAnAccount) {
  SetIdentity({{"serial_number", "S1"}});
  const Output output = Quendelctl({"event", "reboot"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.err, HasSubstr("Failed to get account"));
}

TEST_F(ProgressCommandTest, TakesEachValueAsWordAndNumber) {
  struct Row {
    const char* word;
    int number;
  };
  for (const Row& row : {Row{"run", 1}, {"done", 0}, {"failed", -1}, {"no-file", -3}}) {
    const std::string number = std::to_string(row.number);
    for (const std::string& value : {std::string(row.word), number}) {
      const Output output = Quendelctl({"progress", "17", value});
      EXPECT_EQ(output.status, 0);
      EXPECT_EQ(output.out,
                std::string("The server accepted the report on request 17: ") + row.word + ".\n");
      EXPECT_THAT(output.err, IsEmpty());
      EXPECT_EQ(LastLine(), "POST /action_progress/17/" + number + "/a1/b2/S1 HTTP/1.1");
      EXPECT_EQ(LastBody(), Json::Value(Json::objectValue));
    }
  }
}

TEST_F(ProgressCommandTest, TakesAnyRequestIdInDecimal) {
  for (const std::string id : {"0", "-5", "2147483647", "-2147483648"}) {
    EXPECT_EQ(Quendelctl({"progress", id, "done"}).status, 0);
    EXPECT_EQ(LastLine(), "POST /action_progress/" + id + "/0/a1/b2/S1 HTTP/1.1");
  }
  EXPECT_EQ(Quendelctl({"progress", "010", "done"}).status, 0);
  EXPECT_EQ(LastLine(), "POST /action_progress/10/0/a1/b2/S1 HTTP/1.1");
}

TEST_F(ProgressCommandTest, RejectsARequestIdThatIsNoNumber) {
  for (const char* id :
       {"x", "", "17x", "1.5", " 1", "0x11", "2147483648", "99999999999999999999"}) {
    const Output output = Quendelctl({"progress", id, "done"});
    EXPECT_EQ(output.status, 2) << id;
    EXPECT_THAT(output.err, HasSubstr("is not a whole number that fits 32 bits")) << id;
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(ProgressCommandTest, RejectsAnUnknownValue) {
  for (const char* value : {"2", "-2", "ok", "Done", "", "+1", "00"}) {
    const Output output = Quendelctl({"progress", "17", value});
    EXPECT_EQ(output.status, 2) << value;
    EXPECT_THAT(output.err, HasSubstr("is none of run, done, failed, no-file, 1, 0, -1, -3"));
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(ProgressCommandTest, SendsTheDetails) {
  EXPECT_EQ(Quendelctl({"progress", "17", "failed", "--details", R"({"reason":"full"})"}).status,
            0);
  EXPECT_EQ(LastBody(), FromJsonLine("{\"reason\":\"full\"}\n"));
}

TEST_F(ProgressCommandTest, RejectsDetailsThatAreNotJson) {
  const Output output = Quendelctl({"progress", "17", "done", "--details", "{"});
  EXPECT_EQ(output.status, 2);
  EXPECT_THAT(output.err, HasSubstr("--details: not JSON: "));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(ProgressCommandTest, PrintsJson) {
  const Output output = Quendelctl({"progress", "17", "no-file", "--json"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "{\"progress\":-3,\"request_id\":17,\"success\":true}\n");
}

TEST_F(ProgressCommandTest, FailsWhenTheServerDeclines) {
  Answer({.body = R"({"success":false})"});
  const Output text = Quendelctl({"progress", "17", "done"});
  EXPECT_EQ(text.status, 1);
  EXPECT_EQ(text.out, "The server did not get or accept the report on request 17: done.\n");
  EXPECT_THAT(text.err, HasSubstr("Failed to update action request, server return failed."));
  Answer({.body = R"({"success":false})"});
  const Output json = Quendelctl({"progress", "17", "done", "--json"});
  EXPECT_EQ(json.status, 1);
  EXPECT_EQ(json.out,
            "{\"error\":\"The server did not get or accept the report on request 17: done.\","
            "\"progress\":0,\"reason\":\"failed\",\"request_id\":17,\"success\":false}\n");
}
