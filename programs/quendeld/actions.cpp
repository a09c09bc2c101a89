#include "actions.h"

#include <syslog.h>

#include "action.h"
#include "json.h"

namespace quendeld {
namespace {

constexpr int kRun = 1;
constexpr int kDone = 0;
constexpr int kFailed = -1;

}  // namespace

void Actions::Start() {
  const int64_t broken = context_.journal.EndBrokenRequests("remote_close");
  if (broken > 0) {
    syslog(LOG_WARNING, "%lld actions were broken off by the last end; they are reported failed",
           static_cast<long long>(broken));
  }
}

void Actions::Take(const Json::Value& actions) {
  const Settings& settings = context_.settings;
  const ReadActions read =
      ActionsFromJson(actions, settings.actions_per_heartbeat, settings.allow_power_actions);
  for (const std::string& fault : read.faults) {
    syslog(LOG_WARNING, "the server sent %s", fault.c_str());
  }
  if (!read.requests.empty()) {
    const std::vector<Journal::Taking> taken =
        context_.journal.TakeRequests(read.requests, settings.request_ids_kept);
    for (size_t request = 0; request < taken.size(); ++request) {
      LogTaking(read.requests[request], taken[request]);
    }
  }
  parts_.reports.Flush();
  Next();
}

void Actions::LogTaking(const NewRequest& request, Journal::Taking taking) {
  if (taking == Journal::Taking::kNoRoom) {
    syslog(LOG_ERR, "request %d is refused: too many younger than 90 days are remembered",
           request.id);
  } else if (taking == Journal::Taking::kTaken && !request.fault.empty()) {
    syslog(LOG_WARNING, "request %d is answered as failed: %s", request.id, request.fault.c_str());
  } else if (taking == Journal::Taking::kTaken) {
    syslog(LOG_INFO, "request %d: %s", request.id, request.action.c_str());
  }
}

void Actions::Next() {
  while (!is_under_way_ && parts_.service.MayTalk()) {
    const std::optional<StoredRequest> request = context_.journal.NextRequest();
    if (!request) {
      return;
    }
    is_under_way_ = true;
    context_.journal.BeginRequest(request->sequence);
    CarryOut(*request);
  }
}

void Actions::CarryOut(const StoredRequest& request) {
  if (request.action == "remote_close") {
    CloseRemote(request);
  } else if (request.progress != kRun) {
    End(request, std::nullopt);  // closed already, says the server
  } else if (request.action == "upload_file") {
    Upload(request);
  } else if (request.action == "start_collect") {
    Collect(request);
  } else if (request.action == "update_info") {
    parts_.events.Queue(kEventUpdateInfo);
    End(request, kDone);
  } else {
    SwitchPower(request);
  }
}

// The library tells the server what it sends, and that there is nothing to send; a failure is left
// to its caller.
void Actions::Upload(const StoredRequest& request) {
  Json::Value work = Json::objectValue;
  work["id"] = request.id;
  work["files"] = request.files;
  context_.workers.Submit(
      Lane::kWork,
      {"upload", work, context_.settings.upload_limit, [this, request](const WorkerEnd& end) {
         if (!end.Succeeded()) {
           syslog(LOG_ERR, "request %d: the upload failed%s%s", request.id,
                  end.reason.empty() ? "" : ": ", end.reason.c_str());
         }
         parts_.collections.Tidy();
         End(request, end.Succeeded() ? std::nullopt : std::optional(kFailed));
       }});
}

void Actions::Collect(const StoredRequest& request) {
  parts_.collections.Request("request " + std::to_string(request.id),
                             [this, request](bool collected, const std::string& /*reason*/) {
                               End(request, collected ? kDone : kFailed);
                             });
}

// Repeated until the session is closed, while the requests behind it go on.
void Actions::CloseRemote(const StoredRequest& request) {
  is_under_way_ = false;
  const int progress = request.progress == kFailed ? kFailed : kDone;
  parts_.sessions.Close(request.id, progress, request.is_repeated, [this, request](Ending ending) {
    if (ending != Ending::kStillOpen) {
      context_.journal.EndRequest(
          request.sequence, ending == Ending::kNoSession ? std::optional(kFailed) : std::nullopt);
      parts_.reports.Flush();
    }
  });
}

// The report goes out first, as far as it can: what comes then ends the daemon.
void Actions::SwitchPower(const StoredRequest& request) {
  syslog(LOG_NOTICE, "request %d: the server asks for a %s", request.id, request.action.c_str());
  End(request, kDone);
  Json::Value work = Json::objectValue;
  work["kind"] = request.action;
  context_.workers.Submit(Lane::kTalk,
                          {"power", work, context_.settings.local_limit, [](const WorkerEnd& end) {
                             if (!end.Succeeded()) {
                               syslog(LOG_ERR, "the system refuses: %s", end.reason.c_str());
                             }
                           }});
}

void Actions::End(const StoredRequest& request, std::optional<int> report) {
  context_.journal.EndRequest(request.sequence, report);
  is_under_way_ = false;
  parts_.reports.Flush();
  context_.loop.Soon([this] { Next(); });
}

}  // namespace quendeld
