// Threads for work that waits for a disk.
#ifndef QUENDEL_DESK_WORKERS_H_
#define QUENDEL_DESK_WORKERS_H_

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

namespace quendeldesk {

class Workers {
 public:
  explicit Workers(size_t threads);
  ~Workers();  // after all work that was handed in

  // Hands in work, which must not throw.
  void Do(std::function<void()> work);

 private:
  void Run();

  std::mutex mutex_;
  std::condition_variable wake_;
  std::deque<std::function<void()>> work_;
  bool ending_ = false;
  std::vector<std::thread> threads_;
};

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_WORKERS_H_
