// What the server asks for, read from its reply. docs/actions.md describes the form.
#ifndef QUENDELD_ACTION_H_
#define QUENDELD_ACTION_H_

#include <json/value.h>

#include <string>
#include <vector>

#include "journal.h"

namespace quendeld {

struct ReadActions {
  std::vector<NewRequest> requests;  // those with an id, in their order
  std::vector<std::string> faults;   // what is wrong with the others, for the log
};

// Reads the "actions" of a heartbeat. A request that cannot be carried out is there with its
// report; so is one behind the first `most`, and one whose action was switched off by its owner. An
// entry without an id gives a fault only.
ReadActions ActionsFromJson(const Json::Value& actions, int64_t most, bool allowPower);

}  // namespace quendeld

#endif  // QUENDELD_ACTION_H_
