// The public key that opens a session.
#ifndef QUENDELCTL_PUBLIC_KEY_H_
#define QUENDELCTL_PUBLIC_KEY_H_

#include <string>

#include "worker.h"

namespace quendelctl {

// Reads the one public key that a file holds, "-" for the standard input: one line without options
// that ssh-keygen takes for a key. Returns it as it stands. Throws a CLI::ValidationError for
// anything else, and for a file that is not a plain one or is reached by a link and somebody
// else's; std::runtime_error when ssh-keygen gave no answer.
std::string ReadPublicKey(const std::string& file, const WorkerLimits& limits);

}  // namespace quendelctl

#endif  // QUENDELCTL_PUBLIC_KEY_H_
