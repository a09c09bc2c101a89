// The file that tells how the remote session that is open has to be ended.
#ifndef QUENDELCTL_SESSION_FILE_H_
#define QUENDELCTL_SESSION_FILE_H_

#include <string>

#include "base/paths.h"

namespace quendelctl {

// What came of writing the file.
enum class SessionFile { kWritten, kExists, kFailed };

// Writes the file whole or not at all, and only when there is none: of two writers one succeeds. It
// survives a crash from then on. `account` must be a text that a key=value file holds as it is. A
// failure is logged.
SessionFile WriteSessionFile(const std::string& account, bool stopSshd);

// Tells whether the file is there: whether a session is open.
bool IsSessionOpen();

// Removes the file. Returns false, with the reason logged, when it is still there.
bool RemoveSessionFile();

}  // namespace quendelctl

#endif  // QUENDELCTL_SESSION_FILE_H_
