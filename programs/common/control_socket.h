// How programs ask quendeld: a line of JSON each way through a socket that only root can open.
//
// A request is {"command": ...} with the command's own members; an answer holds "success", and
// "reason" where that is false. docs/operation.md lists them.
#ifndef COMMON_CONTROL_SOCKET_H_
#define COMMON_CONTROL_SOCKET_H_

#include <optional>
#include <string>

namespace quendel::programs {

inline constexpr char kControlSocket[] = "/run/quendel/control";

// Sends a request, which has no line end, and waits for the answer, however long that takes.
// Returns nothing when no daemon answers; errno tells why.
std::optional<std::string> AskDaemon(const std::string& request);

}  // namespace quendel::programs

#endif  // COMMON_CONTROL_SOCKET_H_
