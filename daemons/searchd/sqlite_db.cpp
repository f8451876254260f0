#include "daemons/searchd/sqlite_db.h"

#include "common/error.h"
#include "daemons/searchd/error_codes.h"

namespace vellis::searchd {

void ThrowSqlite(sqlite3* db, int rc, const std::string& what) {
  std::string msg = what + ": " + (db ? sqlite3_errmsg(db) : sqlite3_errstr(rc));
  int primary = rc & 0xff;
  if (primary == SQLITE_BUSY || primary == SQLITE_LOCKED) {
    throw Error(kErrBusyLocked,
                "Index database is locked by another process, retry later (" + msg + ")");
  }
  throw Error(kErrStorage, "Storage failure: " + msg);
}

Stmt::Stmt(sqlite3* db, const std::string& sql) : db_(db) {
  int rc = sqlite3_prepare_v2(db, sql.c_str(), static_cast<int>(sql.size()), &stmt_, nullptr);
  if (rc != SQLITE_OK) ThrowSqlite(db, rc, "prepare");
}

Stmt::~Stmt() { sqlite3_finalize(stmt_); }

Stmt& Stmt::Bind(int index, const std::string& text) {
  sqlite3_bind_text(stmt_, index, text.data(), static_cast<int>(text.size()), SQLITE_TRANSIENT);
  return *this;
}

Stmt& Stmt::Bind(int index, int64_t value) {
  sqlite3_bind_int64(stmt_, index, value);
  return *this;
}

Stmt& Stmt::BindDouble(int index, double value) {
  sqlite3_bind_double(stmt_, index, value);
  return *this;
}

Stmt& Stmt::BindNull(int index) {
  sqlite3_bind_null(stmt_, index);
  return *this;
}

bool Stmt::Step() {
  int rc = sqlite3_step(stmt_);
  if (rc == SQLITE_ROW) return true;
  if (rc == SQLITE_DONE) return false;
  sqlite3_reset(stmt_);
  ThrowSqlite(db_, rc, "step");
}

int64_t Stmt::Run() {
  while (Step()) {
  }
  return sqlite3_changes64(db_);
}

void Stmt::Reset() {
  sqlite3_reset(stmt_);
  sqlite3_clear_bindings(stmt_);
}

std::string Stmt::Text(int col) const {
  const unsigned char* p = sqlite3_column_text(stmt_, col);
  if (p == nullptr) return std::string();
  return std::string(reinterpret_cast<const char*>(p),
                     static_cast<size_t>(sqlite3_column_bytes(stmt_, col)));
}

int64_t Stmt::Int(int col) const { return sqlite3_column_int64(stmt_, col); }
double Stmt::Double(int col) const { return sqlite3_column_double(stmt_, col); }
bool Stmt::IsNull(int col) const { return sqlite3_column_type(stmt_, col) == SQLITE_NULL; }

Db::Db(const std::string& file, bool create, int busy_timeout_ms) {
  int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX | (create ? SQLITE_OPEN_CREATE : 0);
  int rc = sqlite3_open_v2(file.c_str(), &db_, flags, nullptr);
  if (rc != SQLITE_OK) {
    std::string msg = db_ ? sqlite3_errmsg(db_) : sqlite3_errstr(rc);
    sqlite3_close(db_);
    db_ = nullptr;
    throw Error(kErrStorage, "Cannot open index database " + file + ": " + msg);
  }
  sqlite3_busy_timeout(db_, busy_timeout_ms);
  sqlite3_extended_result_codes(db_, 1);
}

Db::~Db() { sqlite3_close(db_); }

void Db::Exec(const std::string& sql) {
  char* err = nullptr;
  int rc = sqlite3_exec(db_, sql.c_str(), nullptr, nullptr, &err);
  if (rc != SQLITE_OK) {
    sqlite3_free(err);
    ThrowSqlite(db_, rc, "exec");
  }
}

}  // namespace vellis::searchd
