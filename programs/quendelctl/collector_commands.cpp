// The commands that show and reset what the collectors remember.
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>

#include "base/paths.h"
#include "collector_files.h"
#include "command.h"
#include "quendel.h"

namespace quendelctl {
namespace {

std::string PathOf(const std::string& file) {
  return std::string(quendel::kCollectorConfDir) + "/" + file;
}

bool IsLog(const std::string& file) {
  return file.rfind(kLogPrefix, 0) == 0;
}

// How a live log stands to what was collected of it.
struct LogState {
  const char* word;   // for a program
  std::string words;  // for a reader
  bool exists = false;
  uint64_t inode = 0;
  int64_t lag = 0;  // bytes that the next collection finds new
};

LogState Examine(const QUENDELLogConf_t& conf) {
  struct stat status = {};
  if (stat(conf.path, &status) != 0) {
    return {errno == ENOENT ? "missing" : "unreadable",
            errno == ENOENT ? "log missing" : std::string("log unreadable: ") + strerror(errno)};
  }
  LogState state = {"", "", true, status.st_ino, status.st_size};
  if (!S_ISREG(status.st_mode)) {
    state.word = "not-a-file";
    state.words = "log is not a regular file";
    state.lag = 0;
  } else if (conf.inode == 0) {
    state.word = "never-collected";
    state.words = "never collected";
  } else if (conf.inode != static_cast<uint32_t>(status.st_ino)) {
    state.word = "changed";
    state.words = "another file since it was collected";
  } else if (status.st_size < conf.total_byte) {
    state.word = "shortened";
    state.words = "same file, but shorter since it was collected";
  } else {
    state.word = "same";
    state.words = "same file";
    state.lag = status.st_size - conf.total_byte;
  }
  return state;
}

// A reset leaves a text in its place that is no hash.
bool IsHash(const char* text) {
  constexpr size_t kDigits = 32;
  return strlen(text) == kDigits && strspn(text, "0123456789abcdef") == kDigits;
}

std::string InodeText(bool known, uint64_t inode) {
  return known ? std::to_string(inode) : "none";
}

void Start(Result& result, Json::Value& entry, const std::string& file, const char* name,
           const char* path) {
  entry["name"] = name;
  entry["path"] = path;
  result.lines.push_back(file + ": " + name + ", " + path);
}

// Says so of a file that cannot be read as what its name promises.
void AddUnreadable(Result& result, Json::Value& entry, const std::string& file) {
  entry["state"] = "no-collector";
  result.lines.push_back(file + ": cannot be read as a collector");
  result.success = false;
  result.members["error"] = "Not every collector can be read.";
}

void AddLog(Result& result, Json::Value& entry, const std::string& file) {
  QUENDELLogConf_t conf = {};
  if (QUENDELGetLogConf(PathOf(file).c_str(), &conf) != 0) {
    AddUnreadable(result, entry, file);
    return;
  }
  const LogState state = Examine(conf);
  const bool collected = conf.inode != 0;
  const bool hashKnown = IsHash(conf.last_hash);
  Start(result, entry, file, conf.name, conf.path);
  entry["state"] = state.word;
  entry["recorded_inode"] = collected ? Json::Value(conf.inode) : Json::Value();
  entry["present_inode"] =
      state.exists ? Json::Value(static_cast<Json::UInt64>(state.inode)) : Json::Value();
  entry["offset"] = static_cast<Json::Int64>(conf.total_byte);
  entry["lag_bytes"] =
      state.exists ? Json::Value(static_cast<Json::Int64>(state.lag)) : Json::Value();
  entry["last_hash_known"] = hashKnown;
  result.lines.push_back("  " + state.words + "; inode recorded " +
                         InodeText(collected, conf.inode) + ", present " +
                         InodeText(state.exists, state.inode));
  result.lines.push_back("  collected up to byte " + std::to_string(conf.total_byte) +
                         (state.exists ? ", " + std::to_string(state.lag) + " bytes behind" : "") +
                         "; hash of the last line " + (hashKnown ? "known" : "not known"));
}

void AddUdc(Result& result, Json::Value& entry, const std::string& file) {
  QUENDELUDCConf_t conf = {};
  if (QUENDELGetUDCConf(PathOf(file).c_str(), &conf) != 0) {
    AddUnreadable(result, entry, file);
    return;
  }
  struct stat status = {};
  const bool exists = stat(conf.path, &status) == 0;
  const bool runs = exists && S_ISREG(status.st_mode) && access(conf.path, X_OK) == 0;
  const bool hashKnown = IsHash(conf.last_hash);
  Start(result, entry, file, conf.name, conf.path);
  entry["state"] = runs ? "ready" : exists ? "not-executable" : "missing";
  entry["last_hash_known"] = hashKnown;
  result.lines.push_back(std::string("  ") +
                         (runs     ? "program ready"
                          : exists ? "program cannot be run"
                                   : "program missing") +
                         "; hash of the last output " + (hashKnown ? "known" : "not known"));
}

// Returns the settings files of all collectors, logs first.
std::vector<std::string> AllCollectors(std::string* error = nullptr) {
  std::vector<std::string> files = CollectorFiles(kLogPrefix, error);
  const std::vector<std::string> programs = CollectorFiles(kUdcPrefix);
  files.insert(files.end(), programs.begin(), programs.end());
  return files;
}

std::string CannotList(const std::string& error) {
  return std::string("The collectors in ") + quendel::kCollectorConfDir +
         " cannot be listed: " + error + ".";
}

Result ListCollectors() {
  std::string error;
  const std::vector<std::string> files = AllCollectors(&error);
  Result result;
  result.success = error.empty();
  result.members["collectors"] = Json::arrayValue;
  for (const std::string& file : files) {
    Json::Value entry;
    entry["file"] = file;
    entry["kind"] = IsLog(file) ? "log" : "udc";
    IsLog(file) ? AddLog(result, entry, file) : AddUdc(result, entry, file);
    result.members["collectors"].append(entry);
  }
  if (!error.empty()) {
    result.lines.push_back(CannotList(error));
  } else if (files.empty()) {
    result.lines.push_back("There are no collectors.");
  }
  return result;
}

struct ResetArguments {
  std::string name;
  bool all = false;
};

// Returns the name that a collector gives itself, or an empty text.
std::string NameIn(const std::string& file) {
  QUENDELLogConf_t log = {};
  QUENDELUDCConf_t udc = {};
  if (IsLog(file)) {
    return QUENDELGetLogConf(PathOf(file).c_str(), &log) == 0 ? log.name : "";
  }
  return QUENDELGetUDCConf(PathOf(file).c_str(), &udc) == 0 ? udc.name : "";
}

std::string FindCollector(const std::vector<std::string>& files, const std::string& name) {
  if (std::find(files.begin(), files.end(), name) != files.end()) {
    return name;
  }
  std::vector<std::string> found;
  for (const std::string& file : files) {
    if (!name.empty() && NameIn(file) == name) {
      found.push_back(file);
    }
  }
  if (found.empty()) {
    throw CLI::ValidationError("NAME", "no collector is called " + name);
  }
  if (found.size() > 1) {
    throw CLI::ValidationError("NAME", name + " can be " + CLI::detail::join(found, " or "));
  }
  return found[0];
}

bool Reset(const std::string& file) {
  const std::string path = PathOf(file);
  return (IsLog(file) ? QUENDELResetLogConf(path.c_str()) : QUENDELResetUDCConf(path.c_str())) == 0;
}

Result ResetCollectors(const ResetArguments& arguments) {
  if (arguments.all == !arguments.name.empty()) {
    throw CLI::ValidationError("NAME", "either a NAME or --all is needed");
  }
  std::string error;
  std::vector<std::string> files = AllCollectors(&error);
  Result result;
  if (!error.empty()) {
    result.lines = {CannotList(error)};
    return result;
  }
  if (!arguments.all) {
    files = {FindCollector(files, arguments.name)};
  }
  result.success = true;
  result.members["reset"] = result.members["failed"] = Json::arrayValue;
  for (const std::string& file : files) {
    const bool done = Reset(file);
    if (!done) {
      result.success = false;
      result.members["error"] = "Not every collector could be reset.";
    }
    result.members[done ? "reset" : "failed"].append(file);
    result.lines.push_back(file + (done ? ": reset" : ": could not be reset"));
  }
  if (files.empty()) {
    result.lines = {"There are no collectors."};
  }
  return result;
}

Action DeclareList(CLI::App& /*command*/) {
  return ListCollectors;
}

Action DeclareReset(CLI::App& command) {
  const auto arguments = std::make_shared<ResetArguments>();
  command.add_option("NAME", arguments->name, "A collector's settings file, or the name in it")
      ->type_name("");
  command.add_flag("--all", arguments->all, "Every collector");
  return [arguments] { return ResetCollectors(*arguments); };
}

Action DeclareConf(CLI::App& command) {
  return DeclareGroup(
      command,
      {{"list", "Show every collector and how it stands",
        R"(Examples:
  quendelctl conf list
  quendelctl conf list --json)",
        DeclareList},
       {"reset", "Forget what was collected, so that the next collection sends all of it again",
        R"(Examples:
  quendelctl conf reset quendel.log.messages
  quendelctl conf reset --all)",
        DeclareReset}});
}

}  // namespace

std::vector<Command> CollectorCommands() {
  return {
      {"conf", "Show or reset what the collectors remember of what was collected", "", DeclareConf},
  };
}

}  // namespace quendelctl
