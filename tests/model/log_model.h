// What the log collector has to do, said once more: over files that are texts in memory, as plainly
// as it can be said, and with nothing of the collector's own.
#ifndef TESTS_MODEL_LOG_MODEL_H_
#define TESTS_MODEL_LOG_MODEL_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace quendel::test {

struct ModelFile {
  uint64_t inode = 0;
  std::string bytes;
  std::optional<std::string> plain;  // what xz makes of the bytes; nothing when it refuses them
};

using ModelDisk = std::map<std::string, ModelFile>;     // by path
using ModelState = std::map<std::string, std::string>;  // by key
using ModelConfs = std::map<std::string, ModelState>;   // by path of the configuration file

// The nth call of one of the platform's operations, counted from the start of the run, fails.
struct ModelFault {
  std::string call;
  int nth = 0;
};

// What a run left behind, besides the files.
struct ModelRun {
  int result = 0;
  std::vector<std::string> log;
  std::vector<std::pair<std::string, ModelState>> sections;
};

// Runs a collection into the directory `dir`. What it writes there is on the disk afterwards.
ModelRun ModelCollect(ModelDisk& disk, const ModelConfs& confs, const std::string& dir,
                      const ModelFault& fault);

}  // namespace quendel::test

#endif  // TESTS_MODEL_LOG_MODEL_H_
