// Translates a query string of Samba's Spotlight back end into a clause of
// corvelasticd's search language.
//
// Field names are those of our mappings file (our document fields, see
// docs/spotlight.md); how a value is searched follows the field's kind in
// the index mappings:
//   name (CORVMDFSName)  no wildcard: the whole name; "x*": names starting
//                        with x; "*x" or "*x*": names containing x
//   default fields       every word is searched in each of them; on the name
//                        always as a fragment ("port" finds "Report 2023.pdf")
//   text                 the words; "x*": words starting with x; a phrase or a
//                        value with spaces: the words in that order
//   keyword              the whole value, case-insensitive; "x*": values
//                        starting with x (MIME lists such as image\/*)
//   the key (paths)      exact path; "x*": paths starting with x
//   numbers, dates       equality and ranges; ISO dates are passed on as such
// "path.real.fulltext" (the share scope of Samba 4.17) and "path.real" are
// our key: a phrase there means "below that folder".
//
// Faults (unknown field, a wildcard where the field has no such search, a
// bound that is not a number or date) throw QueryStringError.
#pragma once

#include <json/json.h>

#include <map>
#include <string>
#include <vector>

#include "programs/corvspotlightd/query_string_parser.h"

namespace corvlumex {
namespace spotlightd {

enum class FieldKind { kName, kText, kKeyword, kKey, kNumber, kBool };

// Our document fields and how each is searched.
class FieldTable {
 public:
  // From the index mappings corvelasticd was given (property_id, default,
  // properties); the n-gram field becomes the name's fragment search.
  static FieldTable FromMappings(const Json::Value& mappings);

  // Nullptr for a field the index does not have.
  const FieldKind* Find(const std::string& field) const;
  const std::string& key_field() const { return key_field_; }
  const std::string& fragment_field() const { return fragment_field_; }

 private:
  std::map<std::string, FieldKind> kinds_;
  std::string key_field_;
  std::string fragment_field_;  // the n-gram field searched for name fragments
};

struct TranslatedQuery {
  Json::Value clause;               // corvelasticd's "qsl"
  std::vector<std::string> scopes;  // folders named by path.real(.fulltext) phrases
};

// `default_fields` are searched for words without a field.
TranslatedQuery TranslateQueryString(const std::string& query, const std::vector<std::string>& default_fields,
                                     const FieldTable& fields);

}  // namespace spotlightd
}  // namespace corvlumex
