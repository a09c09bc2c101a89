#include "collections.h"

#include <syslog.h>

#include <algorithm>
#include <cstdlib>
#include <ctime>
#include <utility>

#include "backoff.h"
#include "json.h"

namespace quendeld {
namespace {

constexpr char kLastFact[] = "last_run";
constexpr char kCuredFact[] = "cured";
constexpr char kUnsentFact[] = "unsent_run";
constexpr size_t kMostSeriesBytes = 900'000;  // of the pipe that the request goes through

int64_t NumberFrom(const std::string& text) {
  return text.empty() ? 0 : strtoll(text.c_str(), nullptr, 10);
}

bool IsAnyAtRisk(const Json::Value& logs) {
  return std::any_of(logs.begin(), logs.end(),
                     [](const Json::Value& log) { return BoolOf(log, "at_risk"); });
}

std::string ReasonOf(const WorkerEnd& end) {
  if (BoolOf(end.answer, "disabled")) {
    return "the service is disabled";
  }
  const std::string told = TextOf(end.answer, "reason");
  return !end.reason.empty() ? end.reason : !told.empty() ? told : "the run failed";
}

}  // namespace

RunKind DecideRun(bool isServerThere, bool isAnyAtRisk) {
  if (isServerThere) {
    return RunKind::kSend;
  }
  return isAnyAtRisk ? RunKind::kKeep : RunKind::kWait;
}

Duration DueIn(Duration interval, int64_t last, int64_t now) {
  if (last <= 0) {
    return Duration::zero();
  }
  const Duration passed = std::chrono::seconds(std::max<int64_t>(0, now - last));
  return std::max(Duration::zero(), interval - std::min(passed, interval));
}

Collections::Collections(const Context& context, const Service& service, const Heartbeat& heartbeat)
    : context_(context),
      service_(service),
      heartbeat_(heartbeat),
      timer_(context.loop, [this] { Want("schedule"); }) {
}

void Collections::Start() {
  Tidy();
  Look(nullptr);
  Schedule();
}

void Collections::Schedule() {
  const Settings& settings = context_.settings;
  Duration due = DueIn(settings.collection_interval, NumberFrom(context_.journal.Fact(kLastFact)),
                       time(nullptr));
  if (failures_ > 0) {
    due = NextAttempt(settings.collection_retry, settings.heartbeat_jitter,
                      settings.collection_interval, failures_ - 1, Chance());
  }
  timer_.Start(due);
}

void Collections::Request(const std::string& cause, Done done) {
  if (!service_.MayTalk()) {
    done(false, service_.paused() ? "the service is paused" : "the service is disabled");
    return;
  }
  requested_.push_back({cause, std::move(done)});
  StartNext();
}

void Collections::Want(const std::string& cause) {
  wanted_ = cause;
  StartNext();
}

void Collections::ServerIsThere() {
  SendOutbox();
  StartNext();
}

void Collections::StartNext() {
  if (is_running_ || !service_.MayTalk()) {
    return;
  }
  if (!requested_.empty()) {
    Run(true);
  } else if (!wanted_.empty()) {
    Decide();
  }
}

void Collections::Decide() {
  if (heartbeat_.IsServerThere()) {
    Run(true);
  } else if (!is_deciding_ && heartbeat_.failures() > 0) {
    is_deciding_ = true;
    Look([this] {
      is_deciding_ = false;
      const RunKind kind = DecideRun(heartbeat_.IsServerThere(), IsAnyAtRisk(logs_));
      if (!is_running_ && !wanted_.empty() && service_.MayTalk() && kind != RunKind::kWait) {
        Run(kind == RunKind::kSend);
      }
    });
  }
}

Json::Value Collections::RequestFor(bool send) {
  Json::Value request = Json::objectValue;
  request["send"] = send;
  request["free_space_mb"] = static_cast<Json::Int64>(context_.settings.free_space_mb);
  request["outbox_limit_mb"] = static_cast<Json::Int64>(context_.settings.outbox_limit_mb);
  request["cured"] =
      JsonFromText(context_.journal.Fact(kCuredFact)).value_or(Json::Value(Json::arrayValue));
  return request;
}

void Collections::Run(bool send) {
  is_running_ = true;
  timer_.Stop();
  serving_ = std::exchange(requested_, {});
  if (!wanted_.empty()) {
    serving_.push_back({std::exchange(wanted_, ""), nullptr});
  }
  Json::Value request = RequestFor(send);
  int64_t lastSample = 0;
  request["series"] = context_.journal.Series(kMostSeriesBytes, lastSample);
  context_.journal.SetFact(kUnsentFact, send ? "" : "yes");
  const int64_t started = time(nullptr);
  context_.workers.Submit(Lane::kWork, {"collect", request, context_.settings.collection_limit,
                                        [this, send, started, lastSample](const WorkerEnd& end) {
                                          Ended(send, started, lastSample, end);
                                        }});
}

void Collections::Ended(bool send, int64_t started, int64_t lastSample, const WorkerEnd& end) {
  is_running_ = false;
  const bool succeeded = end.Succeeded();
  const std::string reason = succeeded ? "" : ReasonOf(end);
  StoredRun run;
  run.started = started;
  run.ended = time(nullptr);
  run.cause = serving_.empty() ? "" : serving_.front().cause;
  run.result = !succeeded ? "failed" : send ? "sent" : "kept";
  run.reason = reason;
  run.bytes = NumberOf(end.answer, "bytes").value_or(0);
  context_.journal.AddRun(run);
  if (succeeded) {
    failures_ = 0;
    context_.journal.SetFact(kLastFact, std::to_string(started));
    context_.journal.DropSamples(lastSample);
  } else {
    ++failures_;
    syslog(LOG_ERR, "the collection (%s) failed: %s", run.cause.c_str(), reason.c_str());
  }
  if (end.answered) {
    NoteStuck(Member(end.answer, "stuck"));
    context_.journal.SetFact(kUnsentFact, "");
  } else {
    Tidy();
  }
  Look(nullptr);
  for (const Wish& wish : std::exchange(serving_, {})) {
    if (wish.done) {
      wish.done(succeeded, reason);
    }
  }
  Schedule();
  StartNext();
}

// A log is reset once while it is stuck. One that no longer is can be cured again.
void Collections::NoteStuck(const Json::Value& stuck) {
  if (stuck.isArray()) {
    context_.journal.SetFact(kCuredFact, JsonLine(stuck));
  }
}

void Collections::Tidy() {
  Json::Value request = Json::objectValue;
  request["unsent"] = context_.journal.Fact(kUnsentFact) == "yes";
  context_.workers.Submit(
      Lane::kWork, {"tidy", request, context_.settings.local_limit, [this](const WorkerEnd& end) {
                      if (end.Succeeded()) {
                        context_.journal.SetFact(kUnsentFact, "");
                        outbox_ = Member(end.answer, "outbox");
                      }
                    }});
}

void Collections::Look(std::function<void()> done) {
  context_.workers.Submit(Lane::kLocal, {"look", Json::objectValue, context_.settings.local_limit,
                                         [this, done = std::move(done)](const WorkerEnd& end) {
                                           if (end.Succeeded()) {
                                             logs_ = Member(end.answer, "logs");
                                             outbox_ = Member(end.answer, "outbox");
                                             if (logs_changed_) {
                                               logs_changed_(logs_);
                                             }
                                           }
                                           if (done) {
                                             done();
                                           }
                                         }});
}

void Collections::SendOutbox() {
  if (is_sending_outbox_ || NumberOf(outbox_, "archives").value_or(0) == 0) {
    return;
  }
  is_sending_outbox_ = true;
  context_.workers.Submit(Lane::kWork,
                          {"send_outbox", Json::objectValue, context_.settings.upload_limit,
                           [this](const WorkerEnd& end) {
                             is_sending_outbox_ = false;
                             if (end.answered && Member(end.answer, "outbox").isObject()) {
                               outbox_ = Member(end.answer, "outbox");
                             }
                             if (end.Succeeded()) {
                               SendOutbox();
                             }
                           }});
}

}  // namespace quendeld
