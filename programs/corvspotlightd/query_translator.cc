#include "programs/corvspotlightd/query_translator.h"

#include <cstdlib>
#include <utility>

#include "fileindex/elastic/schema.h"

namespace corvlumex {
namespace spotlightd {
namespace {

// Samba writes the share scope against these fields, whatever the mappings.
constexpr const char* kScopeFields[] = {"path.real.fulltext", "path.real"};

bool IsScopeField(const std::string& field) {
  for (const char* scope : kScopeFields) {
    if (field == scope) return true;
  }
  return false;
}

Json::Value Clause(const char* kind, const std::string& field, Json::Value argument) {
  Json::Value body(Json::objectValue);
  body[field] = std::move(argument);
  Json::Value clause(Json::objectValue);
  clause[kind] = std::move(body);
  return clause;
}

Json::Value Bool(const char* occur, std::vector<Json::Value> clauses) {
  if (clauses.size() == 1 && std::string(occur) != "must_not") return clauses.front();
  Json::Value list(Json::arrayValue);
  for (Json::Value& clause : clauses) list.append(std::move(clause));
  Json::Value body(Json::objectValue);
  body[occur] = std::move(list);
  Json::Value clause(Json::objectValue);
  clause["bool"] = std::move(body);
  return clause;
}

// A number stays a number; anything else (an ISO date) is left for the
// search daemon to read, which knows the date forms.
Json::Value NumberOrDate(const std::string& text) {
  char* end = nullptr;
  const long long integer = strtoll(text.c_str(), &end, 10);
  if (!text.empty() && *end == '\0') return Json::Value(static_cast<Json::Int64>(integer));
  const double number = strtod(text.c_str(), &end);
  if (!text.empty() && *end == '\0') return Json::Value(number);
  return Json::Value(text);
}

bool HasBlank(const std::string& text) { return text.find_first_of(" \t") != std::string::npos; }

class Translator {
 public:
  Translator(const std::vector<std::string>& default_fields, const FieldTable& fields)
      : default_fields_(default_fields), fields_(fields) {}

  Json::Value Node(const QueryNode& node) {
    switch (node.kind) {
      case QueryNode::Kind::kAnd:
      case QueryNode::Kind::kOr: {
        std::vector<Json::Value> clauses;
        for (const QueryNode& child : node.children) clauses.push_back(Node(child));
        return Bool(node.kind == QueryNode::Kind::kAnd ? "must" : "should", std::move(clauses));
      }
      case QueryNode::Kind::kNot:
        return Bool("must_not", {Node(node.children.front())});
      case QueryNode::Kind::kRange:
        return Range(node);
      case QueryNode::Kind::kWords:
        break;
    }
    std::vector<Json::Value> clauses;
    for (const QueryWord& word : node.words) clauses.push_back(Words(node.field, word));
    return Bool("should", std::move(clauses));
  }

  std::vector<std::string> TakeScopes() { return std::move(scopes_); }

 private:
  FieldKind KindOf(const std::string& field) const {
    const FieldKind* kind = fields_.Find(field);
    if (kind == nullptr) throw QueryStringError("unknown field \"" + field + "\" (not one of the index's fields)");
    return *kind;
  }

  Json::Value Words(const std::string& field, const QueryWord& word) {
    if (field.empty()) {
      if (default_fields_.empty()) throw QueryStringError("a word without a field, and no default fields");
      std::vector<Json::Value> clauses;
      for (const std::string& name : default_fields_) {
        clauses.push_back(KindOf(name) == FieldKind::kName ? Fragment(word) : FieldWord(name, word));
      }
      return Bool("should", std::move(clauses));
    }
    if (IsScopeField(field)) {
      if (word.leading_wildcard || word.trailing_wildcard || word.text.empty()) {
        throw QueryStringError("the scope \"" + field + "\" takes a folder, not a pattern");
      }
      scopes_.push_back(word.text);
      std::string prefix = word.text;
      if (prefix.back() != '/') prefix += '/';
      return Clause("prefix", fields_.key_field(), prefix);
    }
    return FieldWord(field, word);
  }

  // Any name holding the text (the n-gram field), or every name for "*".
  Json::Value Fragment(const QueryWord& word) const {
    if (word.text.empty()) return MatchAll();
    return Clause("match", fields_.fragment_field(), word.text);
  }

  static Json::Value MatchAll() {
    Json::Value clause(Json::objectValue);
    clause["match_all"] = Json::Value(Json::objectValue);
    return clause;
  }

  Json::Value FieldWord(const std::string& field, const QueryWord& word) const {
    const FieldKind kind = KindOf(field);
    if (word.IsMatchAll()) return MatchAll();
    if (word.text.empty()) throw QueryStringError("empty value for \"" + field + "\"");
    switch (kind) {
      case FieldKind::kName:
        if (word.leading_wildcard) return Fragment(word);
        return Clause(word.trailing_wildcard ? "prefix" : "term", field, word.text);
      case FieldKind::kText:
        if (word.trailing_wildcard) return Clause("prefix", field, word.text);
        if (word.phrase || HasBlank(word.text)) return Phrase(field, word.text);
        return Clause("match", field, word.text);
      case FieldKind::kKeyword:
      case FieldKind::kKey:
        if (word.leading_wildcard) {
          throw QueryStringError("\"" + field + "\" cannot be searched for values ending in \"" + word.text + "\"");
        }
        return Clause(word.trailing_wildcard ? "prefix" : "term", field, word.text);
      case FieldKind::kNumber: {
        if (word.leading_wildcard || word.trailing_wildcard) {
          throw QueryStringError("\"" + field + "\" holds numbers or dates: no wildcards");
        }
        // Equality as a closed range: dates compare as the seconds they name.
        Json::Value bounds(Json::objectValue);
        bounds["gte"] = NumberOrDate(word.text);
        bounds["lte"] = bounds["gte"];
        return Clause("range", field, bounds);
      }
      case FieldKind::kBool:
        return Clause("term", field, word.text);
    }
    return MatchAll();
  }

  // The words next to each other, in this order.
  static Json::Value Phrase(const std::string& field, const std::string& text) {
    return Clause("match_phrase", field, text);
  }

  Json::Value Range(const QueryNode& node) const {
    if (node.field.empty()) throw QueryStringError("a range needs a field");
    if (KindOf(node.field) != FieldKind::kNumber) {
      throw QueryStringError("\"" + node.field + "\" holds no numbers or dates: no ranges");
    }
    Json::Value bounds(Json::objectValue);
    if (!node.low.open) bounds[node.low.inclusive ? "gte" : "gt"] = NumberOrDate(node.low.text);
    if (!node.high.open) bounds[node.high.inclusive ? "lte" : "lt"] = NumberOrDate(node.high.text);
    if (bounds.empty()) return MatchAll();
    return Clause("range", node.field, bounds);
  }

  const std::vector<std::string>& default_fields_;
  const FieldTable& fields_;
  std::vector<std::string> scopes_;
};

}  // namespace

FieldTable FieldTable::FromMappings(const Json::Value& mappings) {
  FieldTable table;
  table.key_field_ = mappings["property_id"].asString();
  const Json::Value& defaults = mappings["default"];
  const Json::Value& properties = mappings["properties"];
  for (const std::string& name : properties.getMemberNames()) {
    const Json::Value& mapping = properties[name];
    auto setting = [&](const char* key) { return mapping.get(key, defaults.get(key, "")).asString(); };
    const std::string type = setting("type");
    FieldKind kind = FieldKind::kText;
    if (type == "int" || type == "double") {
      kind = FieldKind::kNumber;
    } else if (type == "bool") {
      kind = FieldKind::kBool;
    } else if (name == kFieldFSName) {
      kind = FieldKind::kName;
    } else if (name == table.key_field_) {
      kind = FieldKind::kKey;
    } else if (setting("analyzer") == "keyword") {
      kind = FieldKind::kKeyword;
    }
    for (const Json::Value& step : mapping["preprocess"]) {
      if (step.asString() == "ngram") table.fragment_field_ = name;
    }
    table.kinds_[name] = kind;
  }
  return table;
}

const FieldKind* FieldTable::Find(const std::string& field) const {
  const auto found = kinds_.find(field);
  return found == kinds_.end() ? nullptr : &found->second;
}

TranslatedQuery TranslateQueryString(const std::string& query, const std::vector<std::string>& default_fields,
                                     const FieldTable& fields) {
  Translator translator(default_fields, fields);
  TranslatedQuery result;
  result.clause = translator.Node(ParseQueryString(query));
  result.scopes = translator.TakeScopes();
  return result;
}

}  // namespace spotlightd
}  // namespace corvlumex
