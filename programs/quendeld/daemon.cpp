#include "daemon.h"

#include <sys/inotify.h>
#include <sys/stat.h>
#include <syslog.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <csignal>
#include <ctime>
#include <map>

#include "common/control_socket.h"
#include "json.h"
#include "quendel/version.h"
#include "session.h"
#include "status.h"

namespace quendeld {
namespace {

constexpr char kSettingsFolder[] = "/usr/arvo/etc";
constexpr Duration kSettingsSettle = std::chrono::milliseconds(200);
constexpr Duration kStopLimit = std::chrono::milliseconds(4500);
constexpr Duration kWhyLimit = std::chrono::seconds(1);
constexpr Duration kLastEventLimit = std::chrono::seconds(3);
constexpr Duration kLogoutLimit = std::chrono::seconds(10);
constexpr int64_t kHistoryRuns = 50;

Json::Value Success() {
  Json::Value answer = Json::objectValue;
  answer["success"] = true;
  return answer;
}

Json::Value Failure(const std::string& reason) {
  Json::Value answer = Json::objectValue;
  answer["success"] = false;
  answer["reason"] = reason;
  return answer;
}

Json::Value Seconds(Duration duration) {
  return static_cast<Json::Int64>(
      std::chrono::duration_cast<std::chrono::seconds>(duration).count());
}

Json::Value RunToJson(const StoredRun& run) {
  Json::Value json = Json::objectValue;
  json["started"] = static_cast<Json::Int64>(run.started);
  json["ended"] = static_cast<Json::Int64>(run.ended);
  json["cause"] = run.cause;
  json["result"] = run.result;
  json["reason"] = run.reason;
  json["bytes"] = static_cast<Json::Int64>(run.bytes);
  return json;
}

std::string MakeFolders() {
  mkdir("/run/quendel", 0755);
  mkdir(kStateFolder, 0700);
  return kJournalFile;
}

}  // namespace

Daemon::Daemon(Loop& loop, const DaemonOptions& options)
    : loop_(loop),
      options_(options),
      journal_(MakeFolders()),
      workers_(loop, settings_, options.worker, options.foreground),
      context_{loop_, settings_, journal_, workers_},
      service_(context_),
      events_(context_, service_),
      reports_(context_, service_),
      heartbeat_(
          context_, service_, [this](const Json::Value& actions) { HeartbeatAccepted(actions); },
          [this] { collections_.ServerIsAway(); }),
      samples_(context_, service_),
      sessions_(context_, service_),
      collections_(context_, service_, heartbeat_),
      actions_(context_, {service_, events_, reports_, sessions_, collections_}),
      rotations_(context_, collections_),
      control_(loop, quendel::programs::kControlSocket,
               [this](const Json::Value& request, const Control::Reply& reply) {
                 HandleControl(request, reply);
               }),
      look_timer_(loop, [this] { service_.Look(); }),
      stop_timer_(loop, [this] { loop_.Quit(); }),
      terminate_(loop, SIGTERM, [this] { Stop(); }),
      interrupt_(loop, SIGINT, [this] { Stop(); }),
      reload_(loop, SIGHUP, [this] { Reload(); }),
      started_(time(nullptr)) {
  LoadSettings();
  service_.OnChange([this] { ServiceChanged(); });
  collections_.OnLogs([this](const Json::Value& logs) { rotations_.Watch(logs); });
}

void Daemon::LoadSettings() {
  std::vector<std::string> complaints;
  settings_ = ReadSettings(options_.settings, complaints);
  for (const std::string& complaint : complaints) {
    syslog(LOG_ERR, "%s: %s", options_.settings.c_str(), complaint.c_str());
  }
}

void Daemon::Start() {
  EndMarkedProcesses();
  settings_watch_ = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  inotify_add_watch(settings_watch_, kSettingsFolder,
                    IN_CLOSE_WRITE | IN_MOVED_TO | IN_DELETE | IN_CREATE | IN_ONLYDIR);
  settings_readable_ =
      std::make_unique<Readable>(loop_, settings_watch_, [this] { SettingsChanged(); });
  actions_.Start();
  service_.Look();
  heartbeat_.Start();
  samples_.Start();
  collections_.Start();
  sd_notify(0, "READY=1");
  sd_event_set_watchdog(loop_.get(), 1);
  syslog(LOG_NOTICE, "quendeld " QUENDEL_VERSION " runs");
}

void Daemon::Reload() {
  sd_notify(0, "RELOADING=1");
  LoadSettings();
  syslog(LOG_NOTICE, "the settings were read again");
  service_.Look();
  heartbeat_.Start();
  samples_.Start();
  sd_notify(0, "READY=1");
}

// Several files may change together, and each in several steps.
void Daemon::SettingsChanged() {
  char events[4096];
  while (read(settings_watch_, events, sizeof events) > 0) {
  }
  look_timer_.Start(kSettingsSettle);
}

void Daemon::ServiceChanged() {
  if (may_talk_ && !service_.MayTalk()) {
    workers_.Interrupt(Lane::kTalk, "the service was switched off");
    workers_.Interrupt(Lane::kWork, "the service was switched off");
  }
  may_talk_ = service_.MayTalk();
  sessions_.Update();
  events_.Flush();
  actions_.Next();
  if (!is_status_due_) {
    is_status_due_ = true;
    loop_.Soon([this] { WriteStatus(); });
  }
}

void Daemon::HeartbeatAccepted(const Json::Value& actions) {
  events_.Flush();
  actions_.Take(actions);
  collections_.ServerIsThere();
}

void Daemon::HandleControl(const Json::Value& request, const Control::Reply& reply) {
  const std::string command = TextOf(request, "command");
  if (command == "status") {
    collections_.Look([this, reply] { reply(Status()); });
  } else if (command == "heartbeat") {
    heartbeat_.Now([reply](bool accepted) {
      reply(accepted ? Success() : Failure("the server did not accept the heartbeat"));
    });
  } else if (command == "collect") {
    collections_.Request("command", [reply](bool collected, const std::string& reason) {
      reply(collected ? Success() : Failure(reason));
    });
  } else if (command == "pause" || command == "resume") {
    service_.Pause(command == "pause");
    reply(Success());
  } else if (command == "history") {
    reply(History());
  } else if (command == "logout") {
    SendLogout(reply);
  } else if (command == "remote_close") {
    CloseSession(request, reply);
  } else {
    reply(Failure("there is no such command"));
  }
}

// The account is about to go, and without it nothing can be sent: so this is not queued.
void Daemon::SendLogout(const Control::Reply& reply) {
  if (!service_.MayTalk()) {
    reply(Failure("the service is disabled or paused"));
    return;
  }
  events_.SendOnce(kEventLogout, kLogoutLimit, [reply](bool sent) {
    if (!sent) {
      syslog(LOG_ERR, "the server could not be told of the logout");
    }
    reply(sent ? Success() : Failure("the server did not accept the event"));
  });
}

void Daemon::CloseSession(const Json::Value& request, const Control::Reply& reply) {
  const std::optional<int64_t> id = NumberOf(request, "id");
  const std::optional<int64_t> progress = NumberOf(request, "progress");
  if (!id || !progress || (*progress != 0 && *progress != -1)) {
    reply(Failure("an id and a progress of 0 or -1 are needed"));
    return;
  }
  sessions_.Close(static_cast<int>(*id), static_cast<int>(*progress), false,
                  [reply](Ending ending) {
                    // After the first attempt that fails nobody listens any more.
                    reply(ending == Ending::kEnded ? Success()
                          : ending == Ending::kNoSession
                              ? Failure("no support session is open")
                              : Failure("it is not closed yet; quendeld goes on trying"));
                  });
}

Json::Value Daemon::Status() {
  Json::Value status = Success();
  status["version"] = QUENDEL_VERSION;
  status["pid"] = getpid();
  status["started"] = static_cast<Json::Int64>(started_);
  status["enabled"] = service_.enabled() ? Json::Value(*service_.enabled()) : Json::Value();
  status["paused"] = service_.paused();
  status["host"] = service_.host();
  Json::Value& heartbeat = status["heartbeat"];
  heartbeat["last"] = heartbeat_.last_accepted() > 0
                          ? Json::Value(static_cast<Json::Int64>(heartbeat_.last_accepted()))
                          : Json::Value();
  heartbeat["failures"] = heartbeat_.failures();
  heartbeat["next_in"] = Seconds(heartbeat_.next_in());
  Json::Value& collection = status["collection"];
  const std::vector<StoredRun> runs = journal_.Runs(1);
  collection["last"] = runs.empty() ? Json::Value() : RunToJson(runs.front());
  collection["running"] = collections_.is_running();
  collection["failing"] = collections_.has_failed();
  collection["next_in"] = Seconds(collections_.next_in());
  status["logs"] = collections_.logs();
  status["outbox"] = collections_.outbox();
  status["events"] = static_cast<Json::Int64>(journal_.WaitingEvents());
  status["reports"] = static_cast<Json::Int64>(journal_.WaitingReports());
  status["actions"] = static_cast<Json::Int64>(journal_.WaitingRequests());
  status["session"] = service_.session()
                          ? Json::Value(static_cast<Json::Int64>(*service_.session()))
                          : Json::Value();
  status["session_closes_in"] = Seconds(sessions_.closes_in());
  Judge(status);
  return status;
}

Json::Value Daemon::History() {
  Json::Value answer = Success();
  answer["runs"] = Json::arrayValue;
  for (const StoredRun& run : journal_.Runs(kHistoryRuns)) {
    answer["runs"].append(RunToJson(run));
  }
  return answer;
}

void Daemon::WriteStatus() {
  is_status_due_ = false;
  WriteStatusFile(Status());
}

// What is under way is ended, and reported after the next start. The limit holds whatever happens.
void Daemon::Stop() {
  if (is_stopping_) {
    return;
  }
  is_stopping_ = true;
  sd_notify(0, "STOPPING=1");
  stop_timer_.Start(kStopLimit);
  settings_.kill_after = std::min<Duration>(settings_.kill_after, std::chrono::milliseconds(300));
  workers_.EndAll([this] { TellWhyStopping(); });
}

void Daemon::TellWhyStopping() {
  if (!service_.MayTalk()) {
    loop_.Quit();
    return;
  }
  workers_.Submit(Lane::kLocal,
                  {"stopping", Json::objectValue, kWhyLimit, [this](const WorkerEnd& end) {
                     const std::string why = TextOf(end.answer, "why");
                     if (why.empty()) {
                       loop_.Quit();
                       return;
                     }
                     const int event = why == "reboot" ? kEventReboot : kEventPoweroff;
                     journal_.QueueEvent(event, Json::nullValue, settings_.events_kept,
                                         "last_event", std::to_string(event));
                     events_.SendLast(event, kLastEventLimit, [this] { loop_.Quit(); });
                   }});
}

}  // namespace quendeld
