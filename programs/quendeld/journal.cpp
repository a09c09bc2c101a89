#include "journal.h"

#include <syslog.h>

#include <algorithm>
#include <ctime>
#include <filesystem>

#include "json.h"

namespace quendeld {
namespace {

constexpr int64_t kKeptSeconds = 90L * 24 * 3600;
constexpr int64_t kRunsKept = 200;

constexpr char kTables[] = R"(
  CREATE TABLE IF NOT EXISTS facts (key TEXT PRIMARY KEY, value TEXT NOT NULL);
  CREATE TABLE IF NOT EXISTS requests (
    sequence INTEGER PRIMARY KEY AUTOINCREMENT, id INTEGER NOT NULL UNIQUE, action TEXT NOT NULL,
    progress INTEGER NOT NULL, files TEXT NOT NULL, state TEXT NOT NULL, taken INTEGER NOT NULL,
    repeated INTEGER NOT NULL DEFAULT 0, report INTEGER, attempts INTEGER NOT NULL DEFAULT 0);
  CREATE INDEX IF NOT EXISTS requests_waiting ON requests (sequence) WHERE state != 'ended';
  CREATE INDEX IF NOT EXISTS requests_due ON requests (attempts, sequence) WHERE report IS NOT NULL;
  CREATE TABLE IF NOT EXISTS events (
    sequence INTEGER PRIMARY KEY AUTOINCREMENT, event INTEGER NOT NULL, info TEXT NOT NULL,
    refusals INTEGER NOT NULL DEFAULT 0);
  CREATE TABLE IF NOT EXISTS samples (
    sequence INTEGER PRIMARY KEY AUTOINCREMENT, sample TEXT NOT NULL);
  CREATE TABLE IF NOT EXISTS runs (
    sequence INTEGER PRIMARY KEY AUTOINCREMENT, started INTEGER NOT NULL, ended INTEGER NOT NULL,
    cause TEXT NOT NULL, result TEXT NOT NULL, reason TEXT NOT NULL, bytes INTEGER NOT NULL);
)";

void PutAside(const std::string& path) {
  std::error_code ignored;
  std::filesystem::rename(path, path + ".damaged", ignored);
  std::filesystem::remove(path + "-wal", ignored);
  std::filesystem::remove(path + "-shm", ignored);
}

// The whole file is read once: it is small, and a page that cannot be read is better found now.
Database OpenChecked(const std::string& path) {
  Database database(path);
  Statement check(database, "PRAGMA quick_check(1)");
  if (check.Next() && check.Text(0) != "ok") {
    throw DatabaseError("the journal: " + check.Text(0), SQLITE_CORRUPT);
  }
  database.Execute(kTables);
  return database;
}

Database OpenOrRecreate(const std::string& path) {
  try {
    return OpenChecked(path);
  } catch (const DatabaseError& error) {
    if (!error.is_damage()) {
      throw;
    }
    syslog(LOG_ERR, "%s; %s is put aside as %s.damaged, and what it knew is forgotten",
           error.what(), path.c_str(), path.c_str());
    PutAside(path);
  }
  return OpenChecked(path);
}

int64_t Count(const Database& database, const char* sql) {
  Statement count(database, sql);
  return count.Next() ? count.Number(0) : 0;
}

StoredRequest RequestFrom(const Statement& row) {
  StoredRequest request;
  request.sequence = row.Number(0);
  request.id = static_cast<int>(row.Number(1));
  request.action = row.Text(2);
  request.progress = static_cast<int>(row.Number(3));
  request.files = JsonFromText(row.Text(4)).value_or(Json::Value());
  request.is_repeated = row.Number(5) != 0;
  return request;
}

}  // namespace

Journal::Journal(const std::string& path) : database_(OpenOrRecreate(path)) {
}

std::string Journal::Fact(const std::string& key) const {
  Statement fact(database_, "SELECT value FROM facts WHERE key = ?", key);
  return fact.Next() ? fact.Text(0) : "";
}

void Journal::SetFact(const std::string& key, const std::string& value) {
  if (Fact(key) != value) {  // most of what is set is what it was, and a write wakes the disk
    Statement(database_, "INSERT OR REPLACE INTO facts VALUES (?, ?)", key, value).Run();
  }
}

std::vector<Journal::Taking> Journal::TakeRequests(const std::vector<NewRequest>& requests,
                                                   int64_t most) {
  std::vector<Taking> results;
  results.reserve(requests.size());
  const int64_t now = time(nullptr);
  Transaction transaction(database_);
  for (const NewRequest& request : requests) {
    results.push_back(TakeRequest(request, most, now));
  }
  transaction.Commit();
  return results;
}

Journal::Taking Journal::TakeRequest(const NewRequest& request, int64_t most, int64_t now) {
  if (Statement(database_, "SELECT 1 FROM requests WHERE id = ?", int64_t{request.id}).Next()) {
    return Taking::kKnown;
  }
  if (KnownRequests() >= most) {
    Statement(
        database_,
        "DELETE FROM requests WHERE sequence IN (SELECT sequence FROM requests WHERE taken < ? "
        "AND state = 'ended' AND report IS NULL ORDER BY sequence LIMIT ?)",
        now - kKeptSeconds, KnownRequests() - most + 1)
        .Run();
  }
  if (KnownRequests() >= most) {
    return Taking::kNoRoom;
  }
  Statement(database_,
            "INSERT INTO requests (id, action, progress, files, state, taken) "
            "VALUES (?, ?, ?, ?, ?, ?)",
            int64_t{request.id}, request.action, int64_t{request.progress}, JsonLine(request.files),
            request.report ? "ended" : "waiting", now)
      .Run();
  if (request.report) {
    Statement(database_, "UPDATE requests SET report = ? WHERE id = ?", int64_t{*request.report},
              int64_t{request.id})
        .Run();
  }
  return Taking::kTaken;
}

std::optional<StoredRequest> Journal::NextRequest() const {
  Statement next(database_,
                 "SELECT sequence, id, action, progress, files, repeated FROM requests "
                 "WHERE state = 'waiting' ORDER BY sequence LIMIT 1");
  return next.Next() ? std::optional<StoredRequest>(RequestFrom(next)) : std::nullopt;
}

void Journal::BeginRequest(int64_t sequence) {
  Statement(database_, "UPDATE requests SET state = 'begun' WHERE sequence = ?", sequence).Run();
}

void Journal::EndRequest(int64_t sequence, std::optional<int> report) {
  Transaction transaction(database_);
  Statement(database_, "UPDATE requests SET state = 'ended', files = 'null' WHERE sequence = ?",
            sequence)
      .Run();
  if (report) {
    Statement(database_, "UPDATE requests SET report = ? WHERE sequence = ?", int64_t{*report},
              sequence)
        .Run();
  }
  transaction.Commit();
}

int64_t Journal::EndBrokenRequests(const std::string& repeatable) {
  Transaction transaction(database_);
  Statement(
      database_,
      "UPDATE requests SET state = 'waiting', repeated = 1 WHERE state = 'begun' AND action = ?",
      repeatable)
      .Run();
  Statement(
      database_,
      "UPDATE requests SET state = 'ended', files = 'null', report = -1 WHERE state = 'begun'")
      .Run();
  const int64_t ended = sqlite3_changes(database_.get());
  transaction.Commit();
  return ended;
}

int64_t Journal::WaitingRequests() const {
  return Count(database_, "SELECT count(*) FROM requests WHERE state != 'ended'");
}

int64_t Journal::KnownRequests() const {
  return Count(database_, "SELECT count(*) FROM requests");
}

std::vector<StoredReport> Journal::DueReports(int64_t most) const {
  std::vector<StoredReport> reports;
  Statement due(database_,
                "SELECT id, report FROM requests WHERE report IS NOT NULL "
                "ORDER BY attempts, sequence LIMIT ?",
                most);
  while (due.Next()) {
    reports.push_back({static_cast<int>(due.Number(0)), static_cast<int>(due.Number(1))});
  }
  return reports;
}

void Journal::ReportAccepted(int id) {
  Statement(database_, "UPDATE requests SET report = NULL WHERE id = ?", int64_t{id}).Run();
}

void Journal::ReportRefused(int id, int64_t most_attempts) {
  Statement(database_, "UPDATE requests SET attempts = attempts + 1 WHERE id = ?", int64_t{id})
      .Run();
  Statement(database_, "UPDATE requests SET report = NULL WHERE id = ? AND attempts >= ?",
            int64_t{id}, most_attempts)
      .Run();
}

int64_t Journal::WaitingReports() const {
  return Count(database_, "SELECT count(*) FROM requests WHERE report IS NOT NULL");
}

bool Journal::QueueEvent(int event, const Json::Value& info, int64_t most, const std::string& key,
                         const std::string& value) {
  Transaction transaction(database_);
  const bool isFull = WaitingEvents() >= most;
  if (isFull) {
    Statement(database_, "DELETE FROM events WHERE sequence = (SELECT min(sequence) FROM events)")
        .Run();
  }
  Statement(database_, "INSERT INTO events (event, info) VALUES (?, ?)", int64_t{event},
            JsonLine(info))
      .Run();
  SetFact(key, value);
  transaction.Commit();
  return !isFull;
}

std::optional<StoredEvent> Journal::NextEvent(std::optional<int> only) const {
  Statement next(database_,
                 "SELECT sequence, event, info, refusals FROM events WHERE ? < 0 OR event = ? "
                 "ORDER BY refusals, sequence LIMIT 1",
                 int64_t{only.value_or(-1)}, int64_t{only.value_or(-1)});
  if (!next.Next()) {
    return std::nullopt;
  }
  return StoredEvent{next.Number(0), static_cast<int>(next.Number(1)),
                     JsonFromText(next.Text(2)).value_or(Json::Value()), next.Number(3)};
}

void Journal::EventAccepted(int64_t sequence) {
  Statement(database_, "DELETE FROM events WHERE sequence = ?", sequence).Run();
}

int64_t Journal::EventRefused(int64_t sequence) {
  Statement(database_, "UPDATE events SET refusals = refusals + 1 WHERE sequence = ?", sequence)
      .Run();
  Statement refusals(database_, "SELECT refusals FROM events WHERE sequence = ?", sequence);
  return refusals.Next() ? refusals.Number(0) : 0;
}

int64_t Journal::WaitingEvents() const {
  return Count(database_, "SELECT count(*) FROM events");
}

bool Journal::IsLastWaitingEvent(int event) const {
  Statement last(database_, "SELECT event FROM events ORDER BY sequence DESC LIMIT 1");
  return last.Next() && last.Number(0) == event;
}

void Journal::AddSample(const Json::Value& sample, int64_t most) {
  Transaction transaction(database_);
  Statement(database_, "INSERT INTO samples (sample) VALUES (?)", JsonLine(sample)).Run();
  Statement(database_,
            "DELETE FROM samples WHERE sequence NOT IN "
            "(SELECT sequence FROM samples ORDER BY sequence DESC LIMIT ?)",
            most)
      .Run();
  transaction.Commit();
}

Json::Value Journal::Series(size_t most_bytes, int64_t& last) const {
  std::vector<std::string> newest;
  size_t bytes = 0;
  last = 0;
  Statement samples(database_, "SELECT sequence, sample FROM samples ORDER BY sequence DESC");
  while (samples.Next()) {
    last = std::max(last, samples.Number(0));
    const std::string text = samples.Text(1);
    bytes += text.size() + sizeof R"("perf_000000":,)";
    if (bytes > most_bytes) {
      break;
    }
    newest.push_back(text);
  }
  Json::Value series = Json::objectValue;
  for (size_t sample = 0; sample < newest.size(); ++sample) {
    series["perf_" + std::to_string(sample)] =
        JsonFromText(newest[newest.size() - 1 - sample]).value_or(Json::Value());
  }
  return series;
}

void Journal::DropSamples(int64_t last) {
  Statement(database_, "DELETE FROM samples WHERE sequence <= ?", last).Run();
}

void Journal::AddRun(const StoredRun& run) {
  Transaction transaction(database_);
  Statement(database_,
            "INSERT INTO runs (started, ended, cause, result, reason, bytes) "
            "VALUES (?, ?, ?, ?, ?, ?)",
            run.started, run.ended, run.cause, run.result, run.reason, run.bytes)
      .Run();
  Statement(database_, "DELETE FROM runs WHERE sequence <= (SELECT max(sequence) FROM runs) - ?",
            kRunsKept)
      .Run();
  transaction.Commit();
}

std::vector<StoredRun> Journal::Runs(int64_t most) const {
  std::vector<StoredRun> runs;
  Statement rows(database_,
                 "SELECT started, ended, cause, result, reason, bytes FROM runs "
                 "ORDER BY sequence DESC LIMIT ?",
                 most);
  while (rows.Next()) {
    runs.push_back(
        {rows.Number(0), rows.Number(1), rows.Text(2), rows.Text(3), rows.Text(4), rows.Number(5)});
  }
  return runs;
}

}  // namespace quendeld
