// The settings files of the collectors.
#include "collector_files.h"

#include <algorithm>
#include <filesystem>

#include "base/paths.h"

namespace quendelctl {

std::vector<std::string> CollectorFiles(const char* prefix, std::string* error) {
  namespace fs = std::filesystem;
  std::vector<std::string> names;
  std::error_code problem;
  for (fs::directory_iterator entry(quendel::kCollectorConfDir, problem);
       !problem && entry != fs::directory_iterator(); entry.increment(problem)) {
    const std::string name = entry->path().filename();
    std::error_code ignored;  // what cannot be examined is no regular file
    if (name.rfind(prefix, 0) == 0 && entry->is_regular_file(ignored)) {
      names.push_back(name);
    }
  }
  if (problem && error != nullptr) {
    *error = problem.message();
  }
  std::sort(names.begin(), names.end());
  return names;
}

}  // namespace quendelctl
