// The device's ssh service.
#ifndef PLATFORM_STANDALONE_SSH_SERVICE_H_
#define PLATFORM_STANDALONE_SSH_SERVICE_H_

namespace platform {

// Starts the system's own sshd, with its own settings, unless it runs already; or stops it, which
// leaves the sessions that are open alone. The sshd meant is the one whose process number is in
// "/run/sshd.pid".
// Returns false when the service is not in the wanted state afterwards.
bool StartSshService();
bool StopSshService();

}  // namespace platform

#endif  // PLATFORM_STANDALONE_SSH_SERVICE_H_
