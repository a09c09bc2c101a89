// The command line itself: help, version and mistakes.
#include <gmock/gmock.h>

#include "quendel.h"
#include "run_quendelctl.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsEmpty;

namespace {

const std::vector<std::string> kCommands = {
    "heartbeat", "event",  "progress",        "collect", "tar",    "send",
    "perf",      "server", "test-connection", "facts",   "version"};

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
  for (const std::string& command : kCommands) {
    for (const char* option : {"--help", "-h"}) {
      const Output output = Quendelctl({command, option});
      EXPECT_EQ(output.status, 0);
      EXPECT_THAT(output.err, IsEmpty());
      EXPECT_THAT(output.out, HasSubstr("Usage: quendelctl " + command + " [OPTIONS]"));
      EXPECT_THAT(output.out, HasSubstr("--json "));
      EXPECT_THAT(output.out, HasSubstr("\n  quendelctl " + command));  // an example
    }
  }
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

TEST(CommandLineTest, NeedsEachArgument) {
  ExpectUsageError({"event"}, "NAME is required");
  ExpectUsageError({"progress"}, "ID is required");
  ExpectUsageError({"progress", "17"}, "VALUE is required");
  ExpectUsageError({"event", "enable", "--info"}, "--info: 1 required FILE|JSON missing");
}
