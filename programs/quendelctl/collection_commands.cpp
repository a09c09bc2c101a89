// The commands that gather what is new on the device, pack it and deliver it.
#include <sys/stat.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <memory>
#include <thread>

#include "arguments.h"
#include "base/paths.h"
#include "command.h"
#include "common/collect_lock.h"
#include "daemon_commands.h"
#include "job.h"
#include "leftovers.h"
#include "limit_options.h"
#include "progress.h"
#include "quendel.h"
#include "run_watch.h"
#include "unrecorded.h"
#include "worker.h"

namespace quendelctl {
namespace {

namespace fs = std::filesystem;
using quendel::programs::CollectLock;
using quendel::programs::LockHolder;
using Clock = std::chrono::steady_clock;

// What the worker of a run reports.
constexpr char kDone[] = "done";
constexpr char kFailed[] = "failed";

std::string Describe(const LockHolder& holder) {
  return holder.process == 0 ? "a program that has only now begun"
                             : holder.program + ", process " + std::to_string(holder.process);
}

struct CollectArguments {
  bool send = false;
  bool keep = false;
  bool now = false;
  bool wait = false;
  std::string perf;
  LimitArguments limits;
};

Json::Value ReadSeries(const std::string& text) {
  Json::Value series = text.empty() ? Json::objectValue : ReadJson("--perf", text);
  if (!series.isObject()) {
    throw CLI::ValidationError("--perf", "not a series of samples: a JSON object is needed");
  }
  return series;
}

// Waits for another run, if that is wanted, as long as there is time.
CollectLock::Result TakeLock(CollectLock& lock, bool wait, Clock::time_point deadline) {
  constexpr std::chrono::milliseconds kTryEvery(100);
  ProgressLine line;
  CollectLock::Result result = lock.Take();
  while (result == CollectLock::Result::kHeld && wait && Clock::now() < deadline) {
    if (line.IsDue()) {
      line.Draw("waiting for another collection: " + Describe(lock.holder()));
    }
    std::this_thread::sleep_for(kTryEvery);
    result = lock.Take();
  }
  line.Finish();
  return result;
}

// The run keeps its files, so that there is something to tell of; they are removed afterwards.
WorkerEnd Collect(const WorkerLimits& limits, bool send, const Json::Value& series,
                  const CollectLock& lock, RunWatch& run) {
  Progress progress;
  WorkerEnd end = RunInWorker(
      limits,
      [&] {
        lock.TakeOver();
        return std::string(QUENDELStartCollect(0, send ? 1 : 0, series) == 0 ? kDone : kFailed);
      },
      [&](pid_t worker) {
        run.Look(worker);
        progress.Show(run);
      });
  progress.Finish();
  run.Settle(end.report.has_value());
  return end;
}

void RemoveRun(const RunWatch& run) {
  if (!run.Directory().empty()) {
    QUENDELRecursiveRmdir(run.Directory().c_str());
    QUENDELRecursiveRmdir(run.Archive().c_str());
  }
}

std::string DescribeFailure(const WorkerEnd& end, const WorkerLimits& limits) {
  if (end.interrupted) {
    return "The collection was interrupted.";
  }
  if (end.timed_out) {
    return "The collection took longer than " + std::to_string(limits.time.count()) +
           " s and was ended; --timeout sets another limit.";
  }
  if (end.signal == SIGTERM) {
    return "The collection failed: the run was ended by SIGTERM, which it sends itself when it "
           "fails before its collectors have started.";
  }
  if (end.signal != 0) {
    return "The collection failed: the run was ended by signal " + std::to_string(end.signal) +
           " (" + strsignal(end.signal) + ").";
  }
  return "The collection failed.";
}

// Makes the result the failure of a run that did not come to a good end.
void TellFailure(const WorkerEnd& end, const WorkerLimits& limits, Result& result) {
  result.lines.push_back(DescribeFailure(end, limits));
  const bool endedItself = end.report || end.signal == SIGTERM;
  if (!endedItself || end.interrupted || end.timed_out) {
    result.reason = FailureOf(end, limits).reason;
  }
}

std::string DescribeLogs(const std::set<std::string>& logs) {
  if (logs.empty()) {
    return "No log had anything new.";
  }
  std::string text = logs.size() == 1 ? "1 log has" : std::to_string(logs.size()) + " logs have";
  text += " something new:";
  for (const std::string& name : logs) {
    text += " " + name;
  }
  return text;
}

Json::Value JsonList(const std::set<std::string>& texts) {
  Json::Value list = Json::arrayValue;
  for (const std::string& text : texts) {
    list.append(text);
  }
  return list;
}

void TellWhatWasCollected(bool send, const RunWatch& run, Result& result) {
  result.lines.push_back("The collection is complete.");
  if (!run.Directory().empty()) {
    const std::set<std::string> logs = run.Logs(1);
    result.lines.push_back(DescribeLogs(logs));
    result.members["logs_collected"] = JsonList(logs);
  }
  std::string size;
  if (const auto bytes = run.ArchiveBytes()) {
    size = " of " + std::to_string(*bytes) + " bytes";
    result.members["bytes"] = static_cast<Json::UInt64>(*bytes);
  }
  if (send) {
    result.lines.push_back("The server accepted the archive" + size + ".");
    result.members["logs_sent"] = result.members["logs_collected"];
  }
}

void TellWhatIsKept(const RunWatch& run, Result& result) {
  if (!run.Directory().empty()) {
    result.lines.push_back("Run directory: " + run.Directory());
    result.members["run_directory"] = run.Directory();
    MarkAsKept(run.Directory());
  }
  if (run.ArchiveBytes()) {
    result.lines.push_back("Archive: " + run.Archive());
    result.members["archive"] = run.Archive();
  }
}

// What was delivered and not noted as collected comes again.
void TellWhatIsNotRecorded(const RunWatch& run, Result& result) {
  result.members["not_recorded"] = Json::arrayValue;
  for (const Unrecorded& collector : FindUnrecorded(run)) {
    result.members["not_recorded"].append(collector.name);
    result.lines.push_back("Not recorded as collected: " + collector.name + ", as " +
                           collector.reason + ". The next collection gathers it again.");
  }
}

Result NewResult() {
  Result result;
  result.members["interrupted"] = false;
  result.members["sent"] = false;
  for (const char* unknown : {"archive", "bytes", "logs_collected", "run_directory"}) {
    result.members[unknown] = Json::nullValue;
  }
  for (const char* list : {"logs_sent", "not_recorded"}) {
    result.members[list] = Json::arrayValue;
  }
  return result;
}

Result NotStarted(Result result, CollectLock::Result why, const LockHolder& holder) {
  if (why == CollectLock::Result::kFailed) {
    result.lines = {std::string("Nothing was done: cannot take ") + quendel::kCollectLockFile +
                    ": " + strerror(errno) + "."};
    return result;
  }
  result.reason = "busy";
  result.lines = {"Nothing was done: a collection goes on, by " + Describe(holder) + "."};
  result.members["held_by"]["process"] =
      holder.process == 0 ? Json::Value() : Json::Value(holder.process);
  result.members["held_by"]["program"] =
      holder.process == 0 ? Json::Value() : Json::Value(holder.program);
  return result;
}

Result RunWithLock(const CollectArguments& arguments, const WorkerLimits& limits,
                   const Json::Value& series, const CollectLock& lock) {
  RunWatch run(arguments.send);
  const WorkerEnd end = Collect(limits, arguments.send, series, lock, run);
  Result result = NewResult();
  result.success = end.report == kDone;
  result.members["interrupted"] = end.interrupted;
  result.members["sent"] = result.success && arguments.send;
  if (result.success) {
    TellWhatWasCollected(arguments.send, run, result);
    TellWhatIsNotRecorded(run, result);
  } else {
    TellFailure(end, limits, result);
  }
  if (!end.report) {
    RemoveStaleMarkers();
  }
  if (run.IsAmbiguous()) {
    result.lines.emplace_back("Another run made a directory in /tmp meanwhile; both stay there.");
  }
  if (arguments.keep) {
    TellWhatIsKept(run, result);
  } else {
    RemoveRun(run);
  }
  return result;
}

Result RunCollection(const CollectArguments& arguments) {
  const WorkerLimits limits = ReadLimits(arguments.limits);
  const Json::Value series = ReadSeries(arguments.perf);
  const Clock::time_point deadline = Clock::now() + limits.time;
  CollectLock lock("quendelctl");
  const CollectLock::Result taken = TakeLock(lock, arguments.wait, deadline);
  if (taken != CollectLock::Result::kTaken) {
    return NotStarted(NewResult(), taken, lock.holder());
  }
  return RunWithLock(arguments, limits, series, lock);
}

Action DeclareCollect(CLI::App& command) {
  const auto arguments = std::make_shared<CollectArguments>();
  command.add_flag("--send", arguments->send, "Send the archive to the server");
  command.add_flag("--keep", arguments->keep,
                   "Keep the run directory and the archive, and tell where they are");
  command.add_flag(
      "--wait", arguments->wait,
      "Wait for the end of another collection, which takes of the\ntime limit as well");
  command
      .add_option("--perf", arguments->perf,
                  "Performance series to put in, as perf --series prints it: a\n"
                  "file (- is the standard input) or a JSON object")
      ->type_name("FILE|JSON");
  DeclareLimits(command, arguments->limits, WaitFor::kTransfer);
  command.add_flag("--now", arguments->now,
                   "Have quendeld collect and send, and wait until it has");
  return [arguments] {
    const bool hasOthers =
        arguments->send || arguments->keep || arguments->wait || !arguments->perf.empty();
    if (arguments->now && hasOthers) {
      throw CLI::ValidationError("--now", "leaves everything else to quendeld");
    }
    return arguments->now ? HaveDaemonCollect() : RunCollection(*arguments);
  };
}

struct TarArguments {
  std::string directory;
  std::string archive;
  LimitArguments limits;
};

// The library takes the parent and the last component of a path that has both.
std::string ReadDirectory(const std::string& text) {
  std::error_code error;
  std::string path = fs::absolute(text, error);
  path.erase(path.find_last_not_of('/') + 1);
  std::string name = fs::path(path).filename();
  if (name == "." || name == "..") {
    path = fs::canonical(path, error);
    name = fs::path(path).filename();
  }
  if (name.empty()) {
    throw CLI::ValidationError("DIR", "a directory that has a name is needed");
  }
  if (name[0] == '-') {  // tar would take it for an option
    throw CLI::ValidationError("DIR", "the name " + name + " begins with a -");
  }
  return path.rfind('/') == 0 ? "/" + path : path;
}

Result Pack(const std::string& directory, const std::string& archive) {
  Result result;
  result.success = QUENDELTarCollectData(directory.c_str(), archive.c_str()) == 0;
  return result;
}

Result PackDirectory(const TarArguments& arguments) {
  const WorkerLimits limits = ReadLimits(arguments.limits);
  const std::string directory = ReadDirectory(arguments.directory);
  if (arguments.archive.empty() || arguments.archive == "-") {
    throw CLI::ValidationError("ARCHIVE",
                               "a file name is needed, as tar cannot write to a pipe here");
  }
  // tar would take a name with a colon in it for one on another machine, but not a path.
  const std::string archive = fs::absolute(arguments.archive);
  Result result = RunJob(limits, "tar", [&] { return Pack(directory, archive); });
  result.members["archive"] = arguments.archive;
  result.members["bytes"] = Json::nullValue;
  if (!result.success) {
    result.lines.insert(result.lines.begin(), arguments.directory + " could not be packed.");
    return result;
  }
  std::error_code error;
  const uint64_t bytes = fs::file_size(archive, error);
  result.lines = {"Packed " + arguments.directory + " into " + arguments.archive +
                  (error ? "." : ", " + std::to_string(bytes) + " bytes.")};
  result.members["bytes"] = error ? Json::Value() : static_cast<Json::UInt64>(bytes);
  return result;
}

Action DeclareTar(CLI::App& command) {
  const auto arguments = std::make_shared<TarArguments>();
  command.add_option("DIR", arguments->directory, "What to pack")->required()->type_name("");
  command.add_option("ARCHIVE", arguments->archive, "The archive to make or replace, a .tar.xz")
      ->required()
      ->type_name("");
  DeclareLimits(command, arguments->limits, WaitFor::kTransfer);
  return [arguments] { return PackDirectory(*arguments); };
}

struct CleanArguments {
  bool list = false;
};

// Removes what is left, and tells of each path what became of it.
void CleanUp(bool listOnly, Result& result) {
  result.success = true;
  for (const std::string& path : FindLeftovers()) {
    const bool removed = !listOnly && QUENDELRecursiveRmdir(path.c_str()) == 0;
    result.members["found"].append(path);
    if (removed) {
      result.members["removed"].append(path);
    } else if (!listOnly) {
      result.success = false;
      result.members["error"] = "Not everything could be removed.";
    }
    result.lines.push_back(path + (listOnly  ? ""
                                   : removed ? ": removed"
                                             : ": could not be removed"));
  }
  if (result.lines.empty()) {
    result.lines = {"No run has left anything behind."};
  }
}

Result Clean(const CleanArguments& arguments) {
  Result result;
  result.members["found"] = result.members["removed"] = Json::arrayValue;
  CollectLock lock("quendelctl");
  const CollectLock::Result taken = lock.Take();
  if (taken != CollectLock::Result::kTaken) {
    return NotStarted(result, taken, lock.holder());
  }
  CleanUp(arguments.list, result);
  return result;
}

Action DeclareClean(CLI::App& command) {
  const auto arguments = std::make_shared<CleanArguments>();
  command.add_flag("--list", arguments->list, "Only show what would be removed");
  return [arguments] { return Clean(*arguments); };
}

struct SendArguments {
  std::string file;
  std::string time;
  LimitArguments limits;
};

// An archive is finished soon after its run began, which is what the server wants to know.
int64_t TimeOfFile(const std::string& path) {
  struct stat status = {};
  return stat(path.c_str(), &status) == 0 ? status.st_mtime : time(nullptr);
}

Result Deliver(const std::string& file, int64_t moment) {
  Result result;
  result.success = QUENDELSendCollectData(file.c_str(), moment) == 0;
  result.lines = {result.success ? "The server accepted " + file + "."
                                 : "The server did not get or accept " + file + "."};
  return result;
}

Result SendArchive(const SendArguments& arguments) {
  const int64_t moment =
      arguments.time.empty() ? TimeOfFile(arguments.file) : ReadMoment("--time", arguments.time);
  Result result = RunJob(ReadLimits(arguments.limits), "the upload to end",
                         [&] { return Deliver(arguments.file, moment); });
  result.members["file"] = arguments.file;
  result.members["timestamp"] = static_cast<Json::Int64>(moment);
  return result;
}

Action DeclareSend(CLI::App& command) {
  const auto arguments = std::make_shared<SendArguments>();
  command.add_option("FILE", arguments->file, "Archive of a collection run")
      ->required()
      ->type_name("");
  command
      .add_option("--time", arguments->time,
                  "When the run began, in seconds since the epoch; the time of\n"
                  "the file's last change if not given")
      ->type_name("SECONDS");
  DeclareLimits(command, arguments->limits, WaitFor::kTransfer);
  return [arguments] { return SendArchive(*arguments); };
}

}  // namespace

std::vector<Command> CollectionCommands() {
  return {
      {"collect", "Gather what is new in the logs and collectors, pack it, and send it if asked",
       R"(What was gathered counts as collected once the archive is made and, with --send,
accepted by the server. One collection at a time.

Examples:
  quendelctl collect --send
  quendelctl collect --keep
  quendelctl perf --series 12 --every 5 | quendelctl collect --send --perf -)",
       DeclareCollect},
      {"tar", "Pack a directory the way a collection does",
       R"(Example:
  quendelctl tar /tmp/quendel_20240305_070809_0 /tmp/again.tar.xz)",
       DeclareTar},
      {"clean", "Remove what collections that died have left behind",
       R"(That is: run directories in /tmp, the archives beside them, and collectors' markers, if they are
your own and nothing else is in them. What collect --keep has kept stays.

Examples:
  quendelctl clean --list
  quendelctl clean)",
       DeclareClean},
      {"send", "Send the archive of a collection to the server",
       R"(Examples:
  quendelctl send /tmp/quendel_20240305_070809_0.tar.xz
  quendelctl send again.tar.xz --time 1709622489)",
       DeclareSend},
  };
}

}  // namespace quendelctl
