// Runs the real collector and the model on the same files, and compares what they leave.
#include "model/checked_run.h"

#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <sstream>

#include "model/collector_files.h"
#include "platform/file.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"
#include "support/xz.h"

namespace quendel::test {
namespace {

namespace fs = std::filesystem;

std::string Show(const std::string& text) {
  std::ostringstream out;
  out << testing::PrintToString(text.substr(0, 300)) << " (" << text.size() << " bytes)";
  return out.str();
}

std::string Show(const ModelState& state) {
  std::string text;
  for (const auto& [key, value] : state) {
    text.append(key).append("=").append(value).append(" ");
  }
  return text;
}

std::string Show(const Sections& sections) {
  std::string text;
  for (const auto& [name, state] : sections) {
    text.append("[").append(name).append("] ").append(Show(state)).append("\n");
  }
  return text;
}

std::string Show(const std::vector<std::string>& lines) {
  std::string text;
  for (const std::string& line : lines) {
    text.append(line).append("\n");
  }
  return text;
}

template <typename T>
std::string Compare(const std::string& what, const T& actual, const T& expected) {
  return actual == expected
             ? ""
             : what + ":\n" + Show(actual) + "\nbut the model says:\n" + Show(expected);
}

std::string CompareFiles(const ModelDisk& actual, const ModelDisk& expected) {
  for (const auto& [path, file] : expected) {
    const auto found = actual.find(path);
    if (found == actual.end()) {
      return "There is no " + path;
    }
    const std::string difference = Compare(path, found->second.bytes, file.bytes);
    if (!difference.empty()) {
      return difference;
    }
  }
  for (const auto& [path, file] : actual) {
    if (expected.count(path) == 0) {
      return "The model knows of no " + path;
    }
  }
  return "";
}

std::vector<std::string> Messages() {
  std::vector<std::string> messages;
  for (const LogLine& line : Log()) {
    messages.push_back(line.message);
  }
  return messages;
}

// Of pairs of what is compared and how, the first difference.
std::string FirstOf(std::initializer_list<std::string> differences) {
  for (const std::string& difference : differences) {
    if (!difference.empty()) {
      return difference;
    }
  }
  return "";
}

}  // namespace

ModelDisk ReadDisk(const std::vector<std::string>& folders) {
  ModelDisk disk;
  for (const std::string& folder : folders) {
    for (const fs::directory_entry& entry : fs::directory_iterator(folder)) {
      if (!entry.is_regular_file()) {
        continue;
      }
      const std::string path = entry.path();
      struct stat status = {};
      // The model knows a file by what the platform tells it by.
      EXPECT_EQ(ALIBCFileStat(path.c_str(), 1, &status), 0) << path;
      ModelFile& file = disk[path];
      file.inode = status.st_ino;
      file.bytes = ReadFile(path);
      if (entry.path().extension() == ".xz") {
        file.plain = Unxz(file.bytes);
      }
    }
  }
  return disk;
}

ModelConfs ReadConfs() {
  ModelConfs confs;
  for (const fs::directory_entry& entry : fs::directory_iterator(kConfFolder)) {
    if (entry.path().filename().string().rfind("quendel.log.", 0) == 0) {
      confs[entry.path()] = ReadPairs(entry.path());
    }
  }
  return confs;
}

CheckedRun CollectAndCompare(const std::vector<std::string>& folders, const ModelFault& fault) {
  fs::remove_all(kRunFolder);
  fs::create_directories(kRunFolder);
  fs::create_directories("/tmp/quendel");
  fs::remove(kLogUpdateFile);  // as the driver does before it starts the collectors
  const ModelDisk before = ReadDisk(folders);
  const ModelConfs confs = ReadConfs();
  ClearLog();
  if (!fault.call.empty()) {
    const bool givesPointer = fault.call.find("lloc") != std::string::npos;
    On(fault.call.c_str()).Nth(fault.nth).Return(givesPointer ? 0 : -1);
  }
  const int result = QUENDELCollectLog(kRunFolder);
  ResetCalls();

  ModelDisk modelDisk = before;
  const ModelRun model = ModelCollect(modelDisk, confs, kRunFolder, fault);
  CheckedRun run;
  ModelDisk expected;
  for (const auto& [path, file] : modelDisk) {
    if (before.count(path) == 0) {
      expected[path] = file;
    }
  }
  run.delivered = ReadDisk({kRunFolder});
  run.difference = FirstOf({
      result == model.result ? "" : "The result is " + std::to_string(result),
      Compare("Logged", Messages(), model.log),
      CompareFiles(run.delivered, expected),
      Compare("Staged", ReadStaged(), model.sections),
      ReadConfs() == confs ? "" : "A configuration file has changed",
      CompareFiles(ReadDisk(folders), before),
  });
  return run;
}

std::string CommitAndCompare(int failing) {
  ModelConfs expected = ReadConfs();
  std::vector<std::string> messages;
  int calls = 0;
  for (const auto& [path, state] : ReadStaged()) {
    // From the last key to the first, which is safe at every prefix.
    for (auto pair = state.rbegin(); pair != state.rend(); ++pair) {
      if (++calls == failing) {
        messages.push_back("Failed to set key-value pair: (" + pair->first + ", " + pair->second +
                           ") of config '" + path + "', ret = 77");
        break;
      }
      expected[path][pair->first] = pair->second;
    }
  }
  ClearLog();
  if (failing > 0) {
    On("ALIBCFileSetKeyValue").Nth(failing).Return(-1);
    On("ALIBCErrGet").Return(77);
  }
  const int result = QUENDELUpdateCollectConf(kLogUpdateFile);
  ResetCalls();

  ModelConfs actual = ReadConfs();
  std::string difference = FirstOf({
      result == 0 ? "" : "The commit's result is " + std::to_string(result),
      Compare("Logged by the commit", Messages(), messages),
  });
  for (const auto& [path, state] : expected) {
    difference = FirstOf({difference, Compare("State of " + path, actual[path], state)});
  }
  return difference;
}

}  // namespace quendel::test
