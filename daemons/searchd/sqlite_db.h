// Thin RAII wrappers of an SQLite connection and its prepared statements.
//
// Failures throw vellis::Error: kErrBusy when the database stays locked by
// another process past the busy time-out, kErrStorage otherwise, with
// SQLite's message. A connection is used by one thread at a time.
#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <memory>
#include <string>

namespace vellis::searchd {

// How long a write waits for another process's lock before answering busy.
inline constexpr int kBusyTimeoutMs = 2000;

class Stmt {
 public:
  Stmt(sqlite3* db, const std::string& sql);
  ~Stmt();
  Stmt(const Stmt&) = delete;
  Stmt& operator=(const Stmt&) = delete;

  // Binds by 1-based index; text is copied.
  Stmt& Bind(int index, const std::string& text);
  Stmt& Bind(int index, int64_t value);
  Stmt& BindDouble(int index, double value);
  Stmt& BindNull(int index);
  // True while a row is available; false at the end.
  bool Step();
  // Steps to the end (for statements without rows); returns changes().
  int64_t Run();
  // Clears bindings and rewinds.
  void Reset();

  std::string Text(int col) const;
  int64_t Int(int col) const;
  double Double(int col) const;
  bool IsNull(int col) const;

 private:
  sqlite3* db_;
  sqlite3_stmt* stmt_ = nullptr;
};

class Db {
 public:
  // Opens `file` read-write (creating it when missing if `create`); a lock
  // held by another process is waited for up to `busy_timeout_ms`. Throws
  // kErrStorage.
  Db(const std::string& file, bool create, int busy_timeout_ms = kBusyTimeoutMs);
  ~Db();
  Db(const Db&) = delete;
  Db& operator=(const Db&) = delete;

  void Exec(const std::string& sql);
  sqlite3* get() const { return db_; }
  int64_t LastInsertRowid() const { return sqlite3_last_insert_rowid(db_); }

 private:
  sqlite3* db_ = nullptr;
};

// Throws the Error that matches SQLite result `rc` on `db`.
[[noreturn]] void ThrowSqlite(sqlite3* db, int rc, const std::string& what);

}  // namespace vellis::searchd
