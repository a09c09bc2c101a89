// The ends of support sessions: asked for by the server or the owner, or due after the longest time
// that the owner allows.
#ifndef QUENDELD_SESSIONS_H_
#define QUENDELD_SESSIONS_H_

#include <cstdint>
#include <deque>
#include <functional>
#include <optional>

#include "context.h"
#include "service.h"

namespace quendeld {

// What came of an attempt to end a session.
enum class Ending { kEnded, kNoSession, kStillOpen };

class Sessions {
 public:
  using Done = std::function<void(Ending ending)>;

  Sessions(const Context& context, Service& service);

  // Looks whether a session was opened or has ended. Called after each change of the facts.
  void Update();

  // Ends the session for the request `id`, again and again until it has ended. `done` is called for
  // the first attempt that failed, and at the end. `repeated` tells that this was begun before, so
  // that there may be none any more.
  void Close(int id, int progress, bool repeated, Done done);

  // Seconds until the open session is closed for its length.
  Duration closes_in() const { return limit_.Left(); }

 private:
  struct Closing {
    int id;
    int progress;
    bool repeated;
    Done done;
  };

  void CloseForItsLength();
  void Attempt();
  void Ended(const WorkerEnd& end);
  void Finish(Ending ending);

  const Context context_;
  Service& service_;
  Timer limit_;
  Timer retry_;
  std::optional<int64_t> opened_;
  std::deque<Closing> closings_;
  bool is_trying_ = false;
  bool is_closing_for_length_ = false;
  int failures_ = 0;
};

// How long a session may still last: `limit` less the time since it was opened. A clock that went
// back never makes that more than the limit.
Duration TimeLeft(Duration limit, int64_t opened, int64_t now);

}  // namespace quendeld

#endif  // QUENDELD_SESSIONS_H_
