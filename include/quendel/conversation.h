// What the device and the server tell each other.
//
// The device is named by its serial number (at most 35 bytes) and by two identifying texts of the
// signed-in cloud account, account fields A and B. All three come from the platform.
#ifndef QUENDEL_CONVERSATION_H_
#define QUENDEL_CONVERSATION_H_

#include <json/value.h>

#include "quendel/export.h"
#include "quendel/types.h"

// The names of actions and events as the server knows them, indexed by QuendelEvent_t.
extern QUENDEL_EXPORT const char* const QUENDEL_ACTION_NAMES[6];

// Tells the server that the device is alive and fetches the actions it has queued for the device.
//
// On success `actions` is the reply's "actions" member, unchanged and of whatever kind it is, or is
// cleared when the reply has none: an array or object becomes empty and keeps its kind, any other
// value becomes null. On failure it is untouched.
//
// Returns 0 when the server accepted the heartbeat, else -1.
QUENDEL_EXPORT int QUENDELHeartbeat(Json::Value& actions);

// Tells the server how an action that it requested stands. `requestId` is the number the server
// gave the request; `details` is sent as it is and may be an empty object.
//
// Needs a signed-in cloud account.
//
// Returns 0 when the server accepted the report, else -1.
QUENDEL_EXPORT int QUENDELUpdateActRequestProgress(int requestId, QuendelActionProgress_t progress,
                                                   Json::Value details);

// Reports an event of the device to the server, with the account's e-mail address and the contact
// list of the service's configuration. `hmxInfo` describes the device; it is sent with
// QUENDEL_EVENT_ENABLE and ignored with every other event.
//
// `reply` receives the server's reply whenever that was JSON, also when the result is -1; otherwise
// it is untouched. Needs a signed-in cloud account, whatever the event.
//
// Returns 0 when the server accepted the report, else -1.
QUENDEL_EXPORT int QUENDELPostEventToServer(QuendelEvent_t event, Json::Value& reply,
                                            const Json::Value& hmxInfo);

#endif  // QUENDEL_CONVERSATION_H_
