// One index on disk: an SQLite database in WAL mode holding the documents
// (table "docs", keyed by the mappings' "property_id" value), a contentless
// word index (fts_text) and a contentless trigram index of names (fts_name).
// Text is stored once, in "docs"; the indexes keep only tokens.
//
// Writes go through one writer connection inside an open transaction that
// "commit" ends, so searches (reader connections) see only committed data
// while the writer's own later requests see its uncommitted writes.
//
// The write-ahead log holds a whole transaction until it is committed, so a
// folder's first index (one batch, one "commit") would need the index's size
// twice over on disk. A transaction that has written more than
// WalLimits::step_bytes is therefore committed in steps: searches may see the
// first part of such a long batch before its "commit", and the log,
// checkpointed after each step and cut back to WalLimits::keep_bytes when it
// restarts, stays near the step's size.
#pragma once

#include <json/json.h>

#include <functional>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "programs/corvelasticd/index_schema.h"
#include "programs/corvelasticd/key_directory.h"
#include "programs/corvelasticd/pending_index_writes.h"
#include "programs/corvelasticd/query.h"
#include "programs/corvelasticd/sqlite_db.h"

namespace corvlumex {
namespace elasticd {

class NameTiers;
class SearchCandidates;

// Keys changed since the last commit, for the event handler.
struct CommitChanges {
  std::vector<std::string> upserted;
  std::vector<std::string> deleted;
  bool truncated = false;  // more keys changed than are tracked
};

struct SortSpec {
  enum class By { kScore, kKey, kField };
  By by = By::kKey;
  int code = -1;        // kField
  bool text = false;    // kField: compared folded, as text
  bool descending = false;
};

struct Hit {
  std::string key;
  double score = 0;
  SqlValue sort_value = nullptr;
  Json::Value document;  // every field, names restored
};

struct SearchResult {
  std::vector<Hit> hits;   // the first `want` readable hits, in order
  int64_t total = 0;       // readable hits counted
  bool total_exact = true; // false when counting stopped at the check budget
};

// Given keys, says which the asking user may read.
using ReadableFilter = std::function<std::vector<bool>(const std::vector<std::string>& keys)>;

struct Suggestion {
  std::string term;
  int64_t frequency = 0;
};

// Bounds on the write-ahead log; the defaults suit the daemon, tests make them small.
struct WalLimits {
  int64_t step_bytes = 32 << 20;  // a transaction writing more is committed in steps
  int64_t keep_bytes = 32 << 20;  // the log is cut back to this when it restarts
};

class IndexStore {
 public:
  // Applies to stores opened afterwards; the daemon keeps the defaults.
  static void SetWalLimits(const WalLimits& limits);

  static std::string DatabasePath(const std::string& directory);
  // A new database in `directory` (created when missing). Throws DaemonError.
  static std::unique_ptr<IndexStore> Create(const std::string& directory, const Json::Value& mappings,
                                            const Json::Value& settings);
  static std::unique_ptr<IndexStore> Open(const std::string& directory);
  ~IndexStore();

  const IndexSchema& schema() const { return schema_; }
  const Json::Value& mappings() const { return mappings_; }

  // ---- writer side: the caller lets one request at a time in ----
  void Upsert(const std::string& doc_id, const Json::Value& document);
  // Merges `changes` into the stored document; a changed key moves it.
  void SetById(const std::string& doc_id, const Json::Value& changes);
  bool DeleteById(const std::string& doc_id);
  int64_t DeleteByQuery(const Query& query);
  // Matching documents in key order with the asked fields (all stored ones
  // when `fields` is empty), uncommitted writes included.
  Json::Value GetByQuery(const Query& query, const std::vector<std::string>& fields);
  CommitChanges Commit();
  // Ends the writer: commits (`keep`) or drops what is pending, closes every connection.
  void Close(bool keep);
  void UpdateSuggestions(const std::string& field);

  // ---- reader side: any number of callers ----
  // The first `want` readable hits in order; readable hits are counted on
  // up to `check_budget` candidates past them. A null filter reads all.
  SearchResult Search(const Query& query, const SortSpec& sort, size_t want, size_t check_budget,
                      const ReadableFilter& readable);
  std::vector<Suggestion> Suggest(const std::string& field, const std::string& prefix, size_t limit);

  // Document JSON with names restored and unstored fields removed.
  Json::Value VisibleFields(const Json::Value& document, const std::vector<std::string>& fields) const;

 private:
  IndexStore(const std::string& path, std::unique_ptr<Database> writer);
  void LoadSchema();

  // Writer helpers.
  void Begin();
  void ValidateDocument(const Json::Value& document) const;
  std::string EncodeDocument(const std::string& key, const Json::Value& document) const;
  Json::Value DecodeDocument(const std::string& key, std::string_view stored) const;
  struct Row {
    int64_t rowid = 0;
    std::string stored;
  };
  bool FindRow(const std::string& key, Row* row);
  // Adds (`remove` false) or removes the index entries of a document.
  void IndexEntries(int64_t rowid, const Json::Value& document, bool remove);
  void RemoveRow(int64_t rowid, const std::string& key, const std::string& stored);
  void NoteUpsert(const std::string& key);
  void NoteDelete(const std::string& key);
  template <typename Body>
  void Atomically(Body body);
  void FlushIndexWrites();
  void NoteLostTransaction();
  // Commits the open transaction; the changed keys stay for the client's commit.
  void CommitTransaction();
  // Commits a transaction that has written more than WalLimits::step_bytes.
  void CommitStepIfLarge();
  void LimitWriteAheadLog();
  // Runs a statement without parameters that returns no rows, kept prepared.
  void Run(const char* sql);

  // The key of a changed row, for the key directory at commit.
  void NoteKeyChange(int64_t rowid, std::optional<std::string> key);
  // Fills the key directory from one snapshot of "docs" (once, by one reader).
  void BuildKeyDirectory(Database& reader);

  // Search steps, in one read transaction of `reader`.
  struct SearchPlan;
  SearchPlan PlanSearch(const Query& query, const SortSpec& sort) const;
  // The candidates in the answer's order; `tiers` must outlive them.
  std::unique_ptr<SearchCandidates> OpenCandidates(Database& reader, const Query& query, const SearchPlan& plan,
                                                   const NameTiers& tiers, uint64_t keys_at);
  // Filters the candidates by `readable` in batches, reads the documents of
  // the page and counts readable hits as far as `check_budget` allows.
  void CollectHits(Database& reader, SearchCandidates& candidates, const SearchPlan& plan, size_t want,
                   size_t check_budget, const ReadableFilter& readable, SearchResult* result) const;
  static int64_t CountMatches(Database& reader, const SearchPlan& plan);

  // Reader pool.
  std::unique_ptr<Database> TakeReader();
  void ReturnReader(std::unique_ptr<Database> reader);

  std::string path_;
  WalLimits wal_limits_;
  std::unique_ptr<Database> writer_;
  bool in_transaction_ = false;
  int64_t transaction_bytes_ = 0;  // document and full-text rows given to SQLite since BEGIN
  Json::Value mappings_;
  IndexSchema schema_;
  std::vector<const FieldSpec*> text_fields_;
  std::vector<const FieldSpec*> ngram_fields_;
  std::string insert_text_sql_, delete_text_sql_, insert_name_sql_, delete_name_sql_;
  PendingIndexWrites pending_index_;
  std::set<std::string> upserted_, deleted_;
  bool truncated_ = false;

  KeyDirectory keys_;
  std::vector<KeyDirectory::Change> key_changes_;  // of the open transaction
  bool key_changes_complete_ = true;

  std::mutex readers_mutex_;
  std::vector<std::unique_ptr<Database>> readers_;
};

}  // namespace elasticd
}  // namespace corvlumex
