// Runs the real collector and the model on the same files, and compares what they leave.
#ifndef TESTS_MODEL_CHECKED_RUN_H_
#define TESTS_MODEL_CHECKED_RUN_H_

#include <string>
#include <vector>

#include "model/log_model.h"

namespace quendel::test {

// The regular files of these folders, which are on the appliance.
ModelDisk ReadDisk(const std::vector<std::string>& folders);

// The log collectors' configuration files.
ModelConfs ReadConfs();

struct CheckedRun {
  std::string difference;  // the first one, in words; empty when there is none
  ModelDisk delivered;     // what the run wrote
};

// Collects once, from logs in these folders, into a fresh directory.
CheckedRun CollectAndCompare(const std::vector<std::string>& folders, const ModelFault& fault);

// Commits what the last run staged; the call numbered `failing` of those that write a value fails,
// none when it is 0. Returns the first difference, as above.
std::string CommitAndCompare(int failing);

}  // namespace quendel::test

#endif  // TESTS_MODEL_CHECKED_RUN_H_
