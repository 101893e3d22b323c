// A thin owner of SQLite connections and statements that turns every SQLite
// failure into a DaemonError (a full volume gets its own code).
#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace corvlumex {
namespace elasticd {

using SqlValue = std::variant<std::nullptr_t, int64_t, double, std::string>;

class Statement {
 public:
  Statement(sqlite3* db, sqlite3_stmt* stmt, bool owned = true) : db_(db), stmt_(stmt), owned_(owned) {}
  ~Statement() {
    if (owned_) sqlite3_finalize(stmt_);
  }
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;

  void Bind(int index, const SqlValue& value);
  void BindText(int index, std::string_view text);
  void BindBlob(int index, std::string_view bytes);
  // Without SQLite's copy: the bytes must stay as they are until the
  // statement is reset (a document's record and its words are megabytes).
  void BindTextInPlace(int index, std::string_view text);
  void BindBlobInPlace(int index, std::string_view bytes);
  // A pointer for an SQL function that asks for `type` (it must outlive the statement's run).
  void BindPointer(int index, void* pointer, const char* type);
  void BindAll(const std::vector<SqlValue>& values);
  // True while a row is available.
  bool Step();
  void Reset();

  int64_t Int(int column) const { return sqlite3_column_int64(stmt_, column); }
  double Real(int column) const { return sqlite3_column_double(stmt_, column); }
  bool IsNull(int column) const { return sqlite3_column_type(stmt_, column) == SQLITE_NULL; }
  int Type(int column) const { return sqlite3_column_type(stmt_, column); }
  std::string Text(int column) const;
  // The column's bytes as stored (text or blob), valid until the next step or reset.
  std::string_view Bytes(int column) const;

 private:
  // SQLITE_TRANSIENT: SQLite copies the bytes; SQLITE_STATIC: it reads ours.
  void BindBytes(int index, std::string_view bytes, bool text, sqlite3_destructor_type lifetime);

  sqlite3* db_;
  sqlite3_stmt* stmt_;
  bool owned_;
};

class Database {
 public:
  // Opens (creating when `create`) the database and registers the daemon's
  // tokenizer and SQL functions on the connection.
  Database(const std::string& path, bool create);
  ~Database();
  Database(const Database&) = delete;
  Database& operator=(const Database&) = delete;

  void Exec(const std::string& sql);
  // A statement kept for the connection's life, reset before it is handed out.
  Statement& Cached(const std::string& sql);
  // A statement for one use.
  std::unique_ptr<Statement> Prepare(const std::string& sql);
  int64_t Changes() const { return sqlite3_changes64(db_); }
  // Copies what the write-ahead log holds into the database, as far as no
  // reader still needs it, without waiting for readers or blocking them.
  void CheckpointPassive();
  sqlite3* raw() { return db_; }

 private:
  sqlite3* db_ = nullptr;
  std::map<std::string, std::unique_ptr<Statement>> cache_;
};

// Throws the DaemonError for a failed SQLite call.
[[noreturn]] void ThrowSqlite(sqlite3* db, int rc, const std::string& what);

}  // namespace elasticd
}  // namespace corvlumex
