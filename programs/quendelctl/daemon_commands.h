// What quendelctl leaves to the daemon, where one runs.
#ifndef QUENDELCTL_DAEMON_COMMANDS_H_
#define QUENDELCTL_DAEMON_COMMANDS_H_

#include <optional>

#include "command.h"

namespace quendelctl {

// Have the daemon do it, and wait for the end. They fail where no daemon runs.
Result HaveDaemonBeat();
Result HaveDaemonCollect();

// Have the daemon do it. Nothing comes back where no daemon runs: it is then for the caller to do.
std::optional<Result> HaveDaemonSendLogout();
std::optional<Result> HaveDaemonCloseSession(int id, int progress);

}  // namespace quendelctl

#endif  // QUENDELCTL_DAEMON_COMMANDS_H_
