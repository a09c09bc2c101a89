// The reports on the server's requests that the library leaves to its caller, each until the server
// accepted it.
#ifndef QUENDELD_REPORTS_H_
#define QUENDELD_REPORTS_H_

#include "context.h"
#include "service.h"

namespace quendeld {

class Reports {
 public:
  Reports(const Context& context, const Service& service) : context_(context), service_(service) {}

  // Sends what is due, as long as the server takes it. What it does not take waits for the next
  // call, which follows each heartbeat.
  void Flush();

 private:
  void Sent(const std::vector<StoredReport>& reports, const WorkerEnd& end);

  const Context context_;
  const Service& service_;
  bool is_sending_ = false;
};

}  // namespace quendeld

#endif  // QUENDELD_REPORTS_H_
