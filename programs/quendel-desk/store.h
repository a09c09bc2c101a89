// The database behind the desk: many requests' changes in one commit, and sessions for reading.
#ifndef QUENDEL_DESK_STORE_H_
#define QUENDEL_DESK_STORE_H_

#include <soci/soci.h>

#include <condition_variable>
#include <deque>
#include <exception>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace quendeldesk {

// Milliseconds since 1970, in UTC.
long long NowMs();

class Store {
 public:
  // A change. It may be run more than once, and changes nothing but the database and its own
  // result.
  using Change = std::function<void(soci::session&)>;
  // Told when the change is on the disk, or why it is not. Runs on the store's thread: keep it
  // short.
  using Done = std::function<void(std::exception_ptr failure)>;

  // Opens the database, and makes it when there is none. `readers` sessions are for reading.
  Store(const std::string& file, size_t readers);
  ~Store();  // after every change that was handed in is done

  // Hands a change in. Changes that wait go into one transaction and one commit.
  void Write(Change change, Done done);

  // Makes a change and waits until it is on the disk. Throws when it failed.
  void WriteAndWait(Change change);

  // Runs `query` on a session that sees everything that has been acknowledged.
  template <typename Query>
  auto Read(Query query) {
    soci::session session(readers_);
    return query(session);
  }

  // Notes that a device was heard. It is written with the next commit, or after a second or two.
  void NoteHeartbeat(long long device, long long at);

 private:
  struct Job {
    Change change;
    Done done;
  };
  struct Heartbeat {
    long long device;
    long long at;
  };

  void Run();
  void Commit(std::vector<Job>& jobs, std::vector<Heartbeat>& heartbeats);
  void CommitOneByOne(std::vector<Job>& jobs);

  soci::session writer_;
  soci::connection_pool readers_;
  std::mutex mutex_;
  std::condition_variable wake_;
  std::deque<Job> jobs_;
  std::vector<Heartbeat> heartbeats_;
  bool ending_ = false;
  std::thread thread_;
};

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_STORE_H_
