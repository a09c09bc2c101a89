// What the daemon must not forget, in one SQLite file: every change is on the disk when the call
// that makes it returns. The calls throw DatabaseError when the disk does not take it.
#ifndef QUENDELD_JOURNAL_H_
#define QUENDELD_JOURNAL_H_

#include <json/value.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "database.h"

namespace quendeld {

inline constexpr char kStateFolder[] = "/var/lib/quendel";
inline constexpr char kJournalFile[] = "/var/lib/quendel/quendeld.db";

// A request of the server's, once it was taken.
struct StoredRequest {
  int64_t sequence = 0;
  int id = 0;
  std::string action;
  int progress = 1;
  Json::Value files;
  bool is_repeated = false;  // it was begun before
};

struct NewRequest {
  int id = 0;
  std::string action;
  int progress = 1;
  Json::Value files;
  std::optional<int> report;
  std::string fault;  // why it is only reported; not kept
};

struct StoredEvent {
  int64_t sequence = 0;
  int event = 0;
  Json::Value info;
  int64_t refusals = 0;
};

struct StoredReport {
  int id = 0;
  int progress = 0;
};

struct StoredRun {
  int64_t started = 0;  // seconds since the epoch
  int64_t ended = 0;
  std::string cause;
  std::string result;  // "sent", "kept" or "failed"
  std::string reason;  // of a failure
  int64_t bytes = 0;
};

class Journal {
 public:
  // Opens the journal, or makes a new one. One that is damaged is put aside, over an older one that
  // was, and logged.
  explicit Journal(const std::string& path);

  // ---- Single facts that outlive a restart. An unknown one reads as an empty text.
  std::string Fact(const std::string& key) const;
  void SetFact(const std::string& key, const std::string& value);

  // ---- Requests. A number that was seen once is never taken again.
  enum class Taking { kTaken, kKnown, kNoRoom };
  // Takes requests, all at once. One with a report is not to be carried out, only to be answered.
  // There is room for `most`; those that make room are at least 90 days old.
  std::vector<Taking> TakeRequests(const std::vector<NewRequest>& requests, int64_t most);
  std::optional<StoredRequest> NextRequest() const;
  void BeginRequest(int64_t sequence);
  void EndRequest(int64_t sequence, std::optional<int> report);
  // At a start: what was begun and not ended is over, and to be reported failed. One that may be
  // repeated waits again instead. Returns how many were over.
  int64_t EndBrokenRequests(const std::string& repeatable);
  int64_t WaitingRequests() const;
  int64_t KnownRequests() const;

  // ---- Reports on requests that the server has not accepted yet, the least tried ones first.
  std::vector<StoredReport> DueReports(int64_t most) const;
  void ReportAccepted(int id);
  void ReportRefused(int id, int64_t most_attempts);
  int64_t WaitingReports() const;

  // ---- Events that the server has not accepted yet, in their order.
  // Sets a fact together with it, both or neither. Returns false when the oldest one had to go to
  // make room.
  bool QueueEvent(int event, const Json::Value& info, int64_t most, const std::string& key,
                  const std::string& value);
  // `only` leaves all others out. Those that were refused come last.
  std::optional<StoredEvent> NextEvent(std::optional<int> only) const;
  void EventAccepted(int64_t sequence);
  int64_t EventRefused(int64_t sequence);  // returns how often it was
  int64_t WaitingEvents() const;
  bool IsLastWaitingEvent(int event) const;

  // ---- Performance samples, oldest first.
  void AddSample(const Json::Value& sample, int64_t most);
  // Returns the series that a run takes, as long as its text stays within `most_bytes`; `last` is
  // what to pass to DropSamples() once the run has them.
  Json::Value Series(size_t most_bytes, int64_t& last) const;
  void DropSamples(int64_t last);

  // ---- Runs, the newest first.
  void AddRun(const StoredRun& run);
  std::vector<StoredRun> Runs(int64_t most) const;

 private:
  Taking TakeRequest(const NewRequest& request, int64_t most, int64_t now);

  Database database_;
};

}  // namespace quendeld

#endif  // QUENDELD_JOURNAL_H_
