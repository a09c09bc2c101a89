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

// Follows one run by its files. Make it before the run starts; the run has to keep its files.
class RunWatch {
 public:
  explicit RunWatch(bool send);

  // Looks at the run, which the process `worker` does.
  void Look(pid_t worker);

  // Makes up its mind when the run is over. `returned` tells whether the run came to its end by
  // itself. A run directory that may be another run's counts as none from then on.
  void Settle(bool returned);

  Phase phase() const { return phase_; }

  // Whether several runs went on at the same time.
  bool IsAmbiguous() const { return directories_.size() > 1; }

  // The run directory and the archive beside it; empty when there is no run directory, or more than
  // one that could be it.
  std::string Directory() const;
  std::string Archive() const;

  // The size of the archive; nothing when there is none.
  std::optional<uint64_t> ArchiveBytes() const;

  // The names of the logs that gave something so far, be it an empty file when `leastBytes` is 0.
  std::set<std::string> Logs(uint64_t leastBytes) const;

  size_t CountInstalledLogs() const { return installedLogs_; }
  uint64_t BytesSoFar() const;

 private:
  void FindDirectories();

  const bool send_;
  const size_t installedLogs_;
  const std::set<std::string> before_;
  const timespec settingsChanged_;
  std::set<std::string> directories_;  // those that came since
  bool started_ = false;               // the run has been seen with children
  Phase phase_;
};

}  // namespace quendelctl

#endif  // QUENDELCTL_RUN_WATCH_H_
