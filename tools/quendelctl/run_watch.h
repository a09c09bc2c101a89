// What can be seen of a collection run from outside.
#ifndef QUENDELCTL_RUN_WATCH_H_
#define QUENDELCTL_RUN_WATCH_H_

#include <sys/types.h>

#include <cstdint>
#include <ctime>
#include <optional>
#include <set>
#include <string>

namespace quendelctl {

// The phases of a run, in their order. One that is short may pass unseen.
enum class Phase { kStarting, kCheckingServer, kCollecting, kPacking, kSending, kCommitting };

// Returns the phase in words: "checking the server".
const char* PhaseName(Phase phase);

// Follows one run by its files. Make it before the run starts.
class RunWatch {
 public:
  explicit RunWatch(bool send);
  ~RunWatch();
  RunWatch(const RunWatch&) = delete;
  RunWatch& operator=(const RunWatch&) = delete;

  // Looks at the run, which the process `worker` does. Call it often: a run that keeps nothing has
  // nothing left to look at when it is over.
  void Look(pid_t worker);

  Phase phase() const { return phase_; }

  // The run directory and the archive beside it; empty when no run directory was seen, or when it
  // could be that of one of several runs.
  std::string Directory() const;
  std::string Archive() const;

  // The archive's bytes, also when it is gone again; nothing when it was never seen.
  std::optional<uint64_t> ArchiveBytes() const;

  // The names of the logs that gave something new; nothing when the archive was never seen, since
  // until then there may be more.
  const std::optional<std::set<std::string>>& logs() const { return logs_; }

  size_t CountInstalledLogs() const { return installedLogs_; }
  size_t CountLogsSoFar() const;
  uint64_t BytesSoFar() const;

 private:
  void FindDirectory();
  void OpenArchive();

  const bool send_;
  const size_t installedLogs_;
  const std::set<std::string> before_;
  const timespec settingsChanged_;
  std::set<std::string> directories_;  // those that came since, as far as they were looked for
  int archive_ = -1;                   // descriptor
  std::optional<std::set<std::string>> logs_;
  Phase phase_;
};

}  // namespace quendelctl

#endif  // QUENDELCTL_RUN_WATCH_H_
