// SQLite, as far as the journal needs it.
#ifndef QUENDELD_DATABASE_H_
#define QUENDELD_DATABASE_H_

#include <sqlite3.h>

#include <cstdint>
#include <memory>
#include <stdexcept>
#include <string>

namespace quendeld {

// A statement that SQLite could not carry out. The database is as it was before it.
class DatabaseError : public std::runtime_error {
 public:
  DatabaseError(const std::string& what, int code) : std::runtime_error(what), code_(code) {}
  // Tells whether the file itself is what is wrong, rather than the disk around it.
  bool is_damage() const { return code_ == SQLITE_CORRUPT || code_ == SQLITE_NOTADB; }

 private:
  int code_;
};

class Database {
 public:
  // Opens or creates the file. Each change that is committed is on the disk. Throws DatabaseError.
  explicit Database(const std::string& path);
  void Execute(const std::string& sql);
  sqlite3* get() const { return database_.get(); }

 private:
  struct Close {
    void operator()(sqlite3* database) const { sqlite3_close_v2(database); }
  };
  std::unique_ptr<sqlite3, Close> database_;
};

// One statement with its values, in the order of its question marks.
class Statement {
 public:
  template <typename... Values>
  Statement(const Database& database, const char* sql, const Values&... values)
      : database_(database), statement_(Prepare(sql)) {
    (Bind(values), ...);
  }

  // Goes to the next row. Returns false when there is none. Throws DatabaseError.
  bool Next();
  void Run() { Next(); }

  bool IsNull(int column) const;
  int64_t Number(int column) const { return sqlite3_column_int64(statement_.get(), column); }
  std::string Text(int column) const;

 private:
  struct Finalize {
    void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
  };

  sqlite3_stmt* Prepare(const char* sql);
  void Bind(int64_t value);
  void Bind(const std::string& value);
  void Bind(const char* value) { Bind(std::string(value)); }

  const Database& database_;
  std::unique_ptr<sqlite3_stmt, Finalize> statement_;
  int bound_ = 0;
};

// Everything up to Commit(), or nothing of it.
class Transaction {
 public:
  explicit Transaction(Database& database) : database_(database) {
    database_.Execute("BEGIN IMMEDIATE");
  }
  ~Transaction();
  Transaction(const Transaction&) = delete;
  Transaction& operator=(const Transaction&) = delete;
  void Commit();

 private:
  Database& database_;
  bool is_open_ = true;
};

}  // namespace quendeld

#endif  // QUENDELD_DATABASE_H_
