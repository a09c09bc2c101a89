// clean, completion, and the warnings of facts.
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <set>
#include <sstream>

#include "run_quendelctl.h"
#include "support/appliance.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

namespace {

constexpr char kRun[] = "/tmp/quendel_20240305_070809_0";

void MakeRun(const std::string& directory, mode_t mode = 0700) {
  WriteFile(directory + "/log/messages", "text");
  ASSERT_EQ(chmod(directory.c_str(), mode), 0);
  WriteFile(directory + ".tar.xz", "archive");
}

class FactsWarningTest : public testing::Test {
 protected:
  void SetUp() override { SetIdentity(); }
};

// What a shell proposes for the words, of which the last is still being typed.
std::string InBash(const std::string& words) {
  return Shell(
             "PATH=${quendelctl%/*}:$PATH; export PATH; bash -c 'source <(quendelctl completion "
             "bash); COMP_WORDS=(" +
             words +
             "); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); "
             "_quendelctl; echo ${COMPREPLY[@]}'")
      .out;
}

// What the manual quotes in a command's section from where it comes to --json.
std::set<std::string> MembersInManual(const std::string& command) {
  const std::string manual = ReadFile("/quendel/source/docs/man/quendelctl.1");
  const size_t begin = manual.find("\n.Ss " + command + "\n");
  EXPECT_NE(begin, std::string::npos) << command;
  const size_t end = manual.find("\n.S", begin + 1);
  const size_t json = manual.find("\n.Fl -json\n", begin);
  EXPECT_LT(json, end) << command;
  std::istringstream lines(manual.substr(json, end - json));
  std::set<std::string> members;
  for (std::string line; std::getline(lines, line);) {
    if (line.rfind(".Dq ", 0) == 0) {
      members.insert(line.substr(4, line.find(' ', 4) - 4));
    }
  }
  return members;
}

// Without those that every command has.
std::set<std::string> MembersIn(const std::string& output) {
  const std::vector<std::string> names = FromJsonLine(output).getMemberNames();
  std::set<std::string> members(names.begin(), names.end());
  for (const char* common : {"success", "error", "reason"}) {
    members.erase(common);
  }
  return members;
}

// The same of an interactive zsh, by its key.
std::string InZsh(const std::string& typed) {
  WriteFile("/tmp/zsh-test", R"zsh(
    zmodload zsh/zpty
    zpty shell zsh -f -i
    zpty -w shell 'PS1=; autoload -U compinit; compinit -u -D; eval "$(quendelctl completion zsh)"'
    zpty -w shell 'echo rea""dy'
    zpty -r shell line '*ready*'
    zpty -w -n shell ")zsh" + typed +
                                 R"zsh("$'\t'
    sleep 1
    zpty -w -n shell $'\n'
    while zpty -r -t shell line; do print -rn -- $line; done
    zpty -d shell)zsh");
  return Shell(
             "PATH=${quendelctl%/*}:$PATH; export PATH; TERM=dumb zsh -f /tmp/zsh-test 2>&1 | tr -d '\\a'")
      .out;
}

}  // namespace

TEST(CleanCommandTest, RemovesWhatDeadRunsLeft) {
  MakeRun(kRun);
  WriteFile("/tmp/quendel/log.p.99999999", "");
  const std::string paths[] = {"/tmp/quendel/log.p.99999999", std::string(kRun) + ".tar.xz", kRun};
  const Output list = Quendelctl({"clean", "--list"});
  EXPECT_EQ(list.status, 0);
  EXPECT_EQ(list.out, paths[0] + "\n" + paths[1] + "\n" + paths[2] + "\n");
  const Output output = Quendelctl({"clean"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out,
            paths[0] + ": removed\n" + paths[1] + ": removed\n" + paths[2] + ": removed\n");
  for (const std::string& path : paths) {
    EXPECT_FALSE(Exists(path));
  }
  EXPECT_EQ(Quendelctl({"clean"}).out, "No run has left anything behind.\n");
}

TEST(CleanCommandTest, PrintsJson) {
  MakeRun(kRun);
  EXPECT_EQ(
      Quendelctl({"clean", "--json"}).out,
      "{\"found\":[\"/tmp/quendel_20240305_070809_0.tar.xz\",\"/tmp/quendel_20240305_070809_0\"],"
      "\"removed\":[\"/tmp/quendel_20240305_070809_0.tar.xz\","
      "\"/tmp/quendel_20240305_070809_0\"],\"success\":true}\n");
}

TEST(CleanCommandTest, LeavesWhatMayBeSomebodysOwn) {
  MakeRun("/tmp/quendel_notes");
  MakeRun("/tmp/quendel_20240305_070809_1", 01700);  // kept on purpose
  MakeRun("/tmp/quendel_20240305_070809_2", 0755);
  MakeRun("/tmp/quendel_20240305_070809_3");
  WriteFile("/tmp/quendel_20240305_070809_3/other", "");
  MakeRun("/tmp/quendel_20240305_070809_4");
  ASSERT_EQ(chown("/tmp/quendel_20240305_070809_4", 1234, 1234), 0);
  WriteFile("/tmp/elsewhere/log/x", "");
  ASSERT_EQ(symlink("/tmp/elsewhere", "/tmp/quendel_20240305_070809_5"), 0);
  WriteFile("/tmp/quendel_20240305_070809_6.tar.xz", "");
  WriteFile("/tmp/quendel/log.p.99999998", "not empty");
  WriteFile("/tmp/quendel/log.p.x", "");
  EXPECT_EQ(Quendelctl({"clean"}).out, "No run has left anything behind.\n");
}

TEST(CleanCommandTest, LeavesARunThatGoesOn) {
  MakeRun(kRun);
  WriteFile("/tmp/quendel/udc.p." + std::to_string(getpid()), "");
  EXPECT_EQ(Quendelctl({"clean"}).out, "No run has left anything behind.\n");
  RemoveFile("/tmp/quendel");
  const Output locked = Shell(
      "mkdir -p /run/quendel; touch /run/quendel/collect.lock; "
      "flock /run/quendel/collect.lock $quendelctl clean --json");
  EXPECT_EQ(locked.status, 1);
  EXPECT_EQ(FromJsonLine(locked.out)["reason"], "busy");
  EXPECT_TRUE(Exists(kRun));
}

TEST(CleanCommandTest, LeavesWhatACollectionHasKept) {
  SetIdentity();
  const Output kept = Quendelctl({"collect", "--keep", "--json"});
  ASSERT_EQ(kept.status, 0);
  EXPECT_EQ(Quendelctl({"clean"}).out, "No run has left anything behind.\n");
  EXPECT_TRUE(Exists(FromJsonLine(kept.out)["run_directory"].asString()));
}

TEST_F(FactsWarningTest, SaysWhatCutsTheDeviceOff) {
  const struct {
    const char* setting;
    const char* warning;
  } kRows[] = {
      {"\"\"", " is read as two quotes; remove the line for the usual server\n"},
      {"https://a.test", " is more than a host name: https://a.test\n"},
      {"a.test:51790", " is more than a host name: a.test:51790\n"},
      {"a-name-of-more-than-31-letters.ab", " is longer than 31 characters and is cut: a-name"},
  };
  for (const auto& row : kRows) {
    WriteFile("/etc.defaults/arvoinfo.conf",
              std::string("upnpmodelname=X\nquendel_server=") + row.setting + "\n");
    const Output output = Quendelctl({"facts"});
    EXPECT_EQ(output.status, 0);
    EXPECT_THAT(output.out, HasSubstr(std::string("\nWarning: quendel_server in "
                                                  "/etc.defaults/arvoinfo.conf") +
                                      row.warning));
    EXPECT_EQ(FromJsonLine(Quendelctl({"facts", "--json"}).out)["warnings"].size(), 1U);
  }
}

TEST_F(FactsWarningTest, SaysThatTheContactIsATextOfNothing) {
  WriteFile("/usr/arvo/etc/quendel.conf", "contact=\"\"\n");
  EXPECT_THAT(Quendelctl({"facts"}).out,
              HasSubstr("\nWarning: contact in /usr/arvo/etc/quendel.conf is read as two quotes"));
}

TEST_F(FactsWarningTest, SaysWhichProxyIsHonouredByTransfersOnly) {
  for (const char* name : {"https_proxy", "HTTPS_PROXY", "all_proxy", "ALL_PROXY"}) {
    const std::string warning = std::string("\nWarning: the variable ") + name + " is set: ";
    EXPECT_THAT(Shell(name + std::string("=http://p:1 $quendelctl facts")).out, HasSubstr(warning));
    for (const char* exempt : {"*", "support.test", "x, .test", "test"}) {
      EXPECT_THAT(
          Shell(name + std::string("=http://p:1 no_proxy='") + exempt + "' $quendelctl facts").out,
          Not(HasSubstr("Warning")));
    }
    EXPECT_THAT(Shell(name + std::string("=http://p:1 no_proxy=port.test $quendelctl facts")).out,
                HasSubstr(warning));
  }
}

TEST_F(FactsWarningTest, SaysNothingWhereAllIsWell) {
  EXPECT_THAT(Quendelctl({"facts"}).out, Not(HasSubstr("Warning")));
  EXPECT_EQ(FromJsonLine(Quendelctl({"facts", "--json"}).out)["warnings"],
            Json::Value(Json::arrayValue));
}

TEST(ManualTest, NamesTheMembersOfJson) {
  SetIdentity();
  for (const std::string command : {"server", "test-connection", "facts", "version", "clean"}) {
    EXPECT_EQ(MembersIn(Shell("$quendelctl " + command + " --json").out), [&] {
      std::set<std::string> members = MembersInManual(command);
      members.erase("held_by");  // only while a collection goes on
      return members;
    }()) << command;
  }
  EXPECT_EQ(MembersIn(Shell("$quendelctl shm alloc 0x51 10 --json").out),
            MembersInManual("shm alloc"));
  EXPECT_EQ(MembersIn(Shell("$quendelctl collect --json").out), [] {
    std::set<std::string> members = MembersInManual("collect");
    for (const char* busy : {"held_by", "process", "program"}) {
      members.erase(busy);
    }
    return members;
  }());
}

TEST(ManualTest, NamesTheMembersAndReasonsOfFailures) {
  SetIdentity();
  const std::string manual = ReadFile("/quendel/source/docs/man/quendelctl.1");
  for (const char* command :
       {"heartbeat", "event reboot", "progress 1 done", "send /nowhere", "tar /nowhere /tmp/x",
        "upload 1 debug.dat", "remote close 1", "collect --send"}) {
    const Output output = Shell(std::string("$quendelctl ") + command + " --json");
    EXPECT_EQ(output.status, 1) << command;
    const Json::Value told = FromJsonLine(output.out);
    EXPECT_FALSE(told["error"].asString().empty()) << command;
    EXPECT_THAT(manual, HasSubstr("\n.Dq " + told["reason"].asString())) << command;
    for (const std::string& member : told.getMemberNames()) {
      EXPECT_THAT(manual, HasSubstr("\n.Dq " + member)) << command;
    }
  }
}

TEST(CompletionCommandTest, CompletesInBash) {
  WriteFile("/tmp/here/series.json", "");
  EXPECT_EQ(InBash("quendelctl heart"), "heartbeat\n");
  EXPECT_EQ(InBash("quendelctl conf \"\""), "list reset\n");
  EXPECT_EQ(InBash("quendelctl --json conf re"), "reset\n");
  EXPECT_EQ(InBash("quendelctl collect --se"), "--send\n");
  EXPECT_EQ(InBash("quendelctl event reb"), "reboot\n");
  EXPECT_EQ(InBash("quendelctl collect --perf /tmp/here/s"), "/tmp/here/series.json\n");
  EXPECT_EQ(InBash("quendelctl heartbeat --timeout \"\""), "\n");
  EXPECT_EQ(InBash("quendelctl send /tmp/here/s"), "/tmp/here/series.json\n");
}

TEST(CompletionCommandTest, CompletesInZsh) {
  EXPECT_THAT(InZsh("quendelctl heartb"), HasSubstr("quendelctl heartbeat "));
  EXPECT_THAT(InZsh("quendelctl conf res"), HasSubstr("quendelctl conf reset "));
  EXPECT_THAT(InZsh("quendelctl collect --sen"), HasSubstr("quendelctl collect --send"));
}

TEST(CompletionCommandTest, KnowsTheseShellsOnly) {
  const Output output = Quendelctl({"completion", "fish"});
  EXPECT_EQ(output.status, 2);
  EXPECT_THAT(output.out, IsEmpty());
}
