// What depends on the database engine: how it is opened, where a writing transaction begins, how it
// is copied.
#include "database.h"

#include <soci/sqlite3/soci-sqlite3.h>

#include <stdexcept>

namespace quendeldesk {
namespace {

constexpr int kSchemaVersion = 1;

// "{id}" is a number that the engine gives each row. Times are milliseconds since 1970 in UTC; what
// is not known is 0 or an empty text.
const char* const kTables[] = {
    "CREATE TABLE meta (name TEXT PRIMARY KEY, value TEXT NOT NULL)",

    // A device as its heartbeats name it. The owner is the pair of account fields that it came with
    // first; the same serial number under others is a conflict.
    "CREATE TABLE devices (id {id}, serial TEXT NOT NULL UNIQUE, enrolment TEXT NOT NULL,"
    " first_seen BIGINT NOT NULL, last_seen BIGINT NOT NULL, last_heartbeat BIGINT NOT NULL,"
    " owner_id BIGINT NOT NULL, version TEXT NOT NULL, email TEXT NOT NULL, info TEXT NOT NULL)",
    "CREATE TABLE owners (id {id}, device_id BIGINT NOT NULL, field_a TEXT NOT NULL,"
    " field_b TEXT NOT NULL, first_seen BIGINT NOT NULL, last_seen BIGINT NOT NULL,"
    " UNIQUE (device_id, field_a, field_b))",

    // Kept when a device is forgotten: a number that it has seen means nothing new to it.
    "CREATE TABLE request_ids (serial_hash TEXT PRIMARY KEY, last_id BIGINT NOT NULL)",

    "CREATE TABLE heartbeats (device_id BIGINT NOT NULL, at BIGINT NOT NULL)",
    "CREATE INDEX heartbeats_by_device ON heartbeats (device_id, at)",

    "CREATE TABLE events (id {id}, device_id BIGINT NOT NULL, owner_id BIGINT NOT NULL,"
    " at BIGINT NOT NULL, name TEXT NOT NULL, body TEXT NOT NULL)",
    "CREATE INDEX events_by_device ON events (device_id, at)",

    "CREATE TABLE actions (device_id BIGINT NOT NULL, request_id BIGINT NOT NULL,"
    " name TEXT NOT NULL, body TEXT NOT NULL, state TEXT NOT NULL, created_at BIGINT NOT NULL,"
    " expires_at BIGINT NOT NULL, closed_at BIGINT NOT NULL, PRIMARY KEY (device_id, request_id))",
    "CREATE INDEX open_actions ON actions (device_id, state, expires_at)",

    "CREATE TABLE progress (id {id}, device_id BIGINT NOT NULL, owner_id BIGINT NOT NULL,"
    " request_id BIGINT NOT NULL, at BIGINT NOT NULL, value BIGINT NOT NULL, details TEXT NOT NULL)",
    "CREATE INDEX progress_by_device ON progress (device_id, at)",

    // Collections and uploads: what arrived in one form.
    "CREATE TABLE deliveries (id {id}, device_id BIGINT NOT NULL, owner_id BIGINT NOT NULL,"
    " kind TEXT NOT NULL, request_id BIGINT NOT NULL, at BIGINT NOT NULL,"
    " descriptions TEXT NOT NULL, mismatch TEXT NOT NULL)",
    "CREATE INDEX deliveries_by_device ON deliveries (device_id, kind, at)",
    "CREATE TABLE files (delivery_id BIGINT NOT NULL, number BIGINT NOT NULL, object TEXT NOT NULL,"
    " filename TEXT NOT NULL, content_type TEXT NOT NULL, size BIGINT NOT NULL,"
    " sha256 TEXT NOT NULL, PRIMARY KEY (delivery_id, number))",
    "CREATE UNIQUE INDEX files_by_object ON files (object)",

    // Objects that no row names any more and that are still to be removed.
    "CREATE TABLE discarded (object TEXT PRIMARY KEY)",
};

std::string WithEngineTypes(std::string statement) {
  const std::string mark = "{id}";
  const size_t at = statement.find(mark);
  return at == statement.npos ? statement
                              : statement.replace(at, mark.size(), "INTEGER PRIMARY KEY");
}

int SchemaVersionOf(soci::session& session) {
  int tables = 0;
  session << "SELECT COUNT(*) FROM sqlite_master WHERE name = 'meta'", soci::into(tables);
  std::string version = "0";
  if (tables > 0) {
    session << "SELECT value FROM meta WHERE name = 'schema'", soci::into(version);
  }
  return std::stoi(version);
}

}  // namespace

// Every commit is on the disk before it is acknowledged. Another process, such as the command line,
// may hold the database for a moment.
void OpenSession(soci::session& session, const std::string& file) {
  std::string quoted;
  for (const char c : file) {
    quoted += c == '"' || c == '\\' ? std::string{'\\', c} : std::string{c};
  }
  session.open(soci::sqlite3, "db=\"" + quoted + "\" timeout=30");
  session << "PRAGMA journal_mode = WAL";
  session << "PRAGMA synchronous = FULL";
}

void BeginWriting(soci::session& session) {
  session << "BEGIN IMMEDIATE";
}

void Commit(soci::session& session) {
  session << "COMMIT";
}

void Rollback(soci::session& session) {
  try {
    session << "ROLLBACK";
  } catch (const soci::soci_error&) {
    // The engine has rolled back by itself, as it does when the disk is full.
  }
}

void PrepareSchema(soci::session& session) {
  BeginWriting(session);
  const int version = SchemaVersionOf(session);
  if (version > kSchemaVersion) {
    Rollback(session);
    throw std::runtime_error("the database is of a newer quendel-desk");
  }
  if (version == 0) {
    for (const char* statement : kTables) {
      session << WithEngineTypes(statement);
    }
    session << "INSERT INTO meta (name, value) VALUES ('schema', '" << kSchemaVersion << "')";
  }
  Commit(session);
}

void CopyDatabase(soci::session& session, const std::string& file) {
  session << "VACUUM INTO :file", soci::use(file);
}

void CheckDatabase(soci::session& session) {
  std::string verdict;
  session << "PRAGMA quick_check(1)", soci::into(verdict);
  if (verdict != "ok") {
    throw std::runtime_error("the database is damaged: " + verdict);
  }
}

}  // namespace quendeldesk
