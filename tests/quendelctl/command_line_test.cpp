// The command line itself: help, version and mistakes.
#include <gmock/gmock.h>

#include "quendel.h"
#include "quendelctl/run_quendelctl.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsEmpty;

namespace {

const std::vector<std::string> kCommands = {"heartbeat",
                                            "event",
                                            "progress",
                                            "collect",
                                            "tar",
                                            "send",
                                            "perf",
                                            "conf",
                                            "upload",
                                            "remote",
                                            "shm",
                                            "server",
                                            "test-connection",
                                            "facts",
                                            "version",
                                            "status",
                                            "history",
                                            "pause",
                                            "resume",

                                            "completion",
                                            "help"};

// Those of them that do something, and the commands of the others.
const std::vector<std::vector<std::string>> kDoers = {{"heartbeat"},
                                                      {"event"},
                                                      {"progress"},
                                                      {"collect"},
                                                      {"tar"},
                                                      {"send"},
                                                      {"perf"},
                                                      {"conf", "list"},
                                                      {"conf", "reset"},
                                                      {"upload"},
                                                      {"remote", "create"},
                                                      {"remote", "close"},
                                                      {"remote", "key"},
                                                      {"shm", "alloc"},
                                                      {"shm", "send"},
                                                      {"shm", "receive"},
                                                      {"server"},
                                                      {"test-connection"},
                                                      {"facts"},
                                                      {"version"},
                                                      {"status"},
                                                      {"history"},
                                                      {"pause"},
                                                      {"resume"}};

std::string Joined(const std::vector<std::string>& words) {
  std::string text;
  for (const std::string& word : words) {
    text += (text.empty() ? "" : " ") + word;
  }
  return text;
}

void ExpectUsageError(const std::vector<std::string>& arguments, const std::string& complaint) {
  const Output output = Quendelctl(arguments);
  EXPECT_EQ(output.status, 2) << complaint;
  EXPECT_THAT(output.out, IsEmpty());
  EXPECT_EQ(output.err, "quendelctl: " + complaint + "\nRun with --help for more information.\n");
}

}  // namespace

TEST(CommandLineTest, HelpNamesEveryCommand) {
  const Output output = Quendelctl({"--help"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.err, IsEmpty());
  for (const std::string& command : kCommands) {
    EXPECT_THAT(output.out, HasSubstr("\n  " + command + " "));
  }
}

TEST(CommandLineTest, EachCommandExplainsItself) {
  for (const std::vector<std::string>& words : kDoers) {
    for (const char* option : {"--help", "-h"}) {
      const std::string command = Joined(words);
      std::vector<std::string> arguments = words;
      arguments.emplace_back(option);
      const Output output = Quendelctl(arguments);
      EXPECT_EQ(output.status, 0);
      EXPECT_THAT(output.err, IsEmpty());
      EXPECT_THAT(output.out, HasSubstr("Usage: quendelctl " + command + " [OPTIONS]"));
      EXPECT_THAT(output.out, HasSubstr("--json "));
      EXPECT_THAT(output.out, HasSubstr("\n  quendelctl " + command));  // an example
    }
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(CommandLineTest, TakesNoEmptyValueForOneThatWasNotGiven) {
  ExpectUsageError({"event", "enable", "--info", ""}, "--info: must not be empty");
  ExpectUsageError({"progress", "1", "done", "--details", ""}, "--details: must not be empty");
  ExpectUsageError({"collect", "--perf", ""}, "--perf: must not be empty");
  ExpectUsageError({"perf", "--series", ""}, "--series: must not be empty");
  ExpectUsageError({"send", "/tmp/file", "--time", ""}, "--time: must not be empty");
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(CommandLineTest, TellsItsVersion) {
  const Output output = Quendelctl({"--version"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "quendelctl " QUENDEL_VERSION "\n");
  EXPECT_THAT(output.err, IsEmpty());
}

TEST(CommandLineTest, NeedsACommand) {
  ExpectUsageError({}, "A command is required");
  ExpectUsageError({"nosuch"}, "The following argument was not expected: nosuch");
}

TEST(CommandLineTest, RejectsWhatACommandDoesNotTake) {
  ExpectUsageError({"heartbeat", "extra"}, "The following argument was not expected: extra");
  ExpectUsageError({"facts", "--nosuch"}, "The following argument was not expected: --nosuch");
  ExpectUsageError({"heartbeat", "version"}, "The following argument was not expected: version");
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(CommandLineTest, ProposesWhatMayHaveBeenMeant) {
  const struct {
    std::vector<std::string> words;
    const char* meant;
  } kRows[] = {{{"heartbaet"}, "heartbeat"},      {{"fact"}, "facts"},
               {{"comp"}, "completion"},          {{"conf", "lsit"}, "list"},
               {{"collect", "--sned"}, "--send"}, {{"conf", "list", "--jsn"}, "--json"},
               {{"--versoin"}, "--version"}};
  for (const auto& row : kRows) {
    const Output output = Quendelctl(row.words);
    EXPECT_EQ(output.status, 2);
    EXPECT_EQ(output.err,
              "quendelctl: The following argument was not expected: " + row.words.back() +
                  "\nDid you mean " + row.meant + "?\nRun with --help for more information.\n");
  }
}

TEST(CommandLineTest, ShowsHelpInEveryWayThatIsTried) {
  EXPECT_EQ(Quendelctl({"help"}).out, Quendelctl({"--help"}).out);
  EXPECT_EQ(Quendelctl({"help", "conf", "reset"}).out, Quendelctl({"conf", "reset", "-h"}).out);
  ExpectUsageError({"help", "nosuch"}, "COMMAND: there is no command nosuch");
  EXPECT_EQ(Quendelctl({"-V"}).out, Quendelctl({"--version"}).out);
}

TEST(CommandLineTest, TakesJsonInFrontAsWell) {
  const std::string expected = Quendelctl({"version", "--json"}).out;
  EXPECT_EQ(Quendelctl({"--json", "version"}).out, expected);
  const std::string list = Quendelctl({"conf", "list", "--json"}).out;
  EXPECT_EQ(Quendelctl({"conf", "--json", "list"}).out, list);
  EXPECT_EQ(Quendelctl({"--json", "conf", "list"}).out, list);
}

TEST(CommandLineTest, TellsTheCommandsOfAGroup) {
  ExpectUsageError({"conf"}, "conf: one of these commands is required: list, reset");
  ExpectUsageError({"remote"}, "remote: one of these commands is required: create, close, key");
  ExpectUsageError({"shm"}, "shm: one of these commands is required: alloc, send, receive");
}

TEST(CommandLineTest, RejectsJsonThatIsNestedTooDeep) {
  const std::string deep = "{\"a\":" + std::string(5000, '[') + std::string(5000, ']') + "}";
  for (const std::vector<std::string>& words :
       {std::vector<std::string>{"event", "enable", "--info"},
        {"progress", "1", "done", "--details"},
        {"collect", "--perf"}}) {
    std::vector<std::string> arguments = words;
    arguments.push_back(deep);
    ExpectUsageError(arguments, words.back() + ": not JSON: nested deeper than 1000 levels");
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(CommandLineTest, RejectsAFileThatHasNoEnd) {
  ExpectUsageError({"event", "enable", "--info", "/dev/zero"},
                   "--info: /dev/zero is longer than 67108864 bytes");
}

TEST(CommandLineTest, NeedsEachArgument) {
  ExpectUsageError({"event"}, "NAME is required");
  ExpectUsageError({"progress"}, "ID is required");
  ExpectUsageError({"progress", "17"}, "VALUE is required");
  ExpectUsageError({"event", "enable", "--info"}, "--info: 1 required FILE|JSON missing");
}
