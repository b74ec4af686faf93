// A thin owner of one SQLite connection and its prepared statements. Every
// failure throws SearchError kStorage naming the statement or file. One
// thread at a time per object.
#ifndef ORVEX_SEARCH_SQLITE_DB_H_
#define ORVEX_SEARCH_SQLITE_DB_H_

#include <sqlite3.h>

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace orvex {
namespace search {

class SqliteDb;

// One prepared statement, reset on each Run/first Step. Move-only.
class Statement {
 public:
  Statement(SqliteDb& db, const std::string& sql);
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;
  Statement(Statement&&) = default;
  Statement& operator=(Statement&&) = default;

  // Bind by 1-based index. Text is copied by SQLite.
  Statement& Bind(int index, const std::string& text);
  Statement& Bind(int index, int64_t number);
  Statement& BindDouble(int index, double number);
  Statement& BindNull(int index);

  // Advances; false when there are no more rows. Throws on error.
  bool Step();
  // Steps to completion, then resets and clears the bindings.
  void Run();
  // Resets for the next use and clears the bindings.
  void Reset();

  bool IsNull(int column) const;
  int64_t Int(int column) const;
  double Double(int column) const;
  std::string Text(int column) const;
  // Valid until the next Step, Reset or column call on this statement.
  std::string_view TextView(int column) const;

 private:
  struct Finalize {
    void operator()(sqlite3_stmt* s) const { sqlite3_finalize(s); }
  };
  SqliteDb* db_;
  std::string sql_;
  std::unique_ptr<sqlite3_stmt, Finalize> stmt_;
};

class SqliteDb {
 public:
  // Opens (creating when create is true) the database at path.
  SqliteDb(const std::string& path, bool create);
  SqliteDb(const SqliteDb&) = delete;
  SqliteDb& operator=(const SqliteDb&) = delete;
  ~SqliteDb();

  // Runs one or more statements without results.
  void Exec(const std::string& sql);
  int64_t LastInsertRowid() const;
  int Changes() const;

  sqlite3* handle() const { return db_; }
  const std::string& path() const { return path_; }

  // Throws kStorage with SQLite's message for what.
  [[noreturn]] void Fail(const std::string& what) const;

 private:
  std::string path_;
  sqlite3* db_ = nullptr;
};

// The connection's FTS5 interface, for registering tokenizers and
// functions; null when SQLite was built without FTS5.
fts5_api* Fts5Api(sqlite3* db);

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_SQLITE_DB_H_
