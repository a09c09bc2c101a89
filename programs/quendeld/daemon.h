// The daemon: its parts, and what connects them.
#ifndef QUENDELD_DAEMON_H_
#define QUENDELD_DAEMON_H_

#include <json/value.h>

#include <memory>
#include <string>

#include "actions.h"
#include "collections.h"
#include "context.h"
#include "control.h"
#include "events.h"
#include "heartbeat.h"
#include "reports.h"
#include "rotation_watch.h"
#include "samples.h"
#include "service.h"
#include "sessions.h"

namespace quendeld {

struct DaemonOptions {
  std::string worker;  // path of quendel-worker
  std::string settings;
  bool foreground = false;
};

class Daemon {
 public:
  // Throws std::exception when the journal or the control socket cannot be had.
  Daemon(Loop& loop, const DaemonOptions& options);

  // Begins everything. The daemon then lives in the loop, which a SIGTERM ends.
  void Start();

 private:
  void LoadSettings();
  void Reload();
  void SettingsChanged();
  void ServiceChanged();
  void HeartbeatAccepted(const Json::Value& actions);

  void HandleControl(const Json::Value& request, const Control::Reply& reply);
  void SendLogout(const Control::Reply& reply);
  void CloseSession(const Json::Value& request, const Control::Reply& reply);
  Json::Value Status();
  Json::Value History();
  void WriteStatus();

  void Stop();
  void TellWhyStopping();

  Loop& loop_;
  const DaemonOptions options_;
  Settings settings_;
  Journal journal_;
  WorkerPool workers_;
  const Context context_;
  Service service_;
  Events events_;
  Reports reports_;
  Heartbeat heartbeat_;
  Samples samples_;
  Sessions sessions_;
  Collections collections_;
  Actions actions_;
  RotationWatch rotations_;
  Control control_;
  Timer look_timer_;
  Timer stop_timer_;
  SignalSource terminate_;
  SignalSource interrupt_;
  SignalSource reload_;
  int settings_watch_ = -1;
  std::unique_ptr<Readable> settings_readable_;
  bool may_talk_ = false;
  bool is_status_due_ = false;
  bool is_stopping_ = false;
  const int64_t started_;
};

}  // namespace quendeld

#endif  // QUENDELD_DAEMON_H_
