// How long a command may take, and how much memory: its options and the settings file.
#include "limit_options.h"

#include <charconv>
#include <optional>

#include "base/paths.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "safe_stderr.h"

namespace quendelctl {
namespace {

using quendel::kQuendelctlConfFile;

// One limit: the option's name, its key in the settings file, what it counts, and its values.
struct Limit {
  const char* option;
  const char* key;
  const char* unit;
  int usual;
  int least;
  int most;
};

constexpr int kWeekSeconds = 7 * 24 * 60 * 60;
constexpr Limit kAnswerTime = {"--timeout", "timeout", "seconds", 60, 1, kWeekSeconds};
constexpr Limit kTransferTime = {"--timeout", "transfer_timeout", "seconds", 3600, 1, kWeekSeconds};
constexpr Limit kMemory = {"--memory", "memory_mib", "MiB", 512, 64, 1 << 20};

const Limit& TimeLimit(WaitFor waitFor) {
  return waitFor == WaitFor::kAnswer ? kAnswerTime : kTransferTime;
}

std::string Complaint(const Limit& limit, const std::string& text) {
  return text + " is not a whole number of " + limit.unit + " from " + std::to_string(limit.least) +
         " to " + std::to_string(limit.most);
}

std::optional<int> Parse(const Limit& limit, const std::string& text) {
  int number = 0;
  const char* const end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, number);
  const bool good = error == std::errc() && stop == end;
  return good && number >= limit.least && number <= limit.most ? std::optional(number)
                                                               : std::nullopt;
}

void ComplainOfFile(const std::string& complaint, int used) {
  Complain(std::string(kQuendelctlConfFile) + ": " + complaint + "; " + std::to_string(used) +
           " is used");
}

int FromFile(const Limit& limit) {
  char text[64] = {};
  if (ALIBCFileExist(kQuendelctlConfFile) != 1) {
    return limit.usual;
  }
  const int size = ALIBCFileGetKeyValue(kQuendelctlConfFile, limit.key, text, sizeof text, 0);
  if (size < 0) {
    ComplainOfFile("cannot be read", limit.usual);
  }
  if (size <= 0) {
    return limit.usual;
  }
  const std::optional<int> number = Parse(limit, text);
  if (!number) {
    ComplainOfFile(limit.key + ("=" + Complaint(limit, text)), limit.usual);
  }
  return number.value_or(limit.usual);
}

int Read(const Limit& limit, const std::string& option) {
  if (option.empty()) {
    return FromFile(limit);
  }
  const std::optional<int> number = Parse(limit, option);
  if (!number) {
    throw CLI::ValidationError(limit.option, Complaint(limit, option));
  }
  return *number;
}

}  // namespace

void DeclareLimits(CLI::App& command, LimitArguments& arguments, WaitFor waitFor) {
  arguments.wait_for = waitFor;
  const auto usual = [](const Limit& limit) {
    return std::to_string(limit.usual) + " if not given";
  };
  command
      .add_option(kMemory.option, arguments.memory,
                  "Most memory of each process that works for it, in MiB,\n" + usual(kMemory))
      ->type_name("MIB");
  command
      .add_option(kAnswerTime.option, arguments.timeout,
                  "Give up after so many seconds, " + usual(TimeLimit(waitFor)))
      ->type_name("SECONDS");
}

WorkerLimits ReadLimits(const LimitArguments& arguments) {
  constexpr uint64_t kMebibyte = 1 << 20;
  const int seconds = Read(TimeLimit(arguments.wait_for), arguments.timeout);
  const int mebibytes = Read(kMemory, arguments.memory);
  return {std::chrono::seconds(seconds), static_cast<uint64_t>(mebibytes) * kMebibyte};
}

}  // namespace quendelctl
