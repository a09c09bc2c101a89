#include "database.h"

namespace quendeld {
namespace {

[[noreturn]] void Fail(sqlite3* database, int code) {
  throw DatabaseError(std::string("the journal: ") +
                          (database != nullptr ? sqlite3_errmsg(database) : sqlite3_errstr(code)),
                      code & 0xff);
}

}  // namespace

Database::Database(const std::string& path) {
  sqlite3* database = nullptr;
  constexpr int kFlags =
      SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_NOFOLLOW;
  const int code = sqlite3_open_v2(path.c_str(), &database, kFlags, nullptr);
  database_.reset(database);
  if (code != SQLITE_OK) {
    Fail(database, code);
  }
  // Small caches: the journal is a few pages, and the daemon stays in memory for months.
  Execute(
      "PRAGMA cache_size = -256; PRAGMA journal_mode = WAL; PRAGMA synchronous = FULL;"
      "PRAGMA journal_size_limit = 1048576; PRAGMA locking_mode = EXCLUSIVE");
}

void Database::Execute(const std::string& sql) {
  const int code = sqlite3_exec(database_.get(), sql.c_str(), nullptr, nullptr, nullptr);
  if (code != SQLITE_OK) {
    Fail(database_.get(), code);
  }
}

bool Statement::Next() {
  const int code = sqlite3_step(statement_.get());
  if (code != SQLITE_ROW && code != SQLITE_DONE) {
    Fail(database_.get(), code);
  }
  return code == SQLITE_ROW;
}

bool Statement::IsNull(int column) const {
  return sqlite3_column_type(statement_.get(), column) == SQLITE_NULL;
}

std::string Statement::Text(int column) const {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(statement_.get(), column));
  return text == nullptr
             ? std::string()
             : std::string(text,
                           static_cast<size_t>(sqlite3_column_bytes(statement_.get(), column)));
}

sqlite3_stmt* Statement::Prepare(const char* sql) {
  sqlite3_stmt* statement = nullptr;
  const int code = sqlite3_prepare_v2(database_.get(), sql, -1, &statement, nullptr);
  if (code != SQLITE_OK) {
    Fail(database_.get(), code);
  }
  return statement;
}

void Statement::Bind(int64_t value) {
  sqlite3_bind_int64(statement_.get(), ++bound_, value);
}

void Statement::Bind(const std::string& value) {
  sqlite3_bind_text(statement_.get(), ++bound_, value.data(), static_cast<int>(value.size()),
                    SQLITE_TRANSIENT);
}

Transaction::~Transaction() {
  if (is_open_) {
    sqlite3_exec(database_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
  }
}

void Transaction::Commit() {
  database_.Execute("COMMIT");
  is_open_ = false;
}

}  // namespace quendeld
