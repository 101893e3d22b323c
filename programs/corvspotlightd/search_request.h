// What a `_search` body from Samba's Spotlight back end asks for. Two shapes
// are read, the only two Samba has sent:
//   Samba up to 4.22.5 / 4.23.2:
//     {"from", "size", "_source": ["path.real"],
//      "query": {"query_string": {"query": "(<expr>) AND path.real.fulltext:\"<scope>\""}}}
//   later ones:
//     {"from", "size", "_source": [...],
//      "query": {"bool": {"filter": [{"prefix": {"path.real": "<scope>/"}}],
//                         "must": [{"query_string": {"query": "<expr>", "fields": [...]}}]}}}
// Anything else is refused with a SearchRequestError naming the fault; the
// body is untrusted (any local process may send one).
#pragma once

#include <stdexcept>
#include <string>
#include <vector>

namespace corvlumex {
namespace spotlightd {

class SearchRequestError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Bounds of one page, as corvelasticd takes them.
constexpr int kMaxPageSize = 1000;
constexpr int kMaxPageEnd = 100000;

struct SearchRequest {
  int from = 0;
  int size = 10;
  std::string query;                // the query string
  std::vector<std::string> fields;  // query_string.fields: where words without a field go ("" = ours)
  std::string scope;                // the bool shape's path prefix, "" when none
};

SearchRequest ParseSearchRequest(const std::string& body);

}  // namespace spotlightd
}  // namespace corvlumex
