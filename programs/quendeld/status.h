// How the daemon is: what "quendelctl status" shows and "/run/quendel/status.json" holds.
#ifndef QUENDELD_STATUS_H_
#define QUENDELD_STATUS_H_

#include <json/value.h>

#include <string>

namespace quendeld {

inline constexpr char kStatusFile[] = "/run/quendel/status.json";

// Adds "problems", a list of sentences, and "healthy", which is true when there is none.
void Judge(Json::Value& status);

// Replaces the file; a reader sees the old or the new one.
void WriteStatusFile(const Json::Value& status);

}  // namespace quendeld

#endif  // QUENDELD_STATUS_H_
