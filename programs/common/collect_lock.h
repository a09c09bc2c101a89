// The lock that lets one collection run go on at a time on a device, whichever program runs it.
//
// It is an flock() on "/run/quendel/collect.lock". The file is root's alone, as whoever can open it
// can take it. While the lock is held, the file holds one line: the process id of the holder in
// decimal, a space, the name of its program, a line end. It stays in its place between runs, and
// what stands in it then means nothing. So nothing has to be cleared away after a crash, but the
// folder must not be removed while programs run that take the lock: a service that has systemd make
// it needs RuntimeDirectoryPreserve=yes.
#ifndef COMMON_COLLECT_LOCK_H_
#define COMMON_COLLECT_LOCK_H_

#include <sys/types.h>

#include <string>
#include <utility>

namespace quendel::programs {

// The process that holds the lock, with 0 for one that is not known: it took the lock only now.
struct LockHolder {
  pid_t process = 0;
  std::string program;
};

// Take it in the very process that runs the collection, before the run. What that process forks
// holds the lock as well, and what it executes does not: so the lock is free again when the run's
// last process has ended, however it ended.
class CollectLock {
 public:
  enum class Result {
    kTaken,
    kHeld,    // by holder()
    kFailed,  // errno tells why; EINTR when a signal came while it waited
  };

  // `program` is what others are told; it has no line end.
  explicit CollectLock(std::string program) : program_(std::move(program)) {}
  ~CollectLock() { Close(); }
  CollectLock(const CollectLock&) = delete;
  CollectLock& operator=(const CollectLock&) = delete;

  // Takes the lock if it is free.
  Result Take() { return Lock(false); }

  // Waits until it is free, however long that takes, and takes it.
  Result Wait() { return Lock(true); }

  // Makes this process the one that others are told of, where it was forked by the one that took
  // it.
  void TakeOver() const { WriteHolder(); }

  // After kHeld: who had it then.
  const LockHolder& holder() const { return holder_; }

 private:
  Result Lock(bool wait);
  bool Open();
  void Close();
  bool IsInPlace() const;
  void ReadHolder();
  void WriteHolder() const;

  const std::string program_;
  int file_ = -1;
  LockHolder holder_;
};

}  // namespace quendel::programs

#endif  // COMMON_COLLECT_LOCK_H_
