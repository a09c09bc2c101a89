// What a command does in a worker.
#include "job.h"

#include <json/reader.h>
#include <json/writer.h>

#include <climits>
#include <csignal>
#include <cstring>
#include <memory>
#include <new>

#include "progress.h"

namespace quendelctl {
namespace {

std::string ToText(const Result& result) {
  Json::Value all;
  all["success"] = result.success;
  all["reason"] = result.reason;
  all["members"] = result.members;
  all["bytes"] = result.bytes;
  all["lines"] = Json::arrayValue;
  for (const std::string& line : result.lines) {
    all["lines"].append(line);
  }
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;  // bytes of any kind stay what they are
  return Json::writeString(builder, all);
}

// What the worker wrote is as deep as it was when the worker read it, and a little deeper.
Result FromText(const std::string& text) {
  Json::CharReaderBuilder builder;
  builder["stackLimit"] = INT_MAX;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value all;
  if (!reader->parse(text.data(), text.data() + text.size(), &all, nullptr)) {
    throw std::runtime_error("a worker's report cannot be read");
  }
  Result result;
  result.success = all["success"].asBool();
  result.reason = all["reason"].asString();
  result.members = all["members"];
  result.bytes = all["bytes"].asString();
  for (const Json::Value& line : all["lines"]) {
    result.lines.push_back(line.asString());
  }
  return result;
}

Result Failure(const char* reason, const std::string& line) {
  Result result;
  result.reason = reason;
  result.lines = {line};
  return result;
}

Result OutOfMemory(const WorkerLimits& limits) {
  return Failure("memory", "It needs more memory than " +
                               std::to_string(limits.memory_bytes >> 20) +
                               " MiB, which is the limit; --memory sets another.");
}

std::string Report(const std::function<Result()>& job, const WorkerLimits& limits) noexcept {
  try {
    return ToText(job());
  } catch (const std::bad_alloc&) {
    return ToText(OutOfMemory(limits));
  } catch (const std::exception& error) {
    return ToText(Failure("failed", error.what()));
  }
}

}  // namespace

Result FailureOf(const WorkerEnd& end, const WorkerLimits& limits) {
  if (end.interrupted) {
    return Failure("interrupted", "It was interrupted.");
  }
  if (end.timed_out) {
    return Failure("timeout", "It took longer than " + std::to_string(limits.time.count()) +
                                  " s and was ended; --timeout sets another limit.");
  }
  return Failure("killed", "It was ended by signal " + std::to_string(end.signal) + " (" +
                               strsignal(end.signal) + ").");
}

Result RunJob(const WorkerLimits& limits, const std::string& awaited,
              const std::function<Result()>& job) {
  WaitingLine line("waiting for " + awaited, limits.time);
  const WorkerEnd end = RunInWorker(
      limits, [&] { return Report(job, limits); }, [&](pid_t /*worker*/) { line.Show(); });
  line.Finish();
  return end.report ? FromText(*end.report) : FailureOf(end, limits);
}

}  // namespace quendelctl
