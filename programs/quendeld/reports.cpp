#include "reports.h"

#include <syslog.h>

#include <algorithm>

#include "json.h"

namespace quendeld {
namespace {

constexpr int64_t kReportsAtOnce = 20;
constexpr int64_t kMostAttempts = 200;

Json::Value RequestFor(const std::vector<StoredReport>& reports) {
  Json::Value request = Json::objectValue;
  request["reports"] = Json::arrayValue;
  for (const StoredReport& report : reports) {
    Json::Value entry = Json::objectValue;
    entry["id"] = report.id;
    entry["progress"] = report.progress;
    request["reports"].append(entry);
  }
  return request;
}

}  // namespace

void Reports::Flush() {
  if (is_sending_ || !service_.MayTalk()) {
    return;
  }
  const std::vector<StoredReport> due = context_.journal.DueReports(kReportsAtOnce);
  if (due.empty()) {
    return;
  }
  is_sending_ = true;
  context_.workers.Submit(Lane::kTalk,
                          {"report", RequestFor(due), context_.settings.conversation_limit,
                           [this, due](const WorkerEnd& end) { Sent(due, end); }});
}

// The worker stops at the first report that the server does not accept.
void Reports::Sent(const std::vector<StoredReport>& reports, const WorkerEnd& end) {
  is_sending_ = false;
  const Json::Value& accepted = Member(end.answer, "accepted");
  const size_t count = accepted.isArray() ? std::min<size_t>(accepted.size(), reports.size()) : 0;
  for (size_t report = 0; report < count; ++report) {
    context_.journal.ReportAccepted(reports[report].id);
  }
  if (count < reports.size()) {
    if (!BoolOf(end.answer, "disabled")) {
      context_.journal.ReportRefused(reports[count].id, kMostAttempts);
    }
    return;
  }
  Flush();
}

}  // namespace quendeld
