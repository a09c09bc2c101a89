// A running desk.
#ifndef QUENDEL_DESK_SERVE_H_
#define QUENDEL_DESK_SERVE_H_

#include "desk.h"

namespace quendeldesk {

// Serves devices and programs until SIGTERM or SIGINT. Throws when it cannot begin to.
void Serve(const Settings& settings);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_SERVE_H_
