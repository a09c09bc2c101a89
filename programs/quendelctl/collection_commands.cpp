// The commands that gather what is new on the device, pack it and deliver it.
#include <sys/stat.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <memory>

#include "arguments.h"
#include "base/paths.h"
#include "command.h"
#include "daemon_commands.h"
#include "progress.h"
#include "quendel.h"
#include "run_watch.h"
#include "worker.h"

namespace quendelctl {
namespace {

namespace fs = std::filesystem;

struct CollectArguments {
  bool send = false;
  bool keep = false;
  bool now = false;
  std::string perf;
};

Json::Value ReadSeries(const std::string& text) {
  Json::Value series = text.empty() ? Json::objectValue : ReadJson("--perf", text);
  if (!series.isObject()) {
    throw CLI::ValidationError("--perf", "not a series of samples: a JSON object is needed");
  }
  return series;
}

// The run keeps its files, so that there is something to tell of; they are removed afterwards.
WorkerEnd Collect(bool send, const Json::Value& series, RunWatch& run) {
  Progress progress;
  const WorkerEnd end = RunInWorker([&] { return QUENDELStartCollect(0, send ? 1 : 0, series); },
                                    [&](pid_t worker) {
                                      run.Look(worker);
                                      progress.Show(run);
                                    });
  progress.Finish();
  run.Settle(end.result.has_value());
  return end;
}

// A run that was ended in the middle leaves the files that mark its collectors.
void RemoveStaleMarkers() {
  constexpr char kMarker[] = "xxx.p.";  // "udc" or "log", then the process id
  std::error_code error;
  for (const auto& entry : fs::directory_iterator(quendel::kWorkRoot, error)) {
    const std::string name = entry.path().filename();
    if (name.rfind("udc.p.", 0) != 0 && name.rfind("log.p.", 0) != 0) {
      continue;
    }
    const pid_t id = static_cast<pid_t>(strtol(name.c_str() + strlen(kMarker), nullptr, 10));
    if (id > 0 && kill(id, 0) != 0 && errno == ESRCH) {
      fs::remove(entry.path(), error);
    }
  }
}

void RemoveRun(const RunWatch& run) {
  if (!run.Directory().empty()) {
    QUENDELRecursiveRmdir(run.Directory().c_str());
    QUENDELRecursiveRmdir(run.Archive().c_str());
  }
}

std::string DescribeFailure(const WorkerEnd& end) {
  if (end.interrupted) {
    return "The collection was interrupted.";
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
  }
  if (run.ArchiveBytes()) {
    result.lines.push_back("Archive: " + run.Archive());
    result.members["archive"] = run.Archive();
  }
}

Result RunCollection(const CollectArguments& arguments) {
  const Json::Value series = ReadSeries(arguments.perf);
  RunWatch run(arguments.send);
  const WorkerEnd end = Collect(arguments.send, series, run);

  Result result;
  result.success = end.result == 0;
  result.members["interrupted"] = end.interrupted;
  result.members["sent"] = result.success && arguments.send;
  for (const char* unknown : {"archive", "bytes", "logs_collected", "run_directory"}) {
    result.members[unknown] = Json::nullValue;
  }
  result.members["logs_sent"] = Json::arrayValue;
  if (result.success) {
    TellWhatWasCollected(arguments.send, run, result);
  } else {
    result.lines.push_back(DescribeFailure(end));
  }
  if (!end.result) {
    RemoveStaleMarkers();
  }
  if (run.IsAmbiguous()) {
    result.lines.push_back("Another run made a directory in /tmp meanwhile; both stay there.");
  }
  if (arguments.keep) {
    TellWhatIsKept(run, result);
  } else {
    RemoveRun(run);
  }
  return result;
}

Action DeclareCollect(CLI::App& command) {
  const auto arguments = std::make_shared<CollectArguments>();
  command.add_flag("--send", arguments->send, "Send the archive to the server");
  command.add_flag("--keep", arguments->keep,
                   "Keep the run directory and the archive, and tell where they are");
  command
      .add_option("--perf", arguments->perf,
                  "Performance series to put in, as perf --series prints it: a\n"
                  "file (- is the standard input) or a JSON object")
      ->type_name("FILE|JSON");
  command.add_flag("--now", arguments->now,
                   "Have quendeld collect and send, and wait until it has");
  return [arguments] {
    const bool hasOthers = arguments->send || arguments->keep || !arguments->perf.empty();
    if (arguments->now && hasOthers) {
      throw CLI::ValidationError("--now", "leaves everything else to quendeld");
    }
    return arguments->now ? HaveDaemonCollect() : RunCollection(*arguments);
  };
}

struct TarArguments {
  std::string directory;
  std::string archive;
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

Result PackDirectory(const TarArguments& arguments) {
  const std::string directory = ReadDirectory(arguments.directory);
  if (arguments.archive.empty()) {
    throw CLI::ValidationError("ARCHIVE", "a file name is needed");
  }
  // tar would take a name with a colon in it for one on another machine, but not a path.
  const std::string archive = fs::absolute(arguments.archive);
  Result result;
  result.success = QUENDELTarCollectData(directory.c_str(), archive.c_str()) == 0;
  result.members["archive"] = arguments.archive;
  if (!result.success) {
    result.lines = {arguments.directory + " could not be packed."};
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
  return [arguments] { return PackDirectory(*arguments); };
}

struct SendArguments {
  std::string file;
  std::string time;
};

// An archive is finished soon after its run began, which is what the server wants to know.
int64_t TimeOfFile(const std::string& path) {
  struct stat status = {};
  return stat(path.c_str(), &status) == 0 ? status.st_mtime : time(nullptr);
}

Result SendArchive(const SendArguments& arguments) {
  const int64_t moment =
      arguments.time.empty() ? TimeOfFile(arguments.file) : ReadMoment("--time", arguments.time);
  Result result;
  result.success = QUENDELSendCollectData(arguments.file.c_str(), moment) == 0;
  result.lines = {result.success ? "The server accepted " + arguments.file + "."
                                 : "The server did not get or accept " + arguments.file + "."};
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
      {"send", "Send the archive of a collection to the server",
       R"(Examples:
  quendelctl send /tmp/quendel_20240305_070809_0.tar.xz
  quendelctl send again.tar.xz --time 1709622489)",
       DeclareSend},
  };
}

}  // namespace quendelctl
