#include "programs/corvelasticd/index_store.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <unordered_map>

#include "common/json_util.h"
#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/document_codec.h"
#include "programs/corvelasticd/index_files.h"
#include "programs/corvelasticd/search_candidates.h"
#include "programs/corvelasticd/search_ranking.h"
#include "programs/corvelasticd/text_analysis.h"

namespace corvlumex {
namespace elasticd {
namespace {

constexpr const char* kDatabaseName = "corvelasticd.db";
constexpr int kFormatVersion = 1;
constexpr size_t kMaxTrackedChanges = 100000;
constexpr size_t kMaxSuggestionTerms = 100000;
constexpr size_t kFilterBatch = 64;
constexpr size_t kMaxKeyChanges = 1000000;  // rows changed in one transaction kept for the key directory
constexpr size_t kMaxReaders = 4;
constexpr int kReaderCacheKb = 16384;
// Full-text rows queued beyond this are handed to the engine before the next request.
constexpr size_t kMaxPendingIndexBytes = 4u << 20;

WalLimits g_wal_limits;
std::mutex g_wal_limits_mutex;

WalLimits CurrentWalLimits() {
  std::lock_guard<std::mutex> guard(g_wal_limits_mutex);
  return g_wal_limits;
}

[[noreturn]] void BadDocument(const std::string& what) { throw DaemonError(kCodeBadDocument, "Bad document: " + what); }

// Values of a field: an array's elements, or the value itself.
template <typename Visit>
void ForEachValue(const Json::Value& value, Visit visit) {
  if (value.isArray()) {
    for (const Json::Value& element : value) visit(element);
  } else if (!value.isNull()) {
    visit(value);
  }
}

// Calls `use` with a value's text: a string's own bytes (a content field
// may be megabytes: not copied), another scalar's text form.
template <typename Use>
void WithValueText(const Json::Value& value, Use use) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (value.isString() && value.getString(&begin, &end)) {
    use(std::string_view(begin, static_cast<size_t>(end - begin)));
  } else {
    use(std::string_view(value.asString()));
  }
}

// The next candidates, as many as one access check takes, with their rows;
// false when the candidates ran out.
bool NextBatch(SearchCandidates& candidates, std::vector<Hit>* batch, std::vector<int64_t>* rowids) {
  batch->clear();
  rowids->clear();
  while (batch->size() < kFilterBatch) {
    Hit hit;
    int64_t rowid = 0;
    if (!candidates.Next(&rowid, &hit)) return false;
    rowids->push_back(rowid);
    batch->push_back(std::move(hit));
  }
  return true;
}

// The sum of a docsize record's column sizes (SQLite varints), as FTS5's
// xColumnSize(-1) gives it.
uint32_t TokenCount(std::string_view record) {
  uint64_t total = 0;
  size_t i = 0;
  while (i < record.size()) {
    uint64_t value = 0;
    int bytes = 0;
    // Up to 8 bytes carry 7 bits each, a ninth all 8.
    while (i < record.size()) {
      const auto byte = static_cast<unsigned char>(record[i++]);
      if (++bytes == 9) {
        value = (value << 8) | byte;
        break;
      }
      value = (value << 7) | (byte & 0x7F);
      if ((byte & 0x80) == 0) break;
    }
    total += static_cast<uint32_t>(value);
  }
  return static_cast<uint32_t>(total);
}

std::vector<std::string> KeysOf(const std::vector<Hit>& hits) {
  std::vector<std::string> keys;
  keys.reserve(hits.size());
  for (const Hit& hit : hits) keys.push_back(hit.key);
  return keys;
}

}  // namespace

std::string IndexStore::DatabasePath(const std::string& directory) { return directory + "/" + kDatabaseName; }

void IndexStore::SetWalLimits(const WalLimits& limits) {
  std::lock_guard<std::mutex> guard(g_wal_limits_mutex);
  g_wal_limits = limits;
}

IndexStore::IndexStore(const std::string& path, std::unique_ptr<Database> writer)
    : path_(path), wal_limits_(CurrentWalLimits()), writer_(std::move(writer)) {}

IndexStore::~IndexStore() {
  try {
    Close(true);
  } catch (const std::exception&) {
    // Nothing more can be done at destruction; an uncommitted transaction is dropped.
  }
}

std::unique_ptr<IndexStore> IndexStore::Create(const std::string& directory, const Json::Value& mappings,
                                               const Json::Value& settings) {
  const IndexSchema schema = IndexSchema::FromMappings(mappings);
  if (directory.empty() || directory[0] != '/') throw DaemonError(kCodeIndexPath, "The index path must be absolute: \"" + directory + "\"");
  if (!MakeDirectories(directory)) {
    throw DaemonError(kCodeIndexPath, "Cannot create the index directory " + directory + ": " + strerror(errno));
  }
  const std::string path = DatabasePath(directory);
  struct stat info;
  if (stat(path.c_str(), &info) == 0) throw DaemonError(kCodeIndexExists, "An index database already exists at " + path);
  errno = 0;
  auto db = std::make_unique<Database>(path, true);
  db->Exec("PRAGMA journal_mode=WAL");
  db->Exec("PRAGMA synchronous=NORMAL");
  std::string text_columns, name_columns;
  for (const FieldSpec* field : schema.TextFields()) text_columns += (text_columns.empty() ? "" : ", ") + field->Column();
  for (const FieldSpec* field : schema.NgramFields()) name_columns += (name_columns.empty() ? "" : ", ") + field->NameColumn();
  // An index must have a column; a schema without such fields gets an unused one.
  if (text_columns.empty()) text_columns = "unused";
  if (name_columns.empty()) name_columns = "unused";
  db->Exec("BEGIN");
  db->Exec("CREATE TABLE meta(name TEXT PRIMARY KEY, value TEXT NOT NULL) WITHOUT ROWID");
  db->Exec("CREATE TABLE docs(rowid INTEGER PRIMARY KEY, key TEXT NOT NULL, doc BLOB NOT NULL)");
  db->Exec("CREATE UNIQUE INDEX docs_key ON docs(key)");
  db->Exec("CREATE VIRTUAL TABLE fts_text USING fts5(" + text_columns + ", content='', tokenize='corvblank')");
  // Name matches filter and are never ranked, so the name index keeps no lengths.
  db->Exec("CREATE VIRTUAL TABLE fts_name USING fts5(" + name_columns + ", content='', columnsize=0, tokenize='trigram case_sensitive 1')");
  db->Exec("CREATE TABLE suggest(field TEXT NOT NULL, term TEXT NOT NULL, freq INTEGER NOT NULL, PRIMARY KEY(field, term)) WITHOUT ROWID");
  Statement& meta = db->Cached("INSERT INTO meta(name, value) VALUES(?, ?)");
  for (const auto& [name, value] : std::vector<std::pair<std::string, std::string>>{
           {"format", std::to_string(kFormatVersion)}, {"mappings", JsonToString(mappings)}, {"settings", JsonToString(settings)}}) {
    meta.Reset();
    meta.BindText(1, name);
    meta.BindText(2, value);
    meta.Step();
  }
  db->Exec("COMMIT");
  std::unique_ptr<IndexStore> store(new IndexStore(path, std::move(db)));
  store->LoadSchema();
  return store;
}

std::unique_ptr<IndexStore> IndexStore::Open(const std::string& directory) {
  const std::string path = DatabasePath(directory);
  struct stat info;
  if (stat(path.c_str(), &info) != 0) throw DaemonError(kCodeIndexFailed, "The index database is missing: " + path);
  std::unique_ptr<IndexStore> store(new IndexStore(path, std::make_unique<Database>(path, false)));
  store->writer_->Exec("PRAGMA journal_mode=WAL");
  store->writer_->Exec("PRAGMA synchronous=NORMAL");
  store->LoadSchema();
  return store;
}

void IndexStore::LoadSchema() {
  // 8 MiB: a first index of 16,000 files took the same CPU with half the
  // pages cached (the kernel's page cache holds the rest), and the daemon's
  // peak fell by about 20 MiB.
  writer_->Exec("PRAGMA cache_size=-8192");
  LimitWriteAheadLog();
  Statement& stmt = writer_->Cached("SELECT value FROM meta WHERE name = 'mappings'");
  if (!stmt.Step() || !JsonFromString(mappings_, stmt.Text(0))) {
    throw DaemonError(kCodeIndexFailed, "The index database " + path_ + " has no readable mappings");
  }
  stmt.Reset();
  schema_ = IndexSchema::FromMappings(mappings_);
  text_fields_ = schema_.TextFields();
  ngram_fields_ = schema_.NgramFields();
  auto statements = [](const std::string& table, const std::vector<std::string>& columns, std::string* insert, std::string* remove) {
    std::string names, marks;
    for (const std::string& column : columns) {
      names += ", " + column;
      marks += ", ?";
    }
    *insert = "INSERT INTO " + table + "(rowid" + names + ") VALUES(?" + marks + ")";
    *remove = "INSERT INTO " + table + "(" + table + ", rowid" + names + ") VALUES('delete', ?" + marks + ")";
  };
  std::vector<std::string> text_columns, name_columns;
  for (const FieldSpec* field : text_fields_) text_columns.push_back(field->Column());
  for (const FieldSpec* field : ngram_fields_) name_columns.push_back(field->NameColumn());
  statements("fts_text", text_columns, &insert_text_sql_, &delete_text_sql_);
  statements("fts_name", name_columns, &insert_name_sql_, &delete_name_sql_);
}

// ---------------------------------------------------------------- documents

void IndexStore::ValidateDocument(const Json::Value& document) const {
  if (!document.isObject()) BadDocument("a document must be a JSON object");
  for (const FieldSpec& field : schema_.fields()) {
    const bool present = document.isMember(field.name) && !document[field.name].isNull();
    if (!present) {
      if (field.required) BadDocument("the required field \"" + field.name + "\" is missing");
      continue;
    }
    const Json::Value& value = document[field.name];
    if (field.name == schema_.property_id() && (!value.isString() || value.asString().empty())) {
      BadDocument("the key field \"" + field.name + "\" must be a non-empty string");
    }
    ForEachValue(value, [&](const Json::Value& element) {
      switch (field.kind) {
        case FieldKind::kNumber:
          if (!element.isNumeric() || element.isBool()) BadDocument("the field \"" + field.name + "\" must be a number");
          break;
        case FieldKind::kBool:
          if (!element.isBool()) BadDocument("the field \"" + field.name + "\" must be true or false");
          break;
        default:
          if (!element.isString() && !element.isNumeric() && !element.isBool()) {
            BadDocument("the field \"" + field.name + "\" must be a string or an array of strings");
          }
      }
    });
  }
}

std::string IndexStore::EncodeDocument(const std::string& key, const Json::Value& document) const {
  return elasticd::EncodeDocument(schema_, key, document);
}

Json::Value IndexStore::DecodeDocument(const std::string& key, std::string_view stored) const {
  return elasticd::DecodeDocument(schema_, key, stored);
}

Json::Value IndexStore::VisibleFields(const Json::Value& document, const std::vector<std::string>& fields) const {
  Json::Value out(Json::objectValue);
  auto add = [&](const std::string& name) {
    const FieldSpec* field = schema_.Find(name);
    if (field != nullptr && !field->stored && name != schema_.property_id()) return;
    if (document.isMember(name)) out[name] = document[name];
  };
  if (fields.empty()) {
    for (const std::string& name : document.getMemberNames()) add(name);
  } else {
    for (const std::string& name : fields) add(name);
  }
  return out;
}

bool IndexStore::FindRow(const std::string& key, Row* row) {
  Statement& stmt = writer_->Cached("SELECT rowid, doc FROM docs WHERE key = ?");
  stmt.BindText(1, key);
  const bool found = stmt.Step();
  if (found) {
    row->rowid = stmt.Int(0);
    row->stored = std::string(stmt.Bytes(1));
  }
  stmt.Reset();
  return found;
}

void IndexStore::IndexEntries(int64_t rowid, const Json::Value& document, bool remove) {
  // The values handed to a contentless index on removal must be exactly the
  // ones it was given, so both directions are built here from the document.
  std::vector<std::string> columns;
  bool any = false;
  for (const FieldSpec* field : text_fields_) {
    std::string joined;
    ForEachValue(document[field->name], [&](const Json::Value& value) {
      WithValueText(value, [&](std::string_view text) {
        if (AnalyzeJoined(field->analyzer, text, &joined)) any = true;
      });
    });
    columns.push_back(std::move(joined));
  }
  if (any) pending_index_.Add(remove ? &delete_text_sql_ : &insert_text_sql_, rowid, std::move(columns));
  columns.clear();
  any = false;
  for (const FieldSpec* field : ngram_fields_) {
    std::string names;
    ForEachValue(document[field->name], [&](const Json::Value& value) {
      if (!names.empty()) names += '\n';
      WithValueText(value, [&](std::string_view text) { names += Fold(text, FoldMode::kSearch); });
    });
    any = any || !names.empty();
    columns.push_back(names);
  }
  if (any) pending_index_.Add(remove ? &delete_name_sql_ : &insert_name_sql_, rowid, std::move(columns));
}

void IndexStore::RemoveRow(int64_t rowid, const std::string& key, const std::string& stored) {
  IndexEntries(rowid, DecodeDocument(key, stored), true);
  Statement& stmt = writer_->Cached("DELETE FROM docs WHERE rowid = ?");
  stmt.Bind(1, rowid);
  stmt.Step();
  stmt.Reset();
  NoteKeyChange(rowid, std::nullopt);
  NoteDelete(key);
}

void IndexStore::NoteUpsert(const std::string& key) {
  deleted_.erase(key);
  if (upserted_.size() < kMaxTrackedChanges) {
    upserted_.insert(key);
  } else {
    truncated_ = true;
  }
}

void IndexStore::NoteDelete(const std::string& key) {
  upserted_.erase(key);
  if (deleted_.size() < kMaxTrackedChanges) {
    deleted_.insert(key);
  } else {
    truncated_ = true;
  }
}

void IndexStore::NoteKeyChange(int64_t rowid, std::optional<std::string> key) {
  if (!key_changes_complete_) return;
  if (key_changes_.size() >= kMaxKeyChanges) {
    // The directory is built again after such a transaction rather than kept in step.
    key_changes_complete_ = false;
    key_changes_.clear();
    key_changes_.shrink_to_fit();
    return;
  }
  key_changes_.emplace_back(rowid, std::move(key));
}

void IndexStore::Begin() {
  if (in_transaction_) return;
  writer_->Exec("BEGIN IMMEDIATE");
  in_transaction_ = true;
}

void IndexStore::Run(const char* sql) {
  Statement& stmt = writer_->Cached(sql);
  stmt.Step();
  stmt.Reset();
}

// One request's writes happen whole or not at all, inside the open transaction.
template <typename Body>
void IndexStore::Atomically(Body body) {
  // A long transaction must not hold its full-text rows in memory without bound.
  if (pending_index_.bytes() > kMaxPendingIndexBytes) FlushIndexWrites();
  Begin();
  const size_t mark = pending_index_.Mark();
  const size_t key_mark = key_changes_.size();
  Run("SAVEPOINT request");
  try {
    body();
  } catch (...) {
    pending_index_.DropAfter(mark);
    if (key_changes_.size() > key_mark) key_changes_.resize(key_mark);
    try {
      Run("ROLLBACK TO request");
      Run("RELEASE request");
    } catch (const std::exception&) {
      // The first failure is the one worth reporting. What the rows hold is
      // no longer known: the key directory is built again after the commit.
      key_changes_complete_ = false;
    }
    NoteLostTransaction();
    throw;
  }
  Run("RELEASE request");
  CommitStepIfLarge();
}

// Some failures (a full volume, an I/O error) make SQLite roll the whole
// transaction back; what was queued for it then belongs to nothing.
void IndexStore::NoteLostTransaction() {
  if (!in_transaction_ || sqlite3_get_autocommit(writer_->raw()) == 0) return;
  in_transaction_ = false;
  transaction_bytes_ = 0;
  pending_index_.Clear();
  key_changes_.clear();
  key_changes_complete_ = true;  // the rows are as last committed, as the directory is
  upserted_.clear();
  deleted_.clear();
  truncated_ = false;
}

// Hands the queued full-text rows to the engine, all or none (they stay
// queued when it fails, so a later commit tries again).
void IndexStore::FlushIndexWrites() {
  if (pending_index_.empty()) return;
  Begin();
  Run("SAVEPOINT index_writes");
  transaction_bytes_ += static_cast<int64_t>(pending_index_.bytes());
  try {
    pending_index_.ApplyTo(*writer_);
  } catch (...) {
    try {
      Run("ROLLBACK TO index_writes");
      Run("RELEASE index_writes");
    } catch (const std::exception&) {
      // The first failure is the one worth reporting.
    }
    NoteLostTransaction();
    throw;
  }
  Run("RELEASE index_writes");
}

void IndexStore::Upsert(const std::string& doc_id, const Json::Value& input) {
  if (!input.isObject()) BadDocument("\"data\" must be a JSON object");
  // The document is used as sent when it names its key (the indexer's
  // always do): a copy of a large text is megabytes the daemon holds twice.
  const std::string& id_field = schema_.property_id();
  const Json::Value* named = input.find(id_field.data(), id_field.data() + id_field.size());
  Json::Value with_key;
  if (named == nullptr || named->isNull()) {
    with_key = input;
    with_key[id_field] = doc_id;
  }
  const Json::Value& document = with_key.isNull() ? input : with_key;
  ValidateDocument(document);
  const std::string key = document[id_field].asString();
  Atomically([&] {
    Row row;
    // A document sent under an old key with a new key value moves to the new key.
    if (key != doc_id && FindRow(doc_id, &row)) RemoveRow(row.rowid, doc_id, row.stored);
    const std::string stored = EncodeDocument(key, document);
    if (FindRow(key, &row)) {
      IndexEntries(row.rowid, DecodeDocument(key, row.stored), true);
      Statement& update = writer_->Cached("UPDATE docs SET doc = ? WHERE rowid = ?");
      update.BindBlobInPlace(1, stored);  // `stored` outlives the reset below
      update.Bind(2, row.rowid);
      update.Step();
      update.Reset();
      transaction_bytes_ += static_cast<int64_t>(stored.size());
      NoteKeyChange(row.rowid, key);  // the same key, but the row's length in the word index may change
      IndexEntries(row.rowid, document, false);
    } else {
      Statement& insert = writer_->Cached("INSERT INTO docs(key, doc) VALUES(?, ?)");
      insert.BindText(1, key);
      insert.BindBlobInPlace(2, stored);  // `stored` outlives the reset below
      insert.Step();
      insert.Reset();
      transaction_bytes_ += static_cast<int64_t>(key.size() + stored.size());
      const int64_t rowid = sqlite3_last_insert_rowid(writer_->raw());
      NoteKeyChange(rowid, key);
      IndexEntries(rowid, document, false);
    }
    NoteUpsert(key);
  });
}

void IndexStore::SetById(const std::string& doc_id, const Json::Value& changes) {
  if (!changes.isObject()) BadDocument("\"data\" must be a JSON object");
  Atomically([&] {
    Row row;
    if (!FindRow(doc_id, &row)) throw DaemonError(kCodeDocumentNotFound, "No document with the id " + doc_id);
    const Json::Value old_document = DecodeDocument(doc_id, row.stored);
    Json::Value document = old_document;
    JsonApplyChanges(document, changes);
    ValidateDocument(document);
    const std::string key = document[schema_.property_id()].asString();
    IndexEntries(row.rowid, old_document, true);
    if (key != doc_id) {
      // A rename over an existing file: the moved document replaces it.
      Row target;
      if (FindRow(key, &target)) RemoveRow(target.rowid, key, target.stored);
      NoteDelete(doc_id);
    }
    Statement& update = writer_->Cached("UPDATE docs SET key = ?, doc = ? WHERE rowid = ?");
    const std::string stored = EncodeDocument(key, document);
    update.BindText(1, key);
    update.BindBlob(2, stored);
    update.Bind(3, row.rowid);
    update.Step();
    transaction_bytes_ += static_cast<int64_t>(key.size() + stored.size());
    update.Reset();
    NoteKeyChange(row.rowid, key);
    IndexEntries(row.rowid, document, false);
    NoteUpsert(key);
  });
}

bool IndexStore::DeleteById(const std::string& doc_id) {
  bool found = false;
  Atomically([&] {
    Row row;
    found = FindRow(doc_id, &row);
    if (found) RemoveRow(row.rowid, doc_id, row.stored);
  });
  return found;
}

int64_t IndexStore::DeleteByQuery(const Query& query) {
  int64_t deleted = 0;
  FlushIndexWrites();  // the query may read the full-text tables
  Atomically([&] {
    std::string condition;
    std::vector<SqlValue> values;
    query.Compile(false, &condition, &values);
    std::vector<int64_t> rowids;
    {
      auto select = writer_->Prepare("SELECT d.rowid FROM docs d WHERE " + condition);
      select->BindAll(values);
      while (select->Step()) rowids.push_back(select->Int(0));
    }
    Statement& load = writer_->Cached("SELECT key, doc FROM docs WHERE rowid = ?");
    for (const int64_t rowid : rowids) {
      load.Reset();
      load.Bind(1, rowid);
      if (!load.Step()) continue;
      const std::string key = load.Text(0);
      const std::string stored(load.Bytes(1));
      load.Reset();
      RemoveRow(rowid, key, stored);
      ++deleted;
      // Everything queued now is this request's own (the queue was emptied
      // above), so it may reach the engine inside the request's savepoint:
      // a failure rolls it back with the rest. This bounds the memory of a
      // delete of many documents.
      if (pending_index_.bytes() > kMaxPendingIndexBytes) pending_index_.ApplyTo(*writer_);
    }
  });
  return deleted;
}

Json::Value IndexStore::GetByQuery(const Query& query, const std::vector<std::string>& fields) {
  std::string condition;
  std::vector<SqlValue> values;
  query.Compile(false, &condition, &values);
  FlushIndexWrites();  // the query may read the full-text tables
  auto select = writer_->Prepare("SELECT d.key, d.doc FROM docs d WHERE " + condition + " ORDER BY d.key");
  select->BindAll(values);
  Json::Value out(Json::arrayValue);
  while (select->Step()) out.append(VisibleFields(DecodeDocument(select->Text(0), select->Bytes(1)), fields));
  return out;
}

void IndexStore::LimitWriteAheadLog() {
  // A restarted log is cut back to keep_bytes (it is only ever reused, never
  // shrunk, otherwise), and a commit checkpoints a log of more than 1,000
  // pages without waiting for readers (SQLite's passive auto-checkpoint).
  writer_->Exec("PRAGMA journal_size_limit=" + std::to_string(wal_limits_.keep_bytes));
  writer_->Exec("PRAGMA wal_autocheckpoint=1000");
}

void IndexStore::CommitTransaction() {
  keys_.BeginCommit();
  try {
    FlushIndexWrites();
    writer_->Exec("COMMIT");
  } catch (const std::exception&) {
    keys_.EndCommit(false, false, key_changes_);
    NoteLostTransaction();  // a full volume can make SQLite roll the transaction back
    throw;
  }
  in_transaction_ = false;
  transaction_bytes_ = 0;
  keys_.EndCommit(true, key_changes_complete_, key_changes_);
  key_changes_.clear();
  key_changes_complete_ = true;
}

void IndexStore::CommitStepIfLarge() {
  // What a transaction wrote sits in the page cache until the cache is full
  // and reaches the log at the latest at the commit, so the log's size shows
  // the transaction too late: the bytes given to SQLite and the full-text
  // rows still queued are counted instead.
  if (!in_transaction_ || transaction_bytes_ + static_cast<int64_t>(pending_index_.bytes()) < wal_limits_.step_bytes) {
    return;
  }
  CommitTransaction();
  // SQLite checkpoints by itself only past 1,000 pages; a step smaller than
  // that would otherwise let the log grow to 4 MB before it restarts.
  writer_->CheckpointPassive();
}

CommitChanges IndexStore::Commit() {
  CommitChanges changes;
  if (in_transaction_) CommitTransaction();
  changes.upserted.assign(upserted_.begin(), upserted_.end());
  changes.deleted.assign(deleted_.begin(), deleted_.end());
  changes.truncated = truncated_;
  upserted_.clear();
  deleted_.clear();
  truncated_ = false;
  return changes;
}

void IndexStore::Close(bool keep) {
  if (writer_ == nullptr) return;
  if (in_transaction_) {
    if (keep) FlushIndexWrites();
    pending_index_.Clear();
    // The store ends here: the directory is dropped, not updated, and only
    // after the commit, so that no search builds it again from the rows before.
    keys_.BeginCommit();
    try {
      writer_->Exec(keep ? "COMMIT" : "ROLLBACK");
    } catch (...) {
      keys_.EndCommit(false, false, key_changes_);
      throw;
    }
    keys_.EndCommit(false, false, key_changes_);
    key_changes_.clear();
    in_transaction_ = false;
  }
  {
    std::lock_guard<std::mutex> guard(readers_mutex_);
    readers_.clear();
  }
  writer_.reset();
}

void IndexStore::UpdateSuggestions(const std::string& name) {
  const FieldSpec* field = schema_.Find(name);
  if (field == nullptr || !field->HasTextColumn()) {
    throw DaemonError(kCodeBadArgument, "Suggestions need a text or keyword field; \"" + name + "\" is not one");
  }
  Atomically([&] {
    std::unordered_map<std::string, int64_t> counts;
    auto scan = writer_->Prepare("SELECT key, doc FROM docs");
    const Analyzer analyzer = field->kind == FieldKind::kKeyword ? Analyzer::kKeyword : Analyzer::kStandard;
    while (scan->Step()) {
      const Json::Value document = DecodeDocument(scan->Text(0), scan->Bytes(1));
      std::vector<std::string> tokens;
      ForEachValue(document[name], [&](const Json::Value& value) {
        WithValueText(value, [&](std::string_view text) { Analyze(analyzer, text, &tokens); });
      });
      std::sort(tokens.begin(), tokens.end());
      tokens.erase(std::unique(tokens.begin(), tokens.end()), tokens.end());
      for (const std::string& token : tokens) ++counts[token];
    }
    std::vector<std::pair<std::string, int64_t>> terms(counts.begin(), counts.end());
    if (terms.size() > kMaxSuggestionTerms) {
      std::nth_element(terms.begin(), terms.begin() + kMaxSuggestionTerms, terms.end(),
                       [](const auto& a, const auto& b) { return a.second > b.second; });
      terms.resize(kMaxSuggestionTerms);
    }
    Statement& clear = writer_->Cached("DELETE FROM suggest WHERE field = ?");
    clear.BindText(1, name);
    clear.Step();
    clear.Reset();
    Statement& insert = writer_->Cached("INSERT INTO suggest(field, term, freq) VALUES(?, ?, ?)");
    for (const auto& [term, count] : terms) {
      insert.Reset();
      insert.BindText(1, name);
      insert.BindText(2, term);
      insert.Bind(3, count);
      insert.Step();
    }
    insert.Reset();
  });
}

// ---------------------------------------------------------------- readers

std::unique_ptr<Database> IndexStore::TakeReader() {
  {
    std::lock_guard<std::mutex> guard(readers_mutex_);
    if (!readers_.empty()) {
      std::unique_ptr<Database> reader = std::move(readers_.back());
      readers_.pop_back();
      return reader;
    }
  }
  auto reader = std::make_unique<Database>(path_, false);
  reader->Exec("PRAGMA query_only=1");
  // Searches look up the lengths and keys of every candidate at random
  // places; a larger cache keeps the hot part of the index in memory.
  reader->Exec(std::string("PRAGMA cache_size=-") + std::to_string(kReaderCacheKb));
  return reader;
}

void IndexStore::ReturnReader(std::unique_ptr<Database> reader) {
  std::lock_guard<std::mutex> guard(readers_mutex_);
  if (readers_.size() < kMaxReaders) readers_.push_back(std::move(reader));
}

void IndexStore::BuildKeyDirectory(Database& reader) {
  if (!keys_.TryStartBuild()) return;
  const uint64_t at = keys_.generation();
  bool complete = false;
  try {
    reader.Exec("BEGIN");
    try {
      auto scan = reader.Prepare("SELECT rowid, key FROM docs");
      while (scan->Step()) keys_.Add(scan->Int(0), scan->Text(1));
      // The rows' lengths as BM25 reads them: a varint per column of the word index.
      auto sizes = reader.Prepare("SELECT id, sz FROM fts_text_docsize");
      while (sizes->Step()) keys_.AddLength(sizes->Int(0), TokenCount(sizes->Bytes(1)));
      complete = true;
    } catch (...) {
      reader.Exec("ROLLBACK");
      throw;
    }
    reader.Exec("COMMIT");
  } catch (const std::exception&) {
    complete = false;  // searches read the keys from "docs"; a later one builds again
  }
  keys_.FinishBuild(at, complete);
}

// What a search asks of SQL: its condition, the candidates' source and
// order. Ranked searches read "s.rank" from a full-text match joined to "docs".
struct IndexStore::SearchPlan {
  bool ranked = false;
  std::string condition;
  std::vector<SqlValue> values;  // of `condition` (and the match, when ranked)
  std::string rank_expression;
  int recency_code = -1;
  std::string from;
  std::string sort_expression = "NULL";
  std::string order = "d.key";
  // A word query alone (the usual search) is ordered from the full-text
  // index's scores; anything else by SQL.
  bool ranked_alone() const { return ranked && condition == "1"; }
};

IndexStore::SearchPlan IndexStore::PlanSearch(const Query& query, const SortSpec& sort) const {
  SearchPlan plan;
  plan.ranked = sort.by == SortSpec::By::kScore && query.HasRankedClause();
  if (plan.ranked) plan.values.push_back(query.RankedExpression());
  query.Compile(plan.ranked, &plan.condition, &plan.values);
  plan.rank_expression = WeightedRank(schema_);
  plan.recency_code = RecencyCode(schema_);
  plan.from = plan.ranked ? "(SELECT rowid, " + plan.rank_expression +
                                " AS rank FROM fts_text WHERE fts_text MATCH ?) s JOIN docs d ON d.rowid = s.rowid"
                          : "docs d";
  if (plan.ranked) {
    plan.order = "s.rank, d.key";
  } else if (sort.by == SortSpec::By::kKey) {
    plan.order = std::string("d.key") + (sort.descending ? " DESC" : "");
  } else if (sort.by == SortSpec::By::kField) {
    plan.sort_expression = "corv_field(d.key, d.doc, " + std::to_string(sort.code) + ")";
    if (sort.text) plan.sort_expression = "corv_fold(" + plan.sort_expression + ")";
    plan.order = plan.sort_expression + (sort.descending ? " DESC" : "") + ", d.key";
  }
  return plan;
}

std::unique_ptr<SearchCandidates> IndexStore::OpenCandidates(Database& reader, const Query& query, const SearchPlan& plan,
                                                             const NameTiers& tiers, uint64_t keys_at) {
  if (plan.ranked_alone()) {
    return std::make_unique<RankedMatchCandidates>(
        reader, query.RankedExpression(), WeightedRankWithLengths(schema_, RankedMatchCandidates::kLengthsParameter),
        tiers, plan.recency_code, &keys_, keys_at);
  }
  std::vector<SqlValue> select_values = plan.values;
  std::string order = plan.order;
  if (plan.ranked) {
    // Exact names, then names holding the words, then the rest; newest first on ties.
    std::string tier = "2";
    if (!tiers.name_expression().empty()) {
      std::string exact = "-1";
      for (const int64_t rowid : tiers.exact()) exact += ", " + std::to_string(rowid);
      tier = "CASE WHEN d.rowid IN (" + exact +
             ") THEN 0 WHEN d.rowid IN (SELECT rowid FROM fts_text WHERE fts_text MATCH ?) THEN 1 ELSE 2 END";
      select_values.push_back(tiers.name_expression());
    }
    const std::string recency =
        plan.recency_code >= 0 ? "corv_field(d.key, d.doc, " + std::to_string(plan.recency_code) + ") DESC, " : "";
    order = tier + ", s.rank, " + recency + "d.key";
  }
  const std::string sql = "SELECT d.rowid, d.key, " + std::string(plan.ranked ? "s.rank" : "0") + ", " +
                          plan.sort_expression + " FROM " + plan.from + " WHERE " + plan.condition + " ORDER BY " + order;
  auto select = reader.Prepare(sql);
  select->BindAll(select_values);
  return std::make_unique<StatementCandidates>(std::move(select), plan.ranked, &tiers);
}

void IndexStore::CollectHits(Database& reader, SearchCandidates& candidates, const SearchPlan& plan, size_t want,
                             size_t check_budget, const ReadableFilter& readable, SearchResult* result) const {
  std::vector<Hit> batch;
  std::vector<int64_t> rowids;
  size_t checked_past_page = 0;
  bool page_told = false;  // the candidates know the page is full
  bool more = true;
  Statement& load = reader.Cached("SELECT doc FROM docs WHERE rowid = ?");
  while (more) {
    more = NextBatch(candidates, &batch, &rowids);
    if (batch.empty()) break;
    const std::vector<bool> allowed = readable ? readable(KeysOf(batch)) : std::vector<bool>(batch.size(), true);
    for (size_t i = 0; i < batch.size(); ++i) {
      if (result->hits.size() >= want) ++checked_past_page;
      if (!allowed[i]) continue;
      ++result->total;
      if (result->hits.size() < want) {
        // Documents are read only for the hits that make the page.
        load.Reset();
        load.Bind(1, rowids[i]);
        if (load.Step()) batch[i].document = DecodeDocument(batch[i].key, load.Bytes(0));
        load.Reset();
        result->hits.push_back(std::move(batch[i]));
      }
    }
    if (result->hits.size() >= want) {
      if (!readable) {
        // Every hit is readable: the count needs no checks.
        result->total = CountMatches(reader, plan);
        return;
      }
      if (checked_past_page >= check_budget) {
        Hit rest;
        int64_t rowid = 0;
        result->total_exact = !candidates.Next(&rowid, &rest);
        return;
      }
      if (!page_told) {
        // From here on whole batches are only counted, until the budget is
        // spent: which candidates they are matters, not their order.
        const size_t left = check_budget - checked_past_page;
        const size_t batches = left / kFilterBatch + (left % kFilterBatch != 0 ? 1 : 0);
        candidates.CountOnly(batches > SIZE_MAX / kFilterBatch ? SIZE_MAX : batches * kFilterBatch);
        page_told = true;
      }
    }
  }
}

int64_t IndexStore::CountMatches(Database& reader, const SearchPlan& plan) {
  auto count = reader.Prepare("SELECT count(*) FROM " + plan.from + " WHERE " + plan.condition);
  count->BindAll(plan.values);
  count->Step();
  return count->Int(0);
}

SearchResult IndexStore::Search(const Query& query, const SortSpec& sort, size_t want, size_t check_budget,
                                const ReadableFilter& readable) {
  const SearchPlan plan = PlanSearch(query, sort);
  std::unique_ptr<Database> reader = TakeReader();
  if (plan.ranked_alone() && !keys_.ready()) BuildKeyDirectory(*reader);
  const uint64_t keys_at = keys_.generation();
  SearchResult result;
  // One read transaction: the hits, their documents and the count come from one snapshot.
  reader->Exec("BEGIN");
  try {
    // The snapshot is taken by the first read, here: the key directory
    // serves it when no commit began before that.
    const NameTiers tiers = plan.ranked ? NameTiers::Find(*reader, query, schema_) : NameTiers();
    const std::unique_ptr<SearchCandidates> candidates = OpenCandidates(*reader, query, plan, tiers, keys_at);
    CollectHits(*reader, *candidates, plan, want, check_budget, readable, &result);
  } catch (...) {
    reader->Exec("ROLLBACK");
    throw;
  }
  reader->Exec("COMMIT");
  ReturnReader(std::move(reader));
  return result;
}

std::vector<Suggestion> IndexStore::Suggest(const std::string& field, const std::string& prefix, size_t limit) {
  const FieldSpec* field_def = schema_.Find(field);
  const std::string folded = field_def != nullptr && field_def->kind == FieldKind::kKeyword
                                 ? [&] { std::vector<std::string> t; Analyze(Analyzer::kKeyword, prefix, &t); return t.empty() ? std::string() : t[0]; }()
                                 : Fold(prefix, FoldMode::kSearch);
  const std::string upper = PrefixUpperBound(folded);
  std::unique_ptr<Database> reader = TakeReader();
  std::vector<Suggestion> out;
  {
    auto select = reader->Prepare(std::string("SELECT term, freq FROM suggest WHERE field = ? AND term >= ?") +
                                  (upper.empty() ? "" : " AND term < ?") + " ORDER BY freq DESC, term LIMIT ?");
    int bind = 1;
    select->BindText(bind++, field);
    select->BindText(bind++, folded);
    if (!upper.empty()) select->BindText(bind++, upper);
    select->Bind(bind, static_cast<int64_t>(limit));
    while (select->Step()) {
      Suggestion suggestion;
      suggestion.term = select->Text(0);
      std::replace(suggestion.term.begin(), suggestion.term.end(), '\x1F', ' ');
      suggestion.frequency = select->Int(1);
      out.push_back(std::move(suggestion));
    }
  }
  ReturnReader(std::move(reader));
  return out;
}

}  // namespace elasticd
}  // namespace corvlumex
