// Settings that keep the device from its server.
#ifndef QUENDELCTL_HINDRANCES_H_
#define QUENDELCTL_HINDRANCES_H_

#include <string>
#include <vector>

namespace quendelctl {

// Returns a sentence for each setting, in the files or in this process's environment, with which
// the device cannot be expected to reach its server or to report its contacts.
std::vector<std::string> FindHindrances();

}  // namespace quendelctl

#endif  // QUENDELCTL_HINDRANCES_H_
