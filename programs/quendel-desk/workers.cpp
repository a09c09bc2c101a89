// Threads for work that waits for a disk.
#include "workers.h"

namespace quendeldesk {

Workers::Workers(size_t threads) {
  for (size_t i = 0; i < threads; ++i) {
    threads_.emplace_back(&Workers::Run, this);
  }
}

Workers::~Workers() {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    ending_ = true;
  }
  wake_.notify_all();
  for (std::thread& thread : threads_) {
    thread.join();
  }
}

void Workers::Do(std::function<void()> work) {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    work_.push_back(std::move(work));
  }
  wake_.notify_one();
}

void Workers::Run() {
  for (;;) {
    std::unique_lock<std::mutex> lock(mutex_);
    wake_.wait(lock, [this] { return ending_ || !work_.empty(); });
    if (work_.empty()) {
      return;
    }
    const std::function<void()> work = std::move(work_.front());
    work_.pop_front();
    lock.unlock();
    work();
  }
}

}  // namespace quendeldesk
