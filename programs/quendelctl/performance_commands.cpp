// The command that asks the device for its performance figures.
#include <ctime>
#include <memory>

#include "arguments.h"
#include "command.h"
#include "output.h"
#include "quendel.h"

namespace quendelctl {
namespace {

struct PerfArguments {
  std::string series;
  std::string every;
};

Json::Value TakeSample() {
  Json::Value sample;
  sample["success"] = QUENDELCollectPerf(sample["perf_data"]) == 0;
  return sample;
}

int ReadCount(const std::string& argument, const std::string& text) {
  const int count = ReadNumber(argument, text);
  if (count < 1) {
    throw CLI::ValidationError(argument, text + " is less than 1");
  }
  return count;
}

Result ShowSample() {
  const Json::Value sample = TakeSample();
  Result result;
  result.success = sample["success"].asBool();
  result.members["perf_data"] = sample["perf_data"];
  result.lines = JsonLines(sample);
  return result;
}

// The samples keep their distance however long each of them takes.
Result ShowSeries(int count, int everySeconds) {
  Result result;
  result.success = true;
  timespec next = {};
  clock_gettime(CLOCK_MONOTONIC, &next);
  for (int number = 0; number < count; ++number) {
    if (number > 0) {
      next.tv_sec += everySeconds;
      while (clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &next, nullptr) != 0) {
      }
    }
    Json::Value& sample = result.members["perf_" + std::to_string(number)];
    sample = TakeSample();
    result.success = result.success && sample["success"].asBool();
  }
  result.lines = JsonLines(result.members);
  return result;
}

Result ShowFigures(const PerfArguments& arguments) {
  if (!arguments.series.empty()) {
    const int count = ReadCount("--series", arguments.series);
    return ShowSeries(count, arguments.every.empty() ? 1 : ReadCount("--every", arguments.every));
  }
  if (!arguments.every.empty()) {
    throw CLI::ValidationError("--every", "goes with --series only");
  }
  return ShowSample();
}

Action DeclarePerf(CLI::App& command) {
  const auto arguments = std::make_shared<PerfArguments>();
  command
      .add_option("--series", arguments->series, "Take so many samples, as a series for collect")
      ->type_name("N");
  command.add_option("--every", arguments->every, "Seconds from sample to sample, 1 if not given")
      ->type_name("S");
  return [arguments] { return ShowFigures(*arguments); };
}

}  // namespace

std::vector<Command> PerformanceCommands() {
  return {
      {"perf", "Show the device's performance figures, once or as a series",
       R"(Prints JSON in either form; --json puts it on one line.

Examples:
  quendelctl perf
  quendelctl perf --series 12 --every 5 > series.json
  quendelctl collect --perf series.json)",
       DeclarePerf},
  };
}

}  // namespace quendelctl
