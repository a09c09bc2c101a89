// The server's requests: each is carried out once, in order, and its id is in the journal before
// that begins.
#ifndef QUENDELD_ACTIONS_H_
#define QUENDELD_ACTIONS_H_

#include <json/value.h>

#include <functional>
#include <optional>

#include "collections.h"
#include "context.h"
#include "events.h"
#include "reports.h"
#include "service.h"
#include "sessions.h"

namespace quendeld {

class Actions {
 public:
  struct Parts {
    Service& service;
    Events& events;
    Reports& reports;
    Sessions& sessions;
    Collections& collections;
  };

  Actions(const Context& context, const Parts& parts) : context_(context), parts_(parts) {}

  // Ends what an earlier life of the daemon left half done, and goes on with what it left undone.
  void Start();

  // Takes the actions of a heartbeat's reply.
  void Take(const Json::Value& actions);

  // Begins the next request unless one is under way.
  void Next();

 private:
  void LogTaking(const NewRequest& request, Journal::Taking taking);
  void CarryOut(const StoredRequest& request);
  void Upload(const StoredRequest& request);
  void Collect(const StoredRequest& request);
  void CloseRemote(const StoredRequest& request);
  void SwitchPower(const StoredRequest& request);
  void End(const StoredRequest& request, std::optional<int> report);

  const Context context_;
  const Parts parts_;
  bool is_under_way_ = false;
};

}  // namespace quendeld

#endif  // QUENDELD_ACTIONS_H_
