// The command that asks the device for its performance figures.
#include <algorithm>
#include <chrono>
#include <memory>
#include <thread>

#include "arguments.h"
#include "command.h"
#include "job.h"
#include "limit_options.h"
#include "output.h"
#include "progress.h"
#include "quendel.h"

namespace quendelctl {
namespace {

struct PerfArguments {
  std::string series;
  std::string every;
  LimitArguments limits;
};

Result AskForSample() {
  Result result;
  result.success = QUENDELCollectPerf(result.members["perf_data"]) == 0;
  result.lines = {"The performance service gave no figures."};  // unless it did
  return result;
}

Result TakeSample(const WorkerLimits& limits) {
  return RunJob(limits, "the performance service's answer", AskForSample);
}

// Both forms of the output are JSON, and tell the same.
Json::Value AsJson(const Result& sample) {
  Json::Value value;
  value["success"] = sample.success;
  value["perf_data"] = sample.members["perf_data"];
  if (!sample.success) {
    value["error"] = sample.lines.at(0);
    value["reason"] = sample.reason;
  }
  return value;
}

int ReadCount(const std::string& argument, const std::string& text) {
  const int count = ReadNumber(argument, text);
  if (count < 1) {
    throw CLI::ValidationError(argument, text + " is less than 1");
  }
  return count;
}

Result ShowSample(const WorkerLimits& limits) {
  const Result sample = TakeSample(limits);
  Result result;
  result.success = sample.success;
  result.members = AsJson(sample);
  result.lines = JsonLines(result.members);
  return result;
}

using Clock = std::chrono::steady_clock;

void SleepUntil(Clock::time_point moment, ProgressLine& line, const std::string& text) {
  constexpr std::chrono::milliseconds kLookEvery(100);
  while (Clock::now() < moment) {
    if (line.IsDue()) {
      line.Draw(text);
    }
    std::this_thread::sleep_until(std::min(moment, Clock::now() + kLookEvery));
  }
  line.Finish();
}

// The samples keep their distance however long each of them takes.
Result ShowSeries(int count, std::chrono::seconds every, const WorkerLimits& limits) {
  Result result;
  result.success = true;
  ProgressLine line;
  Clock::time_point next = Clock::now();
  for (int number = 0; number < count && result.reason != "interrupted"; ++number) {
    const std::string taken = std::to_string(number) + " of " + std::to_string(count);
    SleepUntil(next, line, "taking samples: " + taken);
    next += every;
    const Result sample = TakeSample(limits);
    result.members["perf_" + std::to_string(number)] = AsJson(sample);
    if (!sample.success) {
      result.success = false;
      result.reason = sample.reason;
    }
  }
  result.lines = JsonLines(result.members);
  if (!result.success) {
    result.members["error"] = "Not every sample could be taken.";
  }
  return result;
}

Result ShowFigures(const PerfArguments& arguments) {
  const WorkerLimits limits = ReadLimits(arguments.limits);
  if (!arguments.series.empty()) {
    const int count = ReadCount("--series", arguments.series);
    const int every = arguments.every.empty() ? 1 : ReadCount("--every", arguments.every);
    return ShowSeries(count, std::chrono::seconds(every), limits);
  }
  if (!arguments.every.empty()) {
    throw CLI::ValidationError("--every", "goes with --series only");
  }
  return ShowSample(limits);
}

Action DeclarePerf(CLI::App& command) {
  const auto arguments = std::make_shared<PerfArguments>();
  command
      .add_option("--series", arguments->series, "Take so many samples, as a series for collect")
      ->type_name("N");
  command.add_option("--every", arguments->every, "Seconds from sample to sample, 1 if not given")
      ->type_name("S");
  DeclareLimits(command, arguments->limits, WaitFor::kAnswer);
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
