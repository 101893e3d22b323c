// The query strings Samba's Spotlight back end writes (a subset of the
// Lucene syntax its Elasticsearch back end speaks), read into a tree.
//
// Grammar, as Samba produces it:
//   expression := and ("OR" and)*          (two clauses side by side: OR too)
//   and        := unary ("AND" unary)*
//   unary      := "NOT" unary | "(" expression ")" | clause
//   clause     := [field ":"] value
//   value      := word | "phrase" | "(" word... ")" | ("["|"{") bound "TO" bound ("]"|"}")
// A backslash escapes the next character anywhere, field names included
// ("meta\:duration" is the field "meta:duration"). An unescaped "*" at the
// start or end of a word is a wildcard; one inside a word is refused, as is
// "?", since the index has no such search. "&&", "||" and "!" are taken for
// AND, OR and NOT.
//
// Every fault throws QueryStringError naming what was wrong and where;
// nesting deeper than kMaxQueryDepth is a fault, so no query can exhaust
// the stack.
#pragma once

#include <stdexcept>
#include <string>
#include <vector>

namespace corvlumex {
namespace spotlightd {

constexpr int kMaxQueryDepth = 32;

class QueryStringError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// One value: its text without escapes and wildcards.
struct QueryWord {
  std::string text;
  bool leading_wildcard = false;
  bool trailing_wildcard = false;
  bool phrase = false;  // written in double quotes
  bool IsMatchAll() const { return text.empty() && (leading_wildcard || trailing_wildcard); }
};

// A range bound; `open` for "*".
struct QueryBound {
  std::string text;
  bool open = true;
  bool inclusive = false;
};

struct QueryNode {
  enum class Kind { kAnd, kOr, kNot, kWords, kRange };
  Kind kind = Kind::kWords;
  std::vector<QueryNode> children;  // kAnd, kOr: two or more; kNot: one
  std::string field;                // kWords, kRange: "" for the default fields
  std::vector<QueryWord> words;     // kWords: one, or the OR list field:(a b)
  QueryBound low, high;             // kRange
};

QueryNode ParseQueryString(const std::string& query);

}  // namespace spotlightd
}  // namespace corvlumex
