// How long a command may take and what it may use, that one collection runs at a time, and that
// nothing of a command lives longer than it.
#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>

#include "run_quendelctl.h"
#include "support/appliance.h"

using namespace quendel::test;
using testing::AllOf;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

namespace {

constexpr char kSettings[] = "/usr/arvo/etc/quendelctl.conf";
constexpr char kMessages[] = "/usr/arvo/etc/quendel/quendel.log.messages";
constexpr char kLate[] = "It took longer than 1 s and was ended; --timeout sets another limit.";

// A server that accepts and stays silent.
class SilentServer {
 public:
  SilentServer() : socket_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_port = htons(51790);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    EXPECT_EQ(bind(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(listen(socket_, 100), 0);
  }
  ~SilentServer() { close(socket_); }
  SilentServer(const SilentServer&) = delete;
  SilentServer& operator=(const SilentServer&) = delete;

 private:
  const int socket_;
};

void InstallProgram(const std::string& path, const std::string& script) {
  WriteFile(path, "#!/bin/sh\n" + script + "\n");
  ASSERT_EQ(chmod(path.c_str(), 0755), 0);
}

class LimitsTest : public testing::Test {
 protected:
  void SetUp() override {
    SetIdentity();
    RemoveFile("/usr/arvo/etc/quendel");
    WriteFile("/volume1/messages", "first\nsecond\n");
    WriteFile(kMessages,
              "name=messages\npath=/volume1/messages\nlast_hash=\"\"\ntar_log_inode=\"\"\n"
              "last_byte=\"\"\ntotal_byte=\"\"\ninode=\"\"\n");
  }

  static void InstallUdc(const std::string& script) {
    InstallProgram("/volume1/udc", script);
    WriteFile("/usr/arvo/etc/quendel/quendel.udc.udc",
              "name=udc\npath=/volume1/udc\nlast_hash=\"\"\n");
  }
};

using CollectLockCommandTest = LimitsTest;
using KilledCommandTest = LimitsTest;
using NotRecordedTest = LimitsTest;

// The processes of the appliance whose command line matches.
std::string Processes(const std::string& pattern) {
  return Shell("pgrep -f '" + pattern +
               "' | while read -r id; do tr '\\0' ' ' </proc/$id/cmdline; "
               "echo; done 2>/dev/null")
      .out;
}

}  // namespace

TEST_F(LimitsTest, EndEachCommandThatTheServerKeepsWaiting) {
  const SilentServer server;
  WriteFile("/usr/arvo/etc/quendel.remote.conf", "remote_account=\n");
  WriteFile("/volume1/archive", "x");
  const Output output = Shell(R"(
    for command in heartbeat 'event reboot' 'progress 1 done' 'send /volume1/archive' \
                   'upload 1 debug.dat' 'remote close 1'; do
      { text=$($quendelctl $command --timeout 1 2>&1); echo "$command: $? $text" >>/tmp/all; } &
    done
    wait; sort /tmp/all)");
  size_t late = 0;
  for (size_t at = output.out.find(kLate); at != std::string::npos;
       at = output.out.find(kLate, at + 1)) {
    ++late;
  }
  EXPECT_EQ(late, 6U) << output.out;
  for (const char* command : {"event reboot", "heartbeat", "progress 1 done", "remote close 1",
                              "send /volume1/archive", "upload 1 debug.dat"}) {
    EXPECT_THAT(output.out, HasSubstr(std::string(command) + ": 1 "));
  }
}

TEST_F(LimitsTest, SayWhyInAWordForPrograms) {
  const SilentServer server;
  const Output output = Quendelctl({"heartbeat", "--timeout", "1", "--json"});
  EXPECT_EQ(output.out, std::string("{\"error\":\"") + kLate +
                            "\",\"reason\":\"timeout\",\"success\":false}\n");
  const Output interrupted =
      Shell("$quendelctl heartbeat --json & sleep 0.3; kill -TERM $!; wait $!");
  EXPECT_EQ(interrupted.status, 1);
  EXPECT_EQ(interrupted.out,
            "{\"error\":\"It was interrupted.\",\"reason\":\"interrupted\",\"success\":false}\n");
}

TEST_F(LimitsTest, EndACollectionAndCommitNothing) {
  const SilentServer server;
  const std::string settings = ReadFile(kMessages);
  const Output output = Quendelctl({"collect", "--send", "--timeout", "4", "--json"});
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(FromJsonLine(output.out)["reason"], "timeout");
  EXPECT_EQ(FromJsonLine(output.out)["error"],
            "The collection took longer than 4 s and was ended; --timeout sets another limit.");
  EXPECT_EQ(ReadFile(kMessages), settings);
  EXPECT_EQ(Shell("ls -d /tmp/quendel_* 2>/dev/null").out, "");
}

TEST_F(LimitsTest, EndAToolThatDoesNotEnd) {
  InstallProgram("/usr/arvo/sbin/arvocloudserviceauth", "trap '' TERM; sleep 1001 & wait; wait");
  const Output output = Quendelctl({"remote", "key", "--timeout", "1"});
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.out, std::string(kLate) + "\n");
  EXPECT_EQ(Processes("[s]leep 1001"), "");
  EXPECT_EQ(Processes("[a]rvocloudserviceauth"), "");
}

TEST_F(LimitsTest, ComeFromTheSettingsFileWhenNoOptionIsGiven) {
  const SilentServer server;
  WriteFile(kSettings, "# limits\ntimeout=1\n");
  EXPECT_EQ(Quendelctl({"heartbeat"}).out, std::string(kLate) + "\n");
  EXPECT_THAT(Quendelctl({"heartbeat", "--timeout", "2"}).out,
              StartsWith("It took longer than 2 s"));
}

TEST_F(LimitsTest, AreTheUsualOnesWhereTheFileHoldsNone) {
  for (const std::string value :
       {"0", "x", "-1", "1.5", "604801", "\"\"", "99999999999999999999"}) {
    WriteFile(kSettings, "timeout=" + value + "\nmemory_mib=1\n");
    const Output output = Quendelctl({"perf"});
    EXPECT_EQ(output.status, 0);
    EXPECT_EQ(output.err, "quendelctl: /usr/arvo/etc/quendelctl.conf: timeout=" + value +
                              " is not a whole number of seconds from 1 to 604800; 60 is used\n"
                              "quendelctl: /usr/arvo/etc/quendelctl.conf: memory_mib=1 is not a "
                              "whole number of MiB from 64 to 1048576; 512 is used\n");
  }
  RemoveFile(kSettings);
  WriteFile(std::string(kSettings) + "/inside", "");
  EXPECT_THAT(
      Quendelctl({"perf"}).err,
      StartsWith("quendelctl: /usr/arvo/etc/quendelctl.conf: cannot be read; 60 is used\n"));
}

TEST_F(LimitsTest, RejectAnOptionThatIsNone) {
  const Output time = Quendelctl({"collect", "--timeout", "0"});
  EXPECT_EQ(time.status, 2);
  EXPECT_THAT(time.err, StartsWith("quendelctl: --timeout: 0 is not a whole number of seconds"));
  const Output memory = Quendelctl({"perf", "--memory", "63"});
  EXPECT_EQ(memory.status, 2);
  EXPECT_THAT(memory.err, StartsWith("quendelctl: --memory: 63 is not a whole number of MiB"));
}

#ifndef __SANITIZE_ADDRESS__
TEST_F(LimitsTest, HoldForTheMemoryOfWhatACommandStarts) {
  InstallUdc("echo \"{\\\"kib\\\":$(bash -c 'ulimit -d')}\"");
  const std::string read = "cat /tmp/quendel_*/udc/udc.result; rm -rf /tmp/quendel_*";
  EXPECT_THAT(Shell("$quendelctl collect --keep; " + read).out, HasSubstr("{\"kib\":524288}"));
  WriteFile(kSettings, "memory_mib=100\n");
  EXPECT_THAT(Shell("$quendelctl collect --keep; " + read).out, HasSubstr("{\"kib\":102400}"));
  EXPECT_THAT(Shell("$quendelctl collect --keep --memory 200; " + read).out,
              HasSubstr("{\"kib\":204800}"));
}

TEST_F(LimitsTest, EndWhatAskedForMoreMemory) {
  InstallProgram("/usr/arvo/sbin/arvocloudserviceauth",
                 "dd if=/dev/zero bs=100M count=1 2>/dev/null | tail -c 1 | tr '\\0' k");
  EXPECT_EQ(Quendelctl({"remote", "key"}).out, "k");
  EXPECT_EQ(Quendelctl({"remote", "key", "--memory", "64"}).status, 1);
}
#endif

TEST_F(LimitsTest, AreShownOnATerminalWhereTheWaitIsLong) {
  const SilentServer server;
  const Terminal answer = OnTerminal({"heartbeat", "--timeout", "2"});
  EXPECT_EQ(answer.status, 1);
  EXPECT_THAT(answer.shown,
              AllOf(HasSubstr("\rwaiting for the server's answer: 1 s of at most 2 s\x1b[K\r"),
                    HasSubstr("\r\x1b[KIt took longer than 2 s")));
  const Terminal connection = OnTerminal({"test-connection"});
  EXPECT_EQ(connection.status, 0);
  EXPECT_THAT(connection.shown,
              HasSubstr("\rwaiting for two connections in a row: 1 s of at most 60 s"));
  const Terminal series = OnTerminal({"perf", "--series", "2", "--every", "1"});
  EXPECT_EQ(series.status, 0);
  EXPECT_THAT(series.shown, HasSubstr("\rtaking samples: 1 of 2\x1b[K\r"));
}

TEST_F(LimitsTest, AreNotShownElsewhere) {
  const SilentServer server;
  EXPECT_THAT(Quendelctl({"heartbeat", "--timeout", "2"}).err, IsEmpty());
  EXPECT_THAT(Quendelctl({"perf", "--series", "2", "--every", "1"}).err, IsEmpty());
}

TEST_F(CollectLockCommandTest, TellsWhoCollectsAlready) {
  InstallUdc("touch /volume1/begun; exec sleep 1002");
  const Output output = Shell(
      "$quendelctl collect >/dev/null 2>&1 & first=$!; "
      "while [ ! -e /volume1/begun ]; do sleep 0.02; done; cat /run/quendel/collect.lock; "
      "$quendelctl collect; echo \"status $?\"; $quendelctl collect --json; kill $first; wait");
  const std::string holder = output.out.substr(0, output.out.find(' '));
  EXPECT_THAT(output.out, StartsWith(holder +
                                     " quendelctl\nNothing was done: a collection goes on, by "
                                     "quendelctl, process " +
                                     holder + ".\nstatus 1\n"));
  const size_t brace = output.out.find('{');
  ASSERT_NE(brace, std::string::npos);
  const Json::Value told = FromJsonLine(output.out.substr(brace));
  EXPECT_EQ(told["reason"], "busy");
  EXPECT_EQ(told["held_by"]["process"], std::stoi(holder));
  EXPECT_EQ(told["held_by"]["program"], "quendelctl");
}

TEST_F(CollectLockCommandTest, OfManyAtOnceOneRunsOrAllDoInTurn) {
  const Output output =
      Shell("for i in 1 2 3; do { $quendelctl collect >/dev/null 2>&1; echo $?; } & done; wait");
  EXPECT_THAT(output.out, ContainsRegex("^(0\n1\n1|1\n0\n1|1\n1\n0)\n$"));
  const Output waiting =
      Shell("for i in 1 2 3; do { $quendelctl collect --wait 2>/dev/null; echo $?; } & done; wait");
  EXPECT_EQ(waiting.status, 0);
  EXPECT_THAT(waiting.out, Not(HasSubstr("Another run")));
  EXPECT_THAT(waiting.out, Not(HasSubstr("1\n")));
}

TEST_F(CollectLockCommandTest, IsWaitedForAsLongAsThereIsTime) {
  InstallUdc("touch /volume1/begun; exec sleep 1002");
  const Output output = Shell(
      "$quendelctl collect >/dev/null 2>&1 & first=$!; "
      "while [ ! -e /volume1/begun ]; do sleep 0.02; done; "
      "$quendelctl collect --wait --timeout 1; echo \"status $?\"; kill $first; wait");
  EXPECT_THAT(output.out, HasSubstr("a collection goes on"));
  EXPECT_THAT(output.out, HasSubstr("status 1\n"));
}

TEST_F(CollectLockCommandTest, SaysWhenItCannotBeTaken) {
  WriteFile("/run/quendel", "");
  const Output output = Quendelctl({"collect"});
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.out,
            "Nothing was done: cannot take /run/quendel/collect.lock: Not a "
            "directory.\n");
}

// Most of a run is one pause of a second, so most of the moments lie before it and behind it.
TEST_F(KilledCommandTest, LeavesNoProcessBehindWheneverItIsKilled) {
  InstallUdc("trap '' TERM; sleep 0.2; (trap '' TERM; exec sleep 1003) & echo '{}'");
  WriteFile("/tmp/kill-it", R"(
    for point in $(seq 0 24) $(seq 100 124); do
      $quendelctl collect >/dev/null 2>&1 & tool=$!
      sleep $((point / 100)).$(printf %02d $((point % 100)))
      kill -KILL $tool; wait $tool 2>/dev/null
      for i in 1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 20; do
        left=$(pgrep -f '[s]leep 1003|[q]uendelctl collect|/bin/[t]ar|/volume1/[u]dc')
        [ -n "$left" ] || break
        sleep 0.05
      done
      [ -z "$left" ] || { echo "at $point:" $(ps -o pid,args -p $left); kill -KILL $left; }
      [ ! -e /run/quendel/collect.lock ] || flock --nonblock /run/quendel/collect.lock true || echo "at $point: locked"
    done 2>/dev/null)");
  EXPECT_EQ(Shell("/bin/sh /tmp/kill-it").out, "");
  RemoveFile("/usr/arvo/etc/quendel/quendel.udc.udc");
  EXPECT_EQ(Quendelctl({"collect"}).status, 0);
  EXPECT_THAT(ReadFile(kMessages), HasSubstr("total_byte=13\n"));
}

TEST_F(NotRecordedTest, IsTheStateThatCouldNotBeStaged) {
  InstallUdc("sleep 0.5; rm /tmp/quendel/quendel.log.update.conf; echo '{}'");
  const std::string settings = ReadFile(kMessages);
  const Output text = Quendelctl({"collect"});
  EXPECT_EQ(ReadFile(kMessages), settings);
  EXPECT_THAT(text.out,
              HasSubstr("Not recorded as collected: messages, as its state could not be noted in "
                        "/tmp/quendel/quendel.log.update.conf. The next collection gathers it "
                        "again.\n"));
}

TEST_F(NotRecordedTest, IsTheStateThatCouldNotBeWritten) {
  RemoveFile("/usr/arvo/etc/quendel/.quendel.log.messages.lock");
  WriteFile("/usr/arvo/etc/quendel/.quendel.log.messages.lock/x", "");
  InstallUdc("echo '{\"a\":1}'");
  const Output text = Quendelctl({"collect"});
  EXPECT_EQ(text.status, 0);
  EXPECT_THAT(text.out,
              HasSubstr("Not recorded as collected: messages, as its state could not be written to "
                        "/usr/arvo/etc/quendel/quendel.log.messages. The next collection "
                        "gathers it again.\n"));
  EXPECT_THAT(text.out, Not(HasSubstr("udc, as")));
  RemoveFile("/usr/arvo/etc/quendel/.quendel.udc.udc.lock");
  WriteFile("/usr/arvo/etc/quendel/.quendel.udc.udc.lock/x", "");
  InstallUdc("echo '{\"a\":2}'");
  const Json::Value told = FromJsonLine(Quendelctl({"collect", "--json"}).out);
  EXPECT_EQ(told["not_recorded"].size(), 2U);
  EXPECT_EQ(told["not_recorded"][1], "udc");
}
