// The names of actions and events as the server knows them.
#include "quendel/conversation.h"

const char* const QUENDEL_ACTION_NAMES[6] = {
    "enable", "disable", "poweroff", "reboot", "logout", "update_info",
};
