// The order people expect from a word search: a file or folder whose name
// is exactly what they typed, then those whose name holds the words, then
// the rest; within each, BM25 with per-field weights (a word in a name or
// title counts more than one deep in the content); newer files first
// when that still ties, then key order.
#pragma once

#include <cstdint>
#include <string>
#include <unordered_set>

#include "programs/corvelasticd/index_schema.h"
#include "programs/corvelasticd/query.h"
#include "programs/corvelasticd/sqlite_db.h"

namespace corvlumex {
namespace elasticd {

class NameTiers {
 public:
  // Reads, in the reader's open transaction, which documents match the
  // query's driving clause in their names, and which are named exactly so.
  static NameTiers Find(Database& reader, const Query& query, const IndexSchema& schema);

  // 0: the name is exactly the words (an extension aside), 1: the name holds
  // them, 2: only other fields do.
  int Tier(int64_t rowid) const;
  // Added to the BM25 score, so scores order hits across indexes the same way.
  double Bonus(int64_t rowid) const { return (2 - Tier(rowid)) * 1e6; }
  const std::unordered_set<int64_t>& exact() const { return exact_; }
  // The name clause (empty: no tiers), to select the named ones in SQL.
  const std::string& name_expression() const { return name_expression_; }

 private:
  std::unordered_set<int64_t> exact_, named_;
  std::string name_expression_;
};

// bm25(fts_text, ...) with a weight for each column of the word index.
std::string WeightedRank(const IndexSchema& schema);
// The same score by corv_bm25 (rank_function.h), its row lengths bound to parameter `lengths`.
std::string WeightedRankWithLengths(const IndexSchema& schema, int lengths);

// Field code of the recency tie-break, or -1 when the schema has none.
int RecencyCode(const IndexSchema& schema);

}  // namespace elasticd
}  // namespace corvlumex
