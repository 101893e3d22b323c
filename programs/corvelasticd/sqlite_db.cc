#include "programs/corvelasticd/sqlite_db.h"

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/document_codec.h"
#include "programs/corvelasticd/fts_tokenizer.h"
#include "programs/corvelasticd/rank_function.h"

namespace corvlumex {
namespace elasticd {

void ThrowSqlite(sqlite3* db, int rc, const std::string& what) {
  const std::string detail = db != nullptr ? sqlite3_errmsg(db) : sqlite3_errstr(rc);
  if ((rc & 0xff) == SQLITE_FULL) throw DaemonError(kCodeNoSpace, "No space left for the index: " + what + ": " + detail);
  throw DaemonError(kCodeStorage, "Database failure: " + what + ": " + detail);
}

void Statement::Bind(int index, const SqlValue& value) {
  int rc = SQLITE_OK;
  if (std::holds_alternative<std::nullptr_t>(value)) {
    rc = sqlite3_bind_null(stmt_, index);
  } else if (const auto* i = std::get_if<int64_t>(&value)) {
    rc = sqlite3_bind_int64(stmt_, index, *i);
  } else if (const auto* d = std::get_if<double>(&value)) {
    rc = sqlite3_bind_double(stmt_, index, *d);
  } else {
    const std::string& text = std::get<std::string>(value);
    rc = sqlite3_bind_text64(stmt_, index, text.data(), text.size(), SQLITE_TRANSIENT, SQLITE_UTF8);
  }
  if (rc != SQLITE_OK) ThrowSqlite(db_, rc, "bind");
}

void Statement::BindText(int index, std::string_view text) { BindBytes(index, text, true, SQLITE_TRANSIENT); }

void Statement::BindBlob(int index, std::string_view bytes) { BindBytes(index, bytes, false, SQLITE_TRANSIENT); }

void Statement::BindTextInPlace(int index, std::string_view text) { BindBytes(index, text, true, SQLITE_STATIC); }

void Statement::BindBlobInPlace(int index, std::string_view bytes) { BindBytes(index, bytes, false, SQLITE_STATIC); }

void Statement::BindBytes(int index, std::string_view bytes, bool text, sqlite3_destructor_type lifetime) {
  const int rc = text ? sqlite3_bind_text64(stmt_, index, bytes.data(), bytes.size(), lifetime, SQLITE_UTF8)
                      : sqlite3_bind_blob64(stmt_, index, bytes.data(), bytes.size(), lifetime);
  if (rc != SQLITE_OK) ThrowSqlite(db_, rc, "bind");
}

void Statement::BindPointer(int index, void* pointer, const char* type) {
  const int rc = sqlite3_bind_pointer(stmt_, index, pointer, type, nullptr);
  if (rc != SQLITE_OK) ThrowSqlite(db_, rc, "bind");
}

void Statement::BindAll(const std::vector<SqlValue>& values) {
  for (size_t i = 0; i < values.size(); ++i) Bind(static_cast<int>(i + 1), values[i]);
}

bool Statement::Step() {
  const int rc = sqlite3_step(stmt_);
  if (rc == SQLITE_ROW) return true;
  if (rc == SQLITE_DONE) return false;
  const std::string sql = sqlite3_sql(stmt_) != nullptr ? sqlite3_sql(stmt_) : "";
  sqlite3_reset(stmt_);
  ThrowSqlite(db_, rc, "step of " + sql.substr(0, 80));
}

void Statement::Reset() {
  sqlite3_reset(stmt_);
  sqlite3_clear_bindings(stmt_);
}

std::string Statement::Text(int column) const {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(stmt_, column));
  if (text == nullptr) return std::string();
  return std::string(text, static_cast<size_t>(sqlite3_column_bytes(stmt_, column)));
}

std::string_view Statement::Bytes(int column) const {
  const auto* bytes = static_cast<const char*>(sqlite3_column_blob(stmt_, column));
  if (bytes == nullptr) return std::string_view();
  return std::string_view(bytes, static_cast<size_t>(sqlite3_column_bytes(stmt_, column)));
}

Database::Database(const std::string& path, bool create) {
  const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX | (create ? SQLITE_OPEN_CREATE : 0);
  const int rc = sqlite3_open_v2(path.c_str(), &db_, flags, nullptr);
  if (rc != SQLITE_OK) {
    const std::string detail = db_ != nullptr ? sqlite3_errmsg(db_) : sqlite3_errstr(rc);
    sqlite3_close_v2(db_);
    db_ = nullptr;
    throw DaemonError(kCodeIndexFailed, "Cannot open the index database " + path + ": " + detail);
  }
  sqlite3_extended_result_codes(db_, 1);
  sqlite3_busy_timeout(db_, 5000);
  RegisterTokenizer(db_);
  RegisterRankFunction(db_);
  RegisterDocumentFunctions(db_);
}

Database::~Database() {
  cache_.clear();  // finalizes the cached statements; the index modules finalize their own
  sqlite3_close_v2(db_);
}

void Database::Exec(const std::string& sql) {
  char* message = nullptr;
  const int rc = sqlite3_exec(db_, sql.c_str(), nullptr, nullptr, &message);
  if (rc != SQLITE_OK) {
    sqlite3_free(message);
    ThrowSqlite(db_, rc, sql.substr(0, 80));
  }
}

Statement& Database::Cached(const std::string& sql) {
  auto it = cache_.find(sql);
  if (it == cache_.end()) {
    sqlite3_stmt* stmt = nullptr;
    const int rc = sqlite3_prepare_v3(db_, sql.c_str(), static_cast<int>(sql.size()), SQLITE_PREPARE_PERSISTENT, &stmt, nullptr);
    if (rc != SQLITE_OK) ThrowSqlite(db_, rc, "prepare " + sql.substr(0, 80));
    it = cache_.emplace(sql, std::make_unique<Statement>(db_, stmt, true)).first;
  } else {
    it->second->Reset();
  }
  return *it->second;
}

std::unique_ptr<Statement> Database::Prepare(const std::string& sql) {
  sqlite3_stmt* stmt = nullptr;
  const int rc = sqlite3_prepare_v2(db_, sql.c_str(), static_cast<int>(sql.size()), &stmt, nullptr);
  if (rc != SQLITE_OK) ThrowSqlite(db_, rc, "prepare " + sql.substr(0, 120));
  return std::make_unique<Statement>(db_, stmt, true);
}

void Database::CheckpointPassive() {
  const int rc = sqlite3_wal_checkpoint_v2(db_, nullptr, SQLITE_CHECKPOINT_PASSIVE, nullptr, nullptr);
  // Busy means a reader or another checkpoint holds part of the log; the
  // next commit's checkpoint takes it further.
  if (rc != SQLITE_OK && rc != SQLITE_BUSY) ThrowSqlite(db_, rc, "checkpoint");
}

}  // namespace elasticd
}  // namespace corvlumex
