#include "programs/corvelasticd/query.h"

#include <time.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <optional>

#include "common/index_fields.h"
#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/text_analysis.h"

namespace corvlumex {
namespace elasticd {
namespace {

// What one query may ask of the daemon. Every word is a look-up in the
// full-text index, and the whole expression is evaluated for every candidate:
// a 100,000-word match took over 12 s of CPU. People type a few words; the
// library's own queries stay far below these.
constexpr int kMaxDepth = 32;
constexpr size_t kMaxClauses = 1024;          // clauses, and values of "terms"
constexpr size_t kMaxClauseWords = 64;        // words of one match/term on a text field
constexpr size_t kMaxQueryWords = 256;        // words of the whole query
constexpr size_t kMaxQueryTextBytes = 64u << 10;  // bytes of every text in the query
constexpr size_t kMaxSubstringBytes = 1024;   // a name substring (names are at most 255 bytes)

[[noreturn]] void Bad(const std::string& what) { throw DaemonError(kCodeBadQuery, "Bad query: " + what); }

std::string ColumnFilter(const std::vector<std::string>& columns) {
  std::string out = "{";
  for (size_t i = 0; i < columns.size(); ++i) out += (i > 0 ? " " : "") + columns[i];
  return out + "}";
}

size_t CodePointCount(const std::string& text) {
  size_t count = 0;
  for (const unsigned char c : text) {
    if ((c & 0xC0) != 0x80) ++count;
  }
  return count;
}

class Parser {
 public:
  Parser(const IndexSchema& schema, std::set<std::string>* highlight) : schema_(schema), highlight_(highlight) {}

  QueryNode Clause(const Json::Value& clause, int depth, bool negated) {
    if (depth > kMaxDepth) Bad("clauses nested deeper than " + std::to_string(kMaxDepth));
    CountClause();
    if (!clause.isObject() || clause.size() != 1) Bad("a clause must be an object with exactly one key: " + Short(clause));
    const std::string kind = clause.getMemberNames().front();
    const Json::Value& body = clause[kind];
    if (kind == "match_all") return QueryNode{};
    if (kind == "bool") return Bool(body, depth, negated);
    if (!body.isObject() || body.size() != 1) Bad("\"" + kind + "\" needs an object with one field: " + Short(body));
    const std::string field = body.getMemberNames().front();
    const Json::Value& argument = body[field];
    if (kind == "match") return Match(field, argument, negated);
    if (kind == "match_phrase") return MatchPhrase(field, argument, negated);
    if (kind == "term") return Term(field, argument, negated);
    if (kind == "terms") return Terms(field, argument, negated);
    if (kind == "prefix") return Prefix(field, argument);
    if (kind == "range") return Range(field, argument);
    Bad("unknown clause \"" + kind + "\"");
  }

 private:
  static std::string Short(const Json::Value& value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    std::string text = Json::writeString(builder, value);
    return text.size() > 120 ? text.substr(0, 120) + "..." : text;
  }

  void CountClause() {
    if (++clauses_ > kMaxClauses) Bad("more than " + std::to_string(kMaxClauses) + " clauses and \"terms\" values; split the query");
  }

  // Every text the query searches for counts towards its size.
  const std::string& CountText(const std::string& text) {
    text_bytes_ += text.size();
    if (text_bytes_ > kMaxQueryTextBytes) {
      Bad("the texts of the query are longer than " + std::to_string(kMaxQueryTextBytes) + " bytes; search for fewer words");
    }
    return text;
  }

  void CountWords(size_t clause_words) {
    if (clause_words > kMaxClauseWords) {
      Bad("more than " + std::to_string(kMaxClauseWords) + " words in one clause; search for fewer words");
    }
    if (++words_ > kMaxQueryWords) Bad("more than " + std::to_string(kMaxQueryWords) + " words in the query; search for fewer words");
  }

  const FieldSpec& Field(const std::string& name) const {
    const FieldSpec* field_def = schema_.Find(name);
    if (field_def == nullptr) Bad("unknown field \"" + name + "\"");
    return *field_def;
  }

  bool IsKey(const FieldSpec& field_def) const { return field_def.name == schema_.property_id(); }

  static std::string ScalarText(const std::string& field, const Json::Value& value) {
    if (value.isString()) return value.asString();
    if (value.isNumeric() || value.isBool()) return value.asString();
    Bad("the value for \"" + field + "\" must be a string, a number or a bool");
  }

  static SqlValue Number(const FieldSpec& field_def, const Json::Value& value) {
    if (field_def.kind == FieldKind::kBool) {
      if (value.isBool()) return static_cast<int64_t>(value.asBool() ? 1 : 0);
      if (value.isString() && (value.asString() == "true" || value.asString() == "false")) {
        return static_cast<int64_t>(value.asString() == "true" ? 1 : 0);
      }
      Bad("\"" + field_def.name + "\" takes true or false");
    }
    if (value.isInt64()) return static_cast<int64_t>(value.asInt64());
    if (value.isDouble()) return value.asDouble();
    if (value.isString()) {
      const std::string text = value.asString();
      if (const auto date = ParseDate(text)) return *date;
      char* end = nullptr;
      const double number = strtod(text.c_str(), &end);
      if (!text.empty() && end != nullptr && *end == '\0' && std::isfinite(number)) return number;
    }
    Bad("\"" + field_def.name + "\" takes a number or a date (YYYY-MM-DD[THH:MM:SS[Z]]), got " + Short(value));
  }

  // Dates of the range clause: UTC calendar dates, as seconds since 1970.
  static std::optional<int64_t> ParseDate(const std::string& text) {
    for (const char* format : {"%Y-%m-%dT%H:%M:%SZ", "%Y-%m-%dT%H:%M:%S", "%Y-%m-%d %H:%M:%S", "%Y-%m-%d"}) {
      struct tm parts;
      memset(&parts, 0, sizeof(parts));
      const char* end = strptime(text.c_str(), format, &parts);
      if (end != nullptr && *end == '\0') return static_cast<int64_t>(timegm(&parts));
    }
    return std::nullopt;
  }

  void AddHighlight(const std::string& text) {
    std::vector<std::string> tokens;
    Analyze(Analyzer::kStandard, text, &tokens);
    highlight_->insert(tokens.begin(), tokens.end());
  }

  // The text columns of a field, or of every catch-all field, grouped by analyzer.
  std::vector<std::pair<Analyzer, std::vector<std::string>>> ColumnsFor(const std::string& field) const {
    std::vector<std::pair<Analyzer, std::vector<std::string>>> groups;
    auto add = [&](const FieldSpec& field_def) {
      for (auto& group : groups) {
        if (group.first == field_def.analyzer) {
          group.second.push_back(field_def.Column());
          return;
        }
      }
      groups.push_back({field_def.analyzer, {field_def.Column()}});
    };
    if (field == kFieldAll) {
      for (const FieldSpec* field_def : schema_.TextFields()) {
        if (field_def->in_all) add(*field_def);
      }
    } else {
      add(Field(field));
    }
    return groups;
  }

  // The word columns of the file names searched by the catch-all field.
  std::vector<std::string> NameWordColumns(const std::string& field) const {
    std::vector<std::string> columns;
    if (field != kFieldAll) return columns;
    for (const FieldSpec* field_def : schema_.TextFields()) {
      if (field_def->in_all && field_def->kind == FieldKind::kNgram) columns.push_back(field_def->Column());
    }
    return columns;
  }

  // Every word (or, with "or", any word) must be found in one of the columns.
  QueryNode Words(const std::string& field, const std::string& text, bool any, bool negated) {
    const auto groups = ColumnsFor(field);
    std::vector<std::string> word_expressions;
    // Words are split on blanks first so each word is analyzed per column kind.
    const std::vector<std::string> raw_words = SplitOnBlanks(CountText(text));
    size_t clause_words = 0;
    const std::vector<std::string> name_columns = NameWordColumns(field);
    std::vector<std::string> name_expressions, exact_tokens;
    for (const std::string& word : raw_words) {
      std::vector<std::string> alternatives;
      // A word is as many words as it analyzes to ("ac-3" is two): each is a look-up.
      size_t most_tokens = 0;
      for (const auto& group : groups) {
        size_t group_tokens = 0;
        for (const auto& tokens : AnalyzeQuery(group.first, word)) {
          alternatives.push_back(ColumnFilter(group.second) + " : " + FtsPhrase(tokens));
          group_tokens += tokens.size();
        }
        most_tokens = std::max(most_tokens, group_tokens);
      }
      for (size_t i = 0; i < most_tokens; ++i) CountWords(++clause_words);
      if (alternatives.empty()) continue;
      if (!name_columns.empty()) {
        std::vector<std::string> tokens;
        Analyze(Analyzer::kStandard, word, &tokens);
        if (!tokens.empty()) name_expressions.push_back(ColumnFilter(name_columns) + " : " + FtsPhrase(tokens));
        exact_tokens.insert(exact_tokens.end(), tokens.begin(), tokens.end());
      }
      std::string expression = alternatives.size() == 1 ? alternatives[0] : "(";
      if (alternatives.size() > 1) {
        for (size_t i = 0; i < alternatives.size(); ++i) expression += (i > 0 ? " OR " : "") + alternatives[i];
        expression += ")";
      }
      word_expressions.push_back(expression);
    }
    QueryNode node;
    if (word_expressions.empty() || groups.empty()) {
      node.type = QueryNode::Type::kNone;
      return node;
    }
    node.type = QueryNode::Type::kText;
    for (size_t i = 0; i < word_expressions.size(); ++i) {
      node.fts += (i > 0 ? (any ? " OR " : " AND ") : "") + word_expressions[i];
    }
    for (size_t i = 0; i < name_expressions.size(); ++i) {
      node.name_fts += (i > 0 ? (any ? " OR " : " AND ") : "") + name_expressions[i];
    }
    if (!any) node.exact_name_tokens = std::move(exact_tokens);
    if (!negated) AddHighlight(text);
    return node;
  }

  // The runs of text between spaces, tabs and line ends.
  static std::vector<std::string> SplitOnBlanks(const std::string& text) {
    std::vector<std::string> pieces;
    size_t start = std::string::npos;
    for (size_t i = 0; i <= text.size(); ++i) {
      const bool blank = i == text.size() || text[i] == ' ' || text[i] == '\t' || text[i] == '\n' || text[i] == '\r';
      if (!blank && start == std::string::npos) start = i;
      if (blank && start != std::string::npos) {
        pieces.push_back(text.substr(start, i - start));
        start = std::string::npos;
      }
    }
    return pieces;
  }

  QueryNode Substring(const FieldSpec& field_def, const std::string& text) {
    QueryNode node;
    node.type = QueryNode::Type::kName;
    node.code = field_def.code;
    if (CountText(text).size() > kMaxSubstringBytes) {
      Bad("the text searched in \"" + field_def.name + "\" is longer than " + std::to_string(kMaxSubstringBytes) + " bytes");
    }
    const std::string folded = Fold(text, FoldMode::kSearch);
    if (folded.empty()) return QueryNode{};  // every name holds the empty text
    if (CodePointCount(folded) >= 3) {
      node.fts = "{" + field_def.NameColumn() + "} : " + FtsPhrase({folded});
    } else {
      node.substring = folded;
    }
    return node;
  }

  QueryNode KeyIn(std::vector<std::string> keys) {
    for (const std::string& key : keys) CountText(key);
    QueryNode node;
    node.type = QueryNode::Type::kKeyIn;
    node.keys = std::move(keys);
    return node;
  }

  QueryNode NumberIn(const FieldSpec& field_def, std::vector<SqlValue> numbers) {
    QueryNode node;
    node.type = QueryNode::Type::kNumberIn;
    node.code = field_def.code;
    node.numbers = std::move(numbers);
    return node;
  }

  QueryNode KeywordToken(const FieldSpec& field_def, const std::string& value) {
    std::vector<std::string> tokens;
    Analyze(Analyzer::kKeyword, CountText(value), &tokens);
    QueryNode node;
    if (tokens.empty()) {
      node.type = QueryNode::Type::kNone;
      return node;
    }
    node.type = QueryNode::Type::kText;
    node.fts = "{" + field_def.Column() + "} : " + FtsPhrase(tokens);
    return node;
  }

  QueryNode Match(const std::string& field, const Json::Value& argument, bool negated) {
    std::string text;
    bool any = false;
    if (argument.isObject()) {
      if (!argument["query"].isString()) Bad("\"match\" on \"" + field + "\" needs a string \"query\"");
      text = argument["query"].asString();
      const Json::Value& given = argument["operator"];
      if (!given.isNull() && !given.isString()) Bad("\"operator\" must be \"and\" or \"or\"");
      const std::string op = given.isNull() ? "and" : given.asString();
      if (op != "and" && op != "or") Bad("\"operator\" must be \"and\" or \"or\"");
      any = op == "or";
    } else {
      text = ScalarText(field, argument);
    }
    if (field == kFieldAll) return Words(field, text, any, negated);
    const FieldSpec& field_def = Field(field);
    if (IsKey(field_def)) return KeyIn({text});
    switch (field_def.kind) {
      case FieldKind::kNgram: return Substring(field_def, text);
      case FieldKind::kKeyword: return KeywordToken(field_def, text);
      case FieldKind::kText: return Words(field, text, any, negated);
      default: return NumberIn(field_def, {Number(field_def, argument)});
    }
  }

  // The words of `text` next to each other and in this order, in one column
  // (a phrase never spans two fields).
  QueryNode MatchPhrase(const std::string& field, const Json::Value& argument, bool negated) {
    std::string text;
    if (argument.isObject()) {
      if (!argument["query"].isString()) Bad("\"match_phrase\" on \"" + field + "\" needs a string \"query\"");
      text = argument["query"].asString();
    } else {
      text = ScalarText(field, argument);
    }
    CountText(text);
    if (field != kFieldAll) {
      const FieldSpec& field_def = Field(field);
      if (IsKey(field_def)) return KeyIn({text});
      switch (field_def.kind) {
        case FieldKind::kNgram: return Substring(field_def, text);
        case FieldKind::kKeyword: return KeywordToken(field_def, text);
        case FieldKind::kText: break;
        default: Bad("\"match_phrase\" needs a text field, \"" + field + "\" is not one");
      }
    }
    std::vector<std::string> alternatives;
    size_t most_tokens = 0;
    for (const auto& group : ColumnsFor(field)) {
      std::vector<std::string> tokens;
      Analyze(group.first, text, &tokens);
      most_tokens = std::max(most_tokens, tokens.size());
      if (!tokens.empty()) alternatives.push_back(ColumnFilter(group.second) + " : " + FtsPhrase(tokens));
    }
    // A phrase of n words is n look-ups, bounded like the words of "match".
    for (size_t i = 0; i < most_tokens; ++i) CountWords(i + 1);
    QueryNode node;
    node.type = QueryNode::Type::kNone;  // no word at all: matches nothing, as "match" does
    if (alternatives.empty()) return node;
    node.type = QueryNode::Type::kText;
    for (size_t i = 0; i < alternatives.size(); ++i) node.fts += (i > 0 ? " OR " : "") + alternatives[i];
    if (alternatives.size() > 1) node.fts = "(" + node.fts + ")";
    const std::vector<std::string> name_columns = NameWordColumns(field);
    std::vector<std::string> tokens;
    Analyze(Analyzer::kStandard, text, &tokens);
    if (!name_columns.empty() && !tokens.empty()) {
      node.name_fts = ColumnFilter(name_columns) + " : " + FtsPhrase(tokens);
      node.exact_name_tokens = tokens;
    }
    if (!negated) AddHighlight(text);
    return node;
  }

  QueryNode Term(const std::string& field, const Json::Value& argument, bool negated) {
    const Json::Value& value = argument.isObject() ? argument["value"] : argument;
    if (field == kFieldAll) return Words(field, ScalarText(field, value), false, negated);
    const FieldSpec& field_def = Field(field);
    if (IsKey(field_def)) return KeyIn({ScalarText(field, value)});
    switch (field_def.kind) {
      case FieldKind::kKeyword: return KeywordToken(field_def, ScalarText(field, value));
      case FieldKind::kNgram: return Substring(field_def, ScalarText(field, value));
      case FieldKind::kText: return Words(field, ScalarText(field, value), false, negated);
      default: return NumberIn(field_def, {Number(field_def, value)});
    }
  }

  QueryNode Terms(const std::string& field, const Json::Value& argument, bool negated) {
    if (!argument.isArray()) Bad("\"terms\" on \"" + field + "\" needs an array");
    const FieldSpec* field_def = field == kFieldAll ? nullptr : &Field(field);
    if (field_def != nullptr && IsKey(*field_def)) {
      std::vector<std::string> keys;
      for (const Json::Value& value : argument) {
        CountClause();
        keys.push_back(ScalarText(field, value));
      }
      return KeyIn(std::move(keys));
    }
    if (field_def != nullptr && (field_def->kind == FieldKind::kNumber || field_def->kind == FieldKind::kBool)) {
      std::vector<SqlValue> numbers;
      for (const Json::Value& value : argument) {
        CountClause();
        numbers.push_back(Number(*field_def, value));
      }
      return NumberIn(*field_def, std::move(numbers));
    }
    QueryNode node;
    node.type = QueryNode::Type::kBool;
    for (const Json::Value& value : argument) {
      CountClause();
      node.should.push_back(Term(field, value, negated));
    }
    if (node.should.empty()) node.type = QueryNode::Type::kNone;
    return node;
  }

  QueryNode Prefix(const std::string& field, const Json::Value& argument) {
    const Json::Value& value = argument.isObject() ? argument["value"] : argument;
    if (!value.isString()) Bad("\"prefix\" on \"" + field + "\" needs a string");
    const std::string text = value.asString();
    CountText(text);
    std::vector<std::string> columns;
    std::vector<std::string> tokens;
    if (field == kFieldAll) {
      for (const FieldSpec* field_def : schema_.TextFields()) {
        if (field_def->in_all && field_def->kind != FieldKind::kKeyword) columns.push_back(field_def->Column());
      }
      for (const auto& group : AnalyzeQuery(Analyzer::kStandard, text)) tokens.insert(tokens.end(), group.begin(), group.end());
    } else {
      const FieldSpec& field_def = Field(field);
      if (IsKey(field_def)) {
        QueryNode node;
        node.type = QueryNode::Type::kKeyPrefix;
        node.prefix = text;
        return node;
      }
      if (!field_def.HasTextColumn()) Bad("\"prefix\" needs a text or keyword field, \"" + field + "\" is not one");
      columns.push_back(field_def.Column());
      if (field_def.kind == FieldKind::kKeyword) {
        Analyze(Analyzer::kKeyword, text, &tokens);
      } else {
        for (const auto& group : AnalyzeQuery(field_def.analyzer, text)) tokens.insert(tokens.end(), group.begin(), group.end());
      }
    }
    if (tokens.empty()) return QueryNode{};  // every value starts with ""
    for (size_t i = 1; i <= tokens.size(); ++i) CountWords(i);
    QueryNode node;
    node.type = columns.empty() ? QueryNode::Type::kNone : QueryNode::Type::kText;
    node.fts = ColumnFilter(columns) + " : " + FtsPhrase(tokens) + " *";
    const std::vector<std::string> name_columns = NameWordColumns(field);
    if (!name_columns.empty()) node.name_fts = ColumnFilter(name_columns) + " : " + FtsPhrase(tokens) + " *";
    return node;
  }

  QueryNode Range(const std::string& field, const Json::Value& argument) {
    const FieldSpec& field_def = Field(field);
    if (field_def.kind != FieldKind::kNumber) Bad("\"range\" needs a number or date field, \"" + field + "\" is not one");
    if (!argument.isObject() || argument.empty()) Bad("\"range\" on \"" + field + "\" needs gt, gte, lt or lte");
    QueryNode node;
    node.type = QueryNode::Type::kNumberRange;
    node.code = field_def.code;
    for (const std::string& bound : argument.getMemberNames()) {
      const SqlValue number = Number(field_def, argument[bound]);
      if (bound == "gt" || bound == "gte") {
        node.low = number;
        node.low_inclusive = bound == "gte";
      } else if (bound == "lt" || bound == "lte") {
        node.high = number;
        node.high_inclusive = bound == "lte";
      } else {
        Bad("unknown range bound \"" + bound + "\"");
      }
    }
    return node;
  }

  void List(const Json::Value& body, const char* key, int depth, bool negated, std::vector<QueryNode>* out) {
    if (!body.isMember(key)) return;
    const Json::Value& list = body[key];
    if (list.isObject()) {
      out->push_back(Clause(list, depth + 1, negated));
    } else if (list.isArray()) {
      for (const Json::Value& clause : list) out->push_back(Clause(clause, depth + 1, negated));
    } else {
      Bad(std::string("\"") + key + "\" must be a clause or an array of clauses");
    }
  }

  QueryNode Bool(const Json::Value& body, int depth, bool negated) {
    if (!body.isObject()) Bad("\"bool\" needs an object");
    for (const std::string& key : body.getMemberNames()) {
      if (key != "must" && key != "filter" && key != "should" && key != "must_not") Bad("unknown \"bool\" member \"" + key + "\"");
    }
    QueryNode node;
    node.type = QueryNode::Type::kBool;
    List(body, "must", depth, negated, &node.must);
    List(body, "filter", depth, negated, &node.must);
    List(body, "should", depth, negated, &node.should);
    List(body, "must_not", depth, !negated, &node.must_not);
    return node;
  }

  const IndexSchema& schema_;
  std::set<std::string>* highlight_;
  size_t clauses_ = 0;
  size_t words_ = 0;
  size_t text_bytes_ = 0;
};

// The first full-text clause every hit must satisfy: the clause itself, or
// one reached through "must"/"filter" only.
const QueryNode* FindRanked(const QueryNode& node) {
  if (node.type == QueryNode::Type::kText) return &node;
  if (node.type != QueryNode::Type::kBool) return nullptr;
  for (const QueryNode& child : node.must) {
    if (const QueryNode* found = FindRanked(child)) return found;
  }
  return nullptr;
}

std::string JsonField(int code) { return "corv_field(d.key, d.doc, " + std::to_string(code) + ")"; }

}  // namespace

std::string FtsPhrase(const std::vector<std::string>& tokens) {
  std::string out = "\"";
  for (size_t i = 0; i < tokens.size(); ++i) {
    if (i > 0) out += ' ';
    for (const char c : tokens[i]) {
      out += c;
      if (c == '"') out += '"';
    }
  }
  return out + "\"";
}

std::string PrefixUpperBound(const std::string& prefix) {
  std::string bound = prefix;
  while (!bound.empty()) {
    auto last = static_cast<unsigned char>(bound.back());
    if (last < 0xFF) {
      bound.back() = static_cast<char>(last + 1);
      return bound;
    }
    bound.pop_back();
  }
  return bound;
}

Query Query::Parse(const Json::Value& clause, const IndexSchema& schema) {
  Query query;
  Parser parser(schema, &query.highlight_);
  query.root_ = std::make_shared<QueryNode>(clause.isNull() ? QueryNode{} : parser.Clause(clause, 0, false));
  query.ranked_ = FindRanked(*query.root_);
  return query;
}

void Query::Compile(bool ranked, std::string* condition, std::vector<SqlValue>* values) const {
  CompileNode(*root_, ranked, condition, values);
}

void Query::CompileNode(const QueryNode& node, bool ranked, std::string* sql, std::vector<SqlValue>* values) const {
  using Type = QueryNode::Type;
  switch (node.type) {
    case Type::kMatchAll:
      *sql += "1";
      return;
    case Type::kNone:
      *sql += "0";
      return;
    case Type::kText:
      if (ranked && &node == ranked_) {
        *sql += "1";  // the driving full-text clause, joined by the caller
        return;
      }
      *sql += "d.rowid IN (SELECT rowid FROM fts_text WHERE fts_text MATCH ?)";
      values->push_back(node.fts);
      return;
    case Type::kName:
      if (!node.fts.empty()) {
        *sql += "d.rowid IN (SELECT rowid FROM fts_name WHERE fts_name MATCH ?)";
        values->push_back(node.fts);
      } else {
        *sql += "instr(corv_fold(" + JsonField(node.code) + "), ?) > 0";
        values->push_back(node.substring);
      }
      return;
    case Type::kKeyIn:
      *sql += "d.key IN (";
      for (size_t i = 0; i < node.keys.size(); ++i) {
        *sql += i > 0 ? ", ?" : "?";
        values->push_back(node.keys[i]);
      }
      *sql += ")";
      return;
    case Type::kKeyPrefix: {
      const std::string upper = PrefixUpperBound(node.prefix);
      *sql += "(d.key >= ?";
      values->push_back(node.prefix);
      if (!upper.empty()) {
        *sql += " AND d.key < ?";
        values->push_back(upper);
      }
      *sql += ")";
      return;
    }
    case Type::kNumberRange:
      *sql += "(" + JsonField(node.code) + " IS NOT NULL";
      if (!std::holds_alternative<std::nullptr_t>(node.low)) {
        *sql += std::string(" AND ") + JsonField(node.code) + (node.low_inclusive ? " >= ?" : " > ?");
        values->push_back(node.low);
      }
      if (!std::holds_alternative<std::nullptr_t>(node.high)) {
        *sql += std::string(" AND ") + JsonField(node.code) + (node.high_inclusive ? " <= ?" : " < ?");
        values->push_back(node.high);
      }
      *sql += ")";
      return;
    case Type::kNumberIn:
      *sql += JsonField(node.code) + " IN (";
      for (size_t i = 0; i < node.numbers.size(); ++i) {
        *sql += i > 0 ? ", ?" : "?";
        values->push_back(node.numbers[i]);
      }
      *sql += ")";
      return;
    case Type::kBool: {
      std::vector<std::string> parts;
      for (const QueryNode& child : node.must) {
        std::string part;
        CompileNode(child, ranked, &part, values);
        parts.push_back(part);
      }
      // "should" filters only when nothing else does; beside "must" it is optional.
      if (node.must.empty() && !node.should.empty()) {
        std::string any = "(";
        for (size_t i = 0; i < node.should.size(); ++i) {
          if (i > 0) any += " OR ";
          CompileNode(node.should[i], ranked, &any, values);
        }
        parts.push_back(any + ")");
      }
      for (const QueryNode& child : node.must_not) {
        std::string part = "NOT (";
        CompileNode(child, ranked, &part, values);
        parts.push_back(part + ")");
      }
      if (parts.empty()) {
        *sql += "1";
        return;
      }
      *sql += "(";
      for (size_t i = 0; i < parts.size(); ++i) *sql += (i > 0 ? " AND " : "") + parts[i];
      *sql += ")";
      return;
    }
  }
}

}  // namespace elasticd
}  // namespace corvlumex
