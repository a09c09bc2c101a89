// The database behind the desk: many requests' changes in one commit, and sessions for reading.
#include "store.h"

#include <chrono>
#include <future>

#include "database.h"

namespace quendeldesk {
namespace {

constexpr size_t kMostInOneCommit = 512;
constexpr std::chrono::seconds kHeartbeatsWait(2);

}  // namespace

long long NowMs() {
  using std::chrono::duration_cast;
  using std::chrono::milliseconds;
  return duration_cast<milliseconds>(std::chrono::system_clock::now().time_since_epoch()).count();
}

Store::Store(const std::string& file, size_t readers) : readers_(readers) {
  OpenSession(writer_, file);
  PrepareSchema(writer_);
  for (size_t i = 0; i < readers; ++i) {
    OpenSession(readers_.at(i), file);
  }
  thread_ = std::thread(&Store::Run, this);
}

Store::~Store() {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    ending_ = true;
  }
  wake_.notify_one();
  thread_.join();
}

void Store::Write(Change change, Done done) {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    jobs_.push_back({std::move(change), std::move(done)});
  }
  wake_.notify_one();
}

void Store::WriteAndWait(Change change) {
  std::promise<void> promise;
  Write(std::move(change), [&promise](std::exception_ptr failure) {
    failure ? promise.set_exception(failure) : promise.set_value();
  });
  promise.get_future().get();
}

void Store::NoteHeartbeat(long long device, long long at) {
  const std::lock_guard<std::mutex> lock(mutex_);
  heartbeats_.push_back({device, at});
}

void Store::Run() {
  for (bool ending = false; !ending;) {
    std::vector<Job> jobs;
    std::vector<Heartbeat> heartbeats;
    {
      std::unique_lock<std::mutex> lock(mutex_);
      wake_.wait_for(lock, kHeartbeatsWait, [this] { return ending_ || !jobs_.empty(); });
      while (!jobs_.empty() && jobs.size() < kMostInOneCommit) {
        jobs.push_back(std::move(jobs_.front()));
        jobs_.pop_front();
      }
      heartbeats.swap(heartbeats_);
      ending = ending_ && jobs_.empty();
    }
    if (!jobs.empty() || !heartbeats.empty()) {
      Commit(jobs, heartbeats);
    }
  }
}

// A heartbeat of a device that has been forgotten since leaves no row.
void Store::Commit(std::vector<Job>& jobs, std::vector<Heartbeat>& heartbeats) {
  try {
    BeginWriting(writer_);
    for (const Job& job : jobs) {
      job.change(writer_);
    }
    for (const auto& [device, at] : heartbeats) {
      writer_
          << "INSERT INTO heartbeats (device_id, at) SELECT id, :at FROM devices WHERE id = :id",
          soci::use(at, "at"), soci::use(device, "id");
      writer_ << "UPDATE devices SET last_heartbeat = :at, last_seen = :seen WHERE id = :id",
          soci::use(at, "at"), soci::use(at, "seen"), soci::use(device, "id");
    }
    quendeldesk::Commit(writer_);
  } catch (const std::exception&) {
    Rollback(writer_);
    CommitOneByOne(jobs);
    return;
  }
  for (const Job& job : jobs) {
    job.done(nullptr);
  }
}

// So that a change that fails takes no other with it.
void Store::CommitOneByOne(std::vector<Job>& jobs) {
  for (const Job& job : jobs) {
    std::exception_ptr failure;
    try {
      BeginWriting(writer_);
      job.change(writer_);
      quendeldesk::Commit(writer_);
    } catch (const std::exception&) {
      failure = std::current_exception();
      Rollback(writer_);
    }
    job.done(failure);
  }
}

}  // namespace quendeldesk
