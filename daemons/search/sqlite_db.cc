#include "search/sqlite_db.h"

#include "search/search_error.h"

namespace orvex {
namespace search {

SqliteDb::SqliteDb(const std::string& path, bool create) : path_(path) {
  // SQLite counts every allocation under a global mutex for
  // sqlite3_memory_used(), which the daemon never asks: a lock and an unlock
  // per allocation, several per row written. Only possible before SQLite's
  // first use in the process; later it is refused, harmlessly.
  static const int memstatus_off = sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);
  static_cast<void>(memstatus_off);
  const int flags = SQLITE_OPEN_READWRITE | (create ? SQLITE_OPEN_CREATE : 0) | SQLITE_OPEN_NOMUTEX;
  if (sqlite3_open_v2(path.c_str(), &db_, flags, nullptr) != SQLITE_OK) {
    const std::string why = db_ ? sqlite3_errmsg(db_) : "out of memory";
    sqlite3_close(db_);
    db_ = nullptr;
    throw SearchError(kStorage, "cannot open " + path + ": " + why);
  }
  sqlite3_extended_result_codes(db_, 1);
}

SqliteDb::~SqliteDb() { sqlite3_close_v2(db_); }

void SqliteDb::Exec(const std::string& sql) {
  if (sqlite3_exec(db_, sql.c_str(), nullptr, nullptr, nullptr) != SQLITE_OK) Fail(sql);
}

int64_t SqliteDb::LastInsertRowid() const { return sqlite3_last_insert_rowid(db_); }

int SqliteDb::Changes() const { return sqlite3_changes(db_); }

void SqliteDb::Fail(const std::string& what) const {
  throw SearchError(kStorage, path_ + ": " + sqlite3_errmsg(db_) + " (in: " + what + ")");
}

Statement::Statement(SqliteDb& db, const std::string& sql) : db_(&db), sql_(sql) {
  sqlite3_stmt* raw = nullptr;
  if (sqlite3_prepare_v3(db.handle(), sql.c_str(), -1, SQLITE_PREPARE_PERSISTENT, &raw, nullptr) !=
      SQLITE_OK) {
    db.Fail(sql);
  }
  stmt_.reset(raw);
}

Statement& Statement::Bind(int index, const std::string& text) {
  if (sqlite3_bind_text(stmt_.get(), index, text.data(), static_cast<int>(text.size()),
                        SQLITE_TRANSIENT) != SQLITE_OK) {
    db_->Fail(sql_);
  }
  return *this;
}

Statement& Statement::Bind(int index, int64_t number) {
  if (sqlite3_bind_int64(stmt_.get(), index, number) != SQLITE_OK) db_->Fail(sql_);
  return *this;
}

Statement& Statement::BindDouble(int index, double number) {
  if (sqlite3_bind_double(stmt_.get(), index, number) != SQLITE_OK) db_->Fail(sql_);
  return *this;
}

Statement& Statement::BindNull(int index) {
  if (sqlite3_bind_null(stmt_.get(), index) != SQLITE_OK) db_->Fail(sql_);
  return *this;
}

bool Statement::Step() {
  const int rc = sqlite3_step(stmt_.get());
  if (rc == SQLITE_ROW) return true;
  if (rc == SQLITE_DONE) return false;
  // The statement must be usable again after a failure (a constraint, a full
  // disk): reset it before the error leaves.
  const std::string why = sqlite3_errmsg(db_->handle());
  Reset();
  throw SearchError(kStorage, db_->path() + ": " + why + " (in: " + sql_ + ")");
}

void Statement::Run() {
  while (Step()) {
  }
  Reset();
}

void Statement::Reset() {
  sqlite3_reset(stmt_.get());
  sqlite3_clear_bindings(stmt_.get());
}

bool Statement::IsNull(int column) const {
  return sqlite3_column_type(stmt_.get(), column) == SQLITE_NULL;
}

int64_t Statement::Int(int column) const { return sqlite3_column_int64(stmt_.get(), column); }

double Statement::Double(int column) const { return sqlite3_column_double(stmt_.get(), column); }

std::string Statement::Text(int column) const {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(stmt_.get(), column));
  if (text == nullptr) return std::string();
  return std::string(text, static_cast<size_t>(sqlite3_column_bytes(stmt_.get(), column)));
}

std::string_view Statement::TextView(int column) const {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(stmt_.get(), column));
  if (text == nullptr) return std::string_view();
  return std::string_view(text, static_cast<size_t>(sqlite3_column_bytes(stmt_.get(), column)));
}

fts5_api* Fts5Api(sqlite3* db) {
  fts5_api* api = nullptr;
  sqlite3_stmt* stmt = nullptr;
  if (sqlite3_prepare_v2(db, "SELECT fts5(?1)", -1, &stmt, nullptr) == SQLITE_OK) {
    sqlite3_bind_pointer(stmt, 1, &api, "fts5_api_ptr", nullptr);
    sqlite3_step(stmt);
  }
  sqlite3_finalize(stmt);
  return api;
}

}  // namespace search
}  // namespace orvex
