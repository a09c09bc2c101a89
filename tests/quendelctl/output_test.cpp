// What the output is safe from, and what becomes of it when it cannot be written.
#include <gmock/gmock.h>

#include "quendelctl/run_quendelctl.h"
#include "support/appliance.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

namespace {

// Sets the title, clears the screen, moves up, and hides what follows: in JSON and as it stands.
constexpr char kHostileJson[] =
    R"(["\u001b]0;owned\u0007\u001b[2J\r\n\u009b1A\u202e\u007f", "J\u00f6rg \u4e2d \ud83d\ude00"])";
constexpr char kHostileBytes[] = "\x1b]0;owned\x07\x1b[2J\r\xc2\x9b\xe2\x80\xae\x7f\xff\xc0\x80<";

class OutputTest : public testing::Test {
 protected:
  void SetUp() override { SetIdentity(); }
};

// Bytes that can act on a terminal, other than the line end and the tabulator.
void ExpectSafe(const std::string& text) {
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    EXPECT_FALSE((byte < 0x20 && c != '\n' && c != '\t') || byte == 0x7F) << int{byte};
  }
  EXPECT_THAT(text, Not(HasSubstr("\xc2\x9b")));
  EXPECT_THAT(text, Not(HasSubstr("\xe2\x80\xae")));
}

}  // namespace

TEST_F(OutputTest, EscapesWhatCouldActOnATerminal) {
  Answer({.body = std::string(R"({"success":true,"actions":)") + kHostileJson + "}"});
  const Output output = Quendelctl({"heartbeat"});
  EXPECT_EQ(output.status, 0);
  ExpectSafe(output.out);
  EXPECT_EQ(output.out,
            "The server has queued 2 actions:\n"
            "  \"\\u001b]0;owned\\u0007\\u001b[2J\\r\\n\\u{9b}1A\\u{202e}\\x7f\"\n"
            "  \"J\xC3\xB6rg \xE4\xB8\xAD \xF0\x9F\x98\x80\"\n");
}

TEST_F(OutputTest, EscapesBytesThatAreNotUtf8) {
  // Cut, overlong, beyond the last character, half of a pair, continuation without a beginning.
  Answer({.body = "{\"success\":true,\"actions\":[\"\xc3|\xe2\x82|\xc0\xaf|\xe0\x80\xaf|"
                  "\xf4\x90\x80\x80|\xed\xa0\x80|\x80|\xf0\x9f\x98\"]}"});
  EXPECT_EQ(Quendelctl({"heartbeat"}).out,
            "The server has queued 1 action:\n"
            "  \"\\xc3|\\xe2\\x82|\\xc0\\xaf|\\xe0\\x80\\xaf|\\xf4\\x90\\x80\\x80|"
            "\\xed\\xa0\\x80|\\x80|\\xf0\\x9f\\x98\"\n");
}

TEST_F(OutputTest, PrintsJsonInAsciiWithTheSameMeaning) {
  Answer({.body = std::string(R"({"success":true,"actions":)") + kHostileJson + "}"});
  const Output output = Quendelctl({"heartbeat", "--json"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(FromJsonLine(output.out)["actions"], FromJsonLine(std::string(kHostileJson) + "\n"));
}

TEST_F(OutputTest, EscapesTheLogLinesThatQuoteAReply) {
  Answer({.body = kHostileBytes});
  const Output output = Quendelctl({"heartbeat"});
  EXPECT_EQ(output.status, 1);
  ExpectSafe(output.err);
  EXPECT_THAT(output.err,
              HasSubstr("Failed to parse response. [\\x1b]0;owned\\x07\\x1b[2J\\x0d\\u{9b}"
                        "\\u{202e}\\x7f\\xff\\xc0\\x80<]\n"));
}

TEST_F(OutputTest, KeepsCharactersOfALongLogLineWhole) {
  std::string reply = "<";
  while (reply.size() < 200000) {
    reply += "\xe4\xb8\xad";
  }
  Answer({.body = reply});
  EXPECT_THAT(Quendelctl({"heartbeat"}).err, HasSubstr("[" + reply + "]\n"));
}

TEST_F(OutputTest, LetsAReplyForgeNoLineOfTheLog) {
  Answer({.body = "<a>\n\t<b>\n</a>"});
  EXPECT_THAT(Quendelctl({"heartbeat"}).err, HasSubstr("[<a>\\x0a\t<b>\\x0a</a>]\n"));
}

// The C library writes a line that is longer than its buffer in parts of these many bytes.
TEST_F(OutputTest, LetsNoLongReplyForgeALineEither) {
  constexpr size_t kPart = 4096;
  for (size_t lead = 0; lead < 120; lead += 1) {
    std::string reply(kPart - lead - 1, 'x');
    reply += "\nquendelctl: all is well\n";
    Answer({.body = reply});
    const std::string err = Quendelctl({"heartbeat"}).err;
    EXPECT_THAT(err, Not(HasSubstr("\nquendelctl: all"))) << lead;
    EXPECT_THAT(err, HasSubstr("\\x0aquendelctl: all is well\\x0a")) << lead;
  }
}

TEST_F(OutputTest, EscapesWhatIsNotSeen) {
  const char* const kUnseen[] = {"\u00ad", "\u034f",     "\u061c",    "\u115f", "\u17b4",
                                 "\u180e", "\u200b",     "\u200f",    "\u2028", "\u2060",
                                 "\u2066", "\u206f",     "\u3164",    "\ufeff", "\uffa0",
                                 "\ufff9", "\U000e0001", "\U000e007f"};
  std::string reply = "{\"success\":true,\"actions\":[\"";
  for (const char* const character : kUnseen) {
    reply += character;
  }
  Answer({.body = reply + "\"]}"});
  EXPECT_EQ(Quendelctl({"heartbeat"}).out,
            "The server has queued 1 action:\n  \"\\u{ad}\\u{34f}\\u{61c}\\u{115f}\\u{17b4}"
            "\\u{180e}\\u{200b}\\u{200f}\\u{2028}\\u{2060}\\u{2066}\\u{206f}\\u{3164}"
            "\\u{feff}\\u{ffa0}\\u{fff9}\\u{e0001}\\u{e007f}\"\n");
}

TEST_F(OutputTest, EscapesTheArgumentsOfAComplaint) {
  const Output output = Quendelctl({"event", "\x1b[2J"});
  EXPECT_EQ(output.status, 2);
  ExpectSafe(output.err);
  EXPECT_THAT(output.err, HasSubstr("\\x1b[2J"));
}

TEST_F(OutputTest, EscapesSettings) {
  WriteFile("/etc.defaults/arvoinfo.conf", "upnpmodelname=\x1b[2J\nquendel_server=a\x1b[2J\n");
  const Output facts = Quendelctl({"facts"});
  EXPECT_EQ(facts.status, 0);
  ExpectSafe(facts.out);
  EXPECT_THAT(facts.out, HasSubstr("Model:           \\x1b[2J\n"));
  EXPECT_EQ(Quendelctl({"server"}).out, "a\\x1b[2J\n");
}

TEST_F(OutputTest, StaysSafeAndParsesWhateverTheServerSends) {
  const std::string replies[] = {"",
                                 "[]",
                                 "\"x\"",
                                 "12",
                                 "null",
                                 "{}",
                                 R"({"success":"true"})",
                                 R"({"success":[]})",
                                 R"({"success":true} and more)",
                                 std::string("{\"success\":true,\"actions\":\"a\0b\"}", 32),
                                 std::string(1001, '['),
                                 kHostileBytes,
                                 std::string("\0", 1),
                                 kHostileJson};
  for (const std::string& reply : replies) {
    for (const char* command : {"heartbeat", "event reboot", "progress 1 done"}) {
      Answer({.body = reply});
      const Output text = Shell(std::string("$quendelctl ") + command);
      Answer({.body = reply});
      const Output json = Shell(std::string("$quendelctl ") + command + " --json");
      EXPECT_THAT(text.status, testing::AnyOf(0, 1)) << reply;
      EXPECT_EQ(json.status, text.status) << reply;
      EXPECT_EQ(FromJsonLine(json.out)["success"], json.status == 0) << reply;
      ExpectSafe(text.out + text.err + json.err);
    }
  }
}

TEST_F(OutputTest, FailsWhenTheDiskIsFull) {
  for (const char* command : {"heartbeat", "version", "--help", "--version", "facts --json"}) {
    const Output output = Shell(std::string("$quendelctl ") + command + " >/dev/full");
    EXPECT_EQ(output.status, 1) << command;
    EXPECT_EQ(output.err, "quendelctl: cannot write the output: No space left on device\n");
  }
}

TEST_F(OutputTest, FailsWhenAPartOfALongOutputFits) {
  Answer({.body = R"({"success":true,"actions":")", .fill = 30 << 20, .tail = "\"}"});
  const Output output = Shell(
      "mkdir /tmp/small && mount -t tmpfs -o size=64k small /tmp/small && "
      "$quendelctl heartbeat >/tmp/small/out");
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.err, "quendelctl: cannot write the output: No space left on device\n");
  EXPECT_EQ(ReadFile("/tmp/small/out").size(), 65536U);
}

TEST_F(OutputTest, FailsWhenNobodyReadsThePipe) {
  const Output output =
      Shell("{ sleep 0.2; $quendelctl version; echo $? >/tmp/status; } | exec true");
  EXPECT_EQ(output.err, "quendelctl: cannot write the output: Broken pipe\n");
  EXPECT_EQ(ReadFile("/tmp/status"), "1\n");
}

TEST_F(OutputTest, FailsWhenTheStandardOutputIsClosed) {
  const Output output = Shell("$quendelctl heartbeat >&-");
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.err, "quendelctl: cannot write the output: Bad file descriptor\n");
}

TEST_F(OutputTest, IsAsItShouldBeWhenTheOtherDescriptorsAreClosed) {
  const Output output = Shell("$quendelctl version <&- 2>&-");
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.out, Not(IsEmpty()));
}

TEST_F(OutputTest, FailsWhenTheLogLinesCannotBeMadeSafe) {
  const Output noPipe = Shell("ulimit -n 4; $quendelctl version");
  EXPECT_EQ(noPipe.status, 1);
  EXPECT_THAT(noPipe.out, IsEmpty());
  EXPECT_EQ(noPipe.err, "quendelctl: cannot make a pair of sockets: Too many open files\n");
  const Output noCopy = Shell("ulimit -n 5; $quendelctl version");
  EXPECT_EQ(noCopy.status, 1);
  EXPECT_THAT(noCopy.out, IsEmpty());
  EXPECT_EQ(noCopy.err, "quendelctl: cannot keep the standard error output: Too many open files\n");
}
