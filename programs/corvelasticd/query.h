// The search language: a "qsl" clause tree parsed against an index's schema
// and turned into one SQL condition over that index's tables.
//
// Clauses (each an object with one key):
//   {"match_all": {}}
//   {"match": {"<field>|_all": "words" | {"query": "words", "operator": "and"|"or"}}}
//   {"term": {"<field>": value}}        {"terms": {"<field>": [values]}}
//   {"prefix": {"<field>": "start"}}
//   {"range": {"<field>": {"gt"|"gte"|"lt"|"lte": number or date}}}
//   {"bool": {"must": [...], "filter": [...], "should": [...], "must_not": [...]}}
#pragma once

#include <json/json.h>

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "programs/corvelasticd/index_schema.h"
#include "programs/corvelasticd/sqlite_db.h"

namespace corvlumex {
namespace elasticd {

struct QueryNode {
  enum class Type { kMatchAll, kNone, kText, kName, kKeyIn, kKeyPrefix, kNumberRange, kNumberIn, kBool };
  Type type = Type::kMatchAll;
  std::string fts;                 // kText, kName: the full-text expression
  std::string substring;           // kName shorter than a trigram: folded text scanned for
  int code = -1;                   // field code (kName scan, kNumber*)
  std::vector<std::string> keys;   // kKeyIn
  std::string prefix;              // kKeyPrefix
  SqlValue low = nullptr, high = nullptr;
  bool low_inclusive = true, high_inclusive = true;
  std::vector<SqlValue> numbers;   // kNumberIn
  std::vector<QueryNode> must, should, must_not;
  // kText on the catch-all field: the same words within file names only
  // (ranks name matches first), and the words a name must consist of to be
  // an exact match (empty when the clause cannot give one, as a prefix).
  std::string name_fts;
  std::vector<std::string> exact_name_tokens;
};

class Query {
 public:
  // Parses the clause (the value of "qsl"); a null clause is match_all.
  // Throws DaemonError kCodeBadQuery naming the faulty part.
  static Query Parse(const Json::Value& clause, const IndexSchema& schema);

  // The SQL condition over "docs d" and its bound values. When `ranked`, the
  // first full-text clause that every hit must satisfy drives the query and
  // gives the relevance; RankedExpression() is then its expression.
  void Compile(bool ranked, std::string* condition, std::vector<SqlValue>* values) const;
  bool HasRankedClause() const { return ranked_ != nullptr; }
  const std::string& RankedExpression() const { return ranked_->fts; }
  // The driving clause's words within names, and the tokens of an exact
  // name; empty when it has none (see QueryNode).
  const std::string& RankedNameExpression() const { return ranked_->name_fts; }
  const std::vector<std::string>& ExactNameTokens() const { return ranked_->exact_name_tokens; }

  // Folded words the query looks for, to highlight them in a snippet.
  const std::set<std::string>& HighlightTokens() const { return highlight_; }

 private:
  void CompileNode(const QueryNode& node, bool ranked, std::string* sql, std::vector<SqlValue>* values) const;

  std::shared_ptr<QueryNode> root_;
  const QueryNode* ranked_ = nullptr;
  std::set<std::string> highlight_;
};

// One token or phrase in the full-text index's expression syntax, quotes doubled.
std::string FtsPhrase(const std::vector<std::string>& tokens);

// The exclusive upper bound of keys that start with `prefix` (empty when
// there is none: the prefix is all 0xFF bytes).
std::string PrefixUpperBound(const std::string& prefix);

}  // namespace elasticd
}  // namespace corvlumex
