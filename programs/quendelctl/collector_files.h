// The settings files of the collectors.
#ifndef QUENDELCTL_COLLECTOR_FILES_H_
#define QUENDELCTL_COLLECTOR_FILES_H_

#include <string>
#include <vector>

namespace quendelctl {

inline constexpr char kLogPrefix[] = "quendel.log.";
inline constexpr char kUdcPrefix[] = "quendel.udc.";

// Returns the names of the regular files in the collectors' folder that begin with the prefix,
// sorted. A folder that cannot be listed gives none, and `error`, when given, receives the reason.
std::vector<std::string> CollectorFiles(const char* prefix, std::string* error = nullptr);

}  // namespace quendelctl

#endif  // QUENDELCTL_COLLECTOR_FILES_H_
