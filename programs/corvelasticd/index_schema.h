// How an index stores each field, decided once from the "mappings" object
// given at index_create and kept in the index's database.
#pragma once

#include <json/json.h>

#include <map>
#include <string>
#include <vector>

#include "programs/corvelasticd/text_analysis.h"

namespace corvlumex {
namespace elasticd {

enum class FieldKind {
  kKeyword,  // whole value, one token (term, terms, prefix)
  kText,     // analyzed words (match)
  kNgram,    // "ngram" preprocess: substring search on the name index, and its words in the text index
  kNumber,   // "int" / "double": term and range
  kBool,
};

struct FieldSpec {
  std::string name;
  int code = 0;            // the field's number in stored documents and its index column "f<code>"
  FieldKind kind = FieldKind::kText;
  Analyzer analyzer = Analyzer::kStandard;
  bool in_all = true;      // part of the catch-all field "_all"
  bool stored = true;      // returned to searches
  bool required = false;
  bool integer = false;    // kNumber: "int" rather than "double"

  // Has a column in the word index (keyword, text, and the words of n-gram fields).
  bool HasTextColumn() const { return kind == FieldKind::kKeyword || kind == FieldKind::kText || kind == FieldKind::kNgram; }
  std::string Column() const { return "f" + std::to_string(code); }
  std::string NameColumn() const { return "n" + std::to_string(code); }
};

class IndexSchema {
 public:
  // Throws DaemonError kCodeBadMappings naming what is wrong.
  static IndexSchema FromMappings(const Json::Value& mappings);

  const std::string& property_id() const { return property_id_; }
  const std::vector<FieldSpec>& fields() const { return fields_; }
  // nullptr for a field the mappings do not name.
  const FieldSpec* Find(const std::string& name) const;
  const FieldSpec* FindCode(int code) const;
  const FieldSpec& KeyField() const { return *Find(property_id_); }

  // Columns of the word index and of the name index, in table order.
  std::vector<const FieldSpec*> TextFields() const;
  std::vector<const FieldSpec*> NgramFields() const;

 private:
  std::string property_id_;
  std::vector<FieldSpec> fields_;
  std::map<std::string, size_t> by_name_;
};

}  // namespace elasticd
}  // namespace corvlumex
