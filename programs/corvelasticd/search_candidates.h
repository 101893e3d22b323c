// The candidates of one search, one at a time in the order of the answer,
// each with its document's row and key. The access check and paging read
// them only as far as the page and the count need.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "programs/corvelasticd/index_store.h"
#include "programs/corvelasticd/key_directory.h"
#include "programs/corvelasticd/search_ranking.h"
#include "programs/corvelasticd/sqlite_db.h"

namespace corvlumex {
namespace elasticd {

class SearchCandidates {
 public:
  virtual ~SearchCandidates() = default;
  // Fills the next candidate (key, score, sort value); false when there is none.
  virtual bool Next(int64_t* rowid, Hit* hit) = 0;
  // The caller's page is full: of the next `count` candidates it only
  // counts the readable ones, and past them it asks only whether one more
  // exists. They must be the same `count` candidates as in the full order,
  // but may come in any order among themselves.
  virtual void CountOnly(size_t /*count*/) {}
};

// The rows of a statement that selects (rowid, key, rank or 0, sort value).
class StatementCandidates : public SearchCandidates {
 public:
  // `tiers` (may be null) adds the name tier to the scores of ranked rows.
  StatementCandidates(std::unique_ptr<Statement> select, bool ranked, const NameTiers* tiers)
      : select_(std::move(select)), ranked_(ranked), tiers_(tiers) {}
  bool Next(int64_t* rowid, Hit* hit) override;

 private:
  std::unique_ptr<Statement> select_;
  bool ranked_;
  const NameTiers* tiers_;
  // SQLite starts a finished statement over when stepped again: a search
  // that had counted every candidate then called its total inexact.
  bool done_ = false;
};

// The matches of one full-text expression, best first (name tier, then
// `rank_expression`), ties newest first (field `recency_code`, -1: none),
// then in key order.
// Every match is scored, but a match's key is read from "docs" (a random
// page of a large table) only when the caller reaches it: a word found in
// many documents costs one score each, not a document lookup and a sort
// of every match. Keys are read for a window of matches at a time, in one
// statement.
class RankedMatchCandidates : public SearchCandidates {
 public:
  // `keys` (may be null) gives the keys when it is at generation `keys_at`
  // (the reader's snapshot), else they are read from "docs"; so for the
  // rows' lengths, when `rank_expression` scores with corv_bm25 and takes
  // them from parameter kLengthsParameter.
  RankedMatchCandidates(Database& reader, const std::string& match, const std::string& rank_expression,
                        const NameTiers& tiers, int recency_code, const KeyDirectory* keys, uint64_t keys_at);
  static constexpr int kLengthsParameter = 2;
  bool Next(int64_t* rowid, Hit* hit) override;
  // Runs of equal scores that lie wholly inside the counted candidates (or
  // past them) are then left unordered: ordering one reads each member's
  // date from its document, a random page of "docs", and a prefix matches
  // a thousand documents whose scores mostly tie.
  void CountOnly(size_t count) override;

 private:
  struct Candidate {
    double rank;  // tier bonus taken off: lower is better
    int64_t rowid;
    std::string key;
    bool found;
    SqlValue recency = nullptr;
  };
  // Reads the recency of a run of equal scores and orders it.
  void OrderRun(size_t begin, size_t end);
  // Whether the run of candidates served at positions [begin, end) must be ordered.
  bool RunNeedsOrder(size_t begin, size_t end) const;
  // Reads the keys of the next window of matches (whole runs of equal
  // scores) and puts each run in key order.
  bool LoadNextWindow();

  Statement& keys_of_rows_;
  Database& reader_;
  int recency_code_;
  const KeyDirectory* keys_;
  uint64_t keys_at_;
  std::vector<std::pair<double, int64_t>> ranked_;  // (rank, rowid), best (lowest rank) first
  size_t next_ = 0;
  std::vector<Candidate> window_;
  size_t window_next_ = 0;
  size_t served_ = 0;       // candidates handed out by Next
  bool count_only_ = false;  // CountOnly was called: order matters only at `cut_`
  size_t cut_ = 0;           // the position where the caller stops counting
};

}  // namespace elasticd
}  // namespace corvlumex
