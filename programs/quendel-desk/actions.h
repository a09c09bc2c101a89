// The actions that a supporter may ask of a device.
#ifndef QUENDEL_DESK_ACTIONS_H_
#define QUENDEL_DESK_ACTIONS_H_

#include <json/value.h>

#include "records.h"

namespace quendeldesk {

// Reads {"action": name, "files": [...], "progress": 0 | -1, "expires_in": seconds}. Throws
// std::invalid_argument with a sentence for what no device would carry out.
NewAction ActionFrom(const Json::Value& request, long long now);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_ACTIONS_H_
