#include "fileindex/query/user_query.h"

#include <pwd.h>
#include <unistd.h>

#include <cmath>
#include <cstring>
#include <vector>

#include "common/index_fields.h"
#include "common/path_below.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/paths/file_type.h"

namespace corvlumex {
namespace fileindex {
namespace {

// Deep nesting only comes from a runaway script; the daemon refuses more anyway.
constexpr int kMaxDepth = 30;

Json::Value Clause(const char* kind, const std::string& field, const Json::Value& argument) {
  Json::Value clause(Json::objectValue);
  clause[kind][field] = argument;
  return clause;
}

Json::Value BoolOf(const char* list, std::vector<Json::Value> clauses) {
  Json::Value clause(Json::objectValue);
  Json::Value& members = clause["bool"][list];
  members = Json::Value(Json::arrayValue);
  for (Json::Value& member : clauses) members.append(std::move(member));
  return clause;
}

bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\f' || c == '\v'; }

std::string Lower(std::string text) {
  for (char& c : text) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return text;
}

// One operand or operator of the query text.
struct Token {
  enum class Kind { kOpen, kClose, kOr, kAnd, kNot, kTerm, kEnd };
  Kind kind = Kind::kEnd;
  size_t position = 0;
  bool minus = false;   // kTerm written with a leading '-'
  bool quoted = false;  // kTerm: a "phrase" (or a filter whose value was quoted)
  bool star = false;    // kTerm: ended with '*'
  std::string filter;   // kTerm: the filter name, lower case; empty for text
  size_t value_position = 0;
  std::string value;
};

class Lexer {
 public:
  explicit Lexer(const std::string& text) : text_(text) {}

  std::vector<Token> All() {
    std::vector<Token> tokens;
    for (;;) {
      tokens.push_back(Next());
      if (tokens.back().kind == Token::Kind::kEnd) return tokens;
    }
  }

 private:
  Token Next() {
    while (pos_ < text_.size() && IsBlank(text_[pos_])) ++pos_;
    Token token;
    token.position = pos_;
    if (pos_ == text_.size()) return token;
    if (text_[pos_] == '(') {
      ++pos_;
      token.kind = Token::Kind::kOpen;
      return token;
    }
    if (text_[pos_] == ')') {
      ++pos_;
      token.kind = Token::Kind::kClose;
      return token;
    }
    token.kind = Token::Kind::kTerm;
    // A '-' negates only when something follows it directly: "a - b" keeps
    // the lone dash as (empty) text, "-b" excludes b.
    if (text_[pos_] == '-' && pos_ + 1 < text_.size() && !IsBlank(text_[pos_ + 1]) && text_[pos_ + 1] != ')') {
      token.minus = true;
      ++pos_;
      if (text_[pos_] == '(') {
        // "-(a OR b)": the minus applies to the group; hand it over as NOT.
        token.kind = Token::Kind::kNot;
        return token;
      }
    }
    if (text_[pos_] == '"') {
      token.quoted = true;
      token.value_position = pos_ + 1;
      token.value = Quoted();
      token.star = Star();
      return token;
    }
    const size_t start = pos_;
    std::string word = Bare();
    const size_t colon = word.find(':');
    if (colon != std::string::npos && colon > 0 && IsFilter(Lower(word.substr(0, colon)))) {
      token.filter = Lower(word.substr(0, colon));
      token.value_position = start + colon + 1;
      if (colon + 1 == word.size() && pos_ < text_.size() && text_[pos_] == '"') {
        token.quoted = true;
        token.value_position = pos_ + 1;
        token.value = Quoted();
      } else {
        token.value = word.substr(colon + 1);
      }
      if (token.value.empty()) {
        throw UserQuerySyntaxError(token.value_position, "\"" + token.filter + ":\" needs a value after the colon");
      }
      return token;
    }
    if (!token.minus && word == "OR") token.kind = Token::Kind::kOr;
    if (!token.minus && word == "AND") token.kind = Token::Kind::kAnd;
    if (!token.minus && word == "NOT") token.kind = Token::Kind::kNot;
    token.value_position = start;
    while (!word.empty() && word.back() == '*') {
      word.pop_back();
      token.star = true;
    }
    if (token.star && word.empty()) {
      throw UserQuerySyntaxError(start, "a \"*\" must end a word (budg* finds budget); alone it would match everything");
    }
    token.value = word;
    return token;
  }

  static bool IsFilter(const std::string& name) {
    for (const char* filter : {"name", "ext", "type", "in", "path", "size", "modified", "owner"}) {
      if (name == filter) return true;
    }
    return false;
  }

  // Text up to a blank or a parenthesis that closes a group. A '(' inside a
  // word keeps its matching ')' ("report(1).pdf" stays one word).
  std::string Bare() {
    const size_t start = pos_;
    int depth = 0;
    while (pos_ < text_.size() && !IsBlank(text_[pos_])) {
      const char c = text_[pos_];
      if (c == '(') {
        if (pos_ == start) break;
        ++depth;
      }
      if (c == ')') {
        if (depth == 0) break;
        --depth;
      }
      // "name:" followed by a quote: the quoted value is read by the caller.
      if (c == '"' && pos_ > start && text_[pos_ - 1] == ':') break;
      ++pos_;
    }
    return text_.substr(start, pos_ - start);
  }

  // The text between double quotes, the quotes consumed.
  std::string Quoted() {
    const size_t open = pos_;
    const size_t close = text_.find('"', open + 1);
    if (close == std::string::npos) throw UserQuerySyntaxError(open, "this quote is never closed; add the closing \"");
    pos_ = close + 1;
    return text_.substr(open + 1, close - open - 1);
  }

  bool Star() {
    bool star = false;
    while (pos_ < text_.size() && text_[pos_] == '*') {
      ++pos_;
      star = true;
    }
    return star;
  }

  const std::string& text_;
  size_t pos_ = 0;
};

// Calendar days are UTC days, as the daemon's own dates are.
bool ParseDay(const std::string& text, time_t* day_start) {
  struct tm parts;
  memset(&parts, 0, sizeof(parts));
  const char* end = strptime(text.c_str(), "%Y-%m-%d", &parts);
  if (end == nullptr || *end != '\0' || text.size() != 10) return false;
  *day_start = timegm(&parts);
  return true;
}

// "7d", "12h", "2w", "1y": an age in seconds.
bool ParseAge(const std::string& text, int64_t* seconds) {
  if (text.size() < 2) return false;
  const char unit = static_cast<char>(tolower(static_cast<unsigned char>(text.back())));
  int64_t scale = 0;
  switch (unit) {
    case 'h': scale = 3600; break;
    case 'd': scale = 86400; break;
    case 'w': scale = 7 * 86400; break;
    case 'y': scale = 365 * 86400; break;
    default: return false;
  }
  int64_t count = 0;
  for (size_t i = 0; i + 1 < text.size(); ++i) {
    if (text[i] < '0' || text[i] > '9' || count > 1000000) return false;
    count = count * 10 + (text[i] - '0');
  }
  *seconds = count * scale;
  return true;
}

// "10M", "1.5G", "200k", "4096": bytes (units of 1024).
bool ParseSize(const std::string& text, double* bytes) {
  size_t digits = 0;
  while (digits < text.size() && (isdigit(static_cast<unsigned char>(text[digits])) || text[digits] == '.')) ++digits;
  if (digits == 0) return false;
  char* end = nullptr;
  const std::string number_text = text.substr(0, digits);
  const double number = strtod(number_text.c_str(), &end);
  if (end == nullptr || *end != '\0' || !std::isfinite(number)) return false;
  std::string unit = Lower(text.substr(digits));
  if (unit.size() > 1 && (unit.back() == 'b')) unit.pop_back();                    // "mb", "kb"
  if (unit.size() == 2 && unit.back() == 'i') unit.pop_back();                      // "mib"
  double scale = 1;
  if (unit == "k") scale = 1024.0;
  else if (unit == "m") scale = 1024.0 * 1024;
  else if (unit == "g") scale = 1024.0 * 1024 * 1024;
  else if (unit == "t") scale = 1024.0 * 1024 * 1024 * 1024;
  else if (!unit.empty() && unit != "b") return false;
  *bytes = std::floor(number * scale);
  return true;
}

// "<", "<=", ">", ">=", "=" or nothing, taken off the front of `text`.
std::string Comparison(std::string* text) {
  for (const char* op : {">=", "<=", ">", "<", "="}) {
    if (text->compare(0, strlen(op), op) == 0) {
      *text = text->substr(strlen(op));
      return op;
    }
  }
  return "";
}

class Parser {
 public:
  Parser(const std::string& text, time_t now) : tokens_(Lexer(text).All()), now_(now) {}

  Json::Value Query() {
    if (Peek().kind == Token::Kind::kEnd) return MatchAll();
    Json::Value clause = AndList(0);
    if (Peek().kind == Token::Kind::kClose) {
      throw UserQuerySyntaxError(Peek().position, "this \")\" closes no \"(\"; remove it or add the \"(\"");
    }
    return clause;
  }

 private:
  static Json::Value MatchAll() {
    Json::Value clause(Json::objectValue);
    clause["match_all"] = Json::Value(Json::objectValue);
    return clause;
  }

  const Token& Peek() const { return tokens_[next_]; }
  const Token& Take() { return tokens_[next_++]; }

  static bool StartsOperand(Token::Kind kind) {
    return kind == Token::Kind::kTerm || kind == Token::Kind::kOpen || kind == Token::Kind::kNot;
  }

  // Operands side by side (or joined by AND) must all match. Plain words
  // go into one "match" so the daemon ranks by all of them together.
  Json::Value AndList(int depth) {
    if (depth > kMaxDepth) throw UserQuerySyntaxError(Peek().position, "parentheses nested too deeply");
    std::string words;
    std::vector<Json::Value> must, must_not;
    for (;;) {
      if (Peek().kind == Token::Kind::kAnd) {
        const Token& op = Take();
        if (!StartsOperand(Peek().kind)) throw UserQuerySyntaxError(op.position, "\"AND\" needs something to search for on its right");
        if (must.empty() && must_not.empty() && words.empty()) throw UserQuerySyntaxError(op.position, "\"AND\" needs something to search for on its left");
      }
      if (!StartsOperand(Peek().kind)) break;
      bool negated = false;
      std::string word;
      Json::Value operand = OrList(depth, &negated, &word);
      if (!word.empty()) {
        words += (words.empty() ? "" : " ") + word;
      } else if (negated) {
        must_not.push_back(std::move(operand));
      } else if (!operand.isNull()) {
        must.push_back(std::move(operand));
      }
    }
    if (Peek().kind == Token::Kind::kOr) {
      throw UserQuerySyntaxError(Peek().position, "\"OR\" needs something to search for on its left");
    }
    if (!words.empty()) must.insert(must.begin(), Clause("match", kFieldAll, words));
    if (must.empty() && must_not.empty()) {
      if (Peek().kind == Token::Kind::kClose) {
        throw UserQuerySyntaxError(Peek().position, "this \")\" closes no \"(\"; remove it or add the \"(\"");
      }
      throw UserQuerySyntaxError(Peek().position, "nothing to search for here");
    }
    if (must.size() == 1 && must_not.empty()) return must.front();
    Json::Value clause(Json::objectValue);
    Json::Value& body = clause["bool"];
    body = Json::Value(Json::objectValue);
    for (Json::Value& member : must) body["must"].append(std::move(member));
    for (Json::Value& member : must_not) body["must_not"].append(std::move(member));
    return clause;
  }

  // Operands joined by OR: any may match. A lone plain word comes back in
  // `word` (so AndList can join it with its neighbours), a lone negated
  // operand with `negated` set.
  Json::Value OrList(int depth, bool* negated, std::string* word) {
    std::vector<Json::Value> any;
    bool first_negated = false;
    Json::Value first = Unary(depth, &first_negated, word);
    if (Peek().kind != Token::Kind::kOr) {
      *negated = first_negated;
      return first;
    }
    any.push_back(Positive(first, first_negated, word));
    while (Peek().kind == Token::Kind::kOr) {
      const Token& op = Take();
      if (!StartsOperand(Peek().kind)) throw UserQuerySyntaxError(op.position, "\"OR\" needs something to search for on its right");
      bool operand_negated = false;
      std::string operand_word;
      Json::Value operand = Unary(depth, &operand_negated, &operand_word);
      any.push_back(Positive(operand, operand_negated, &operand_word));
    }
    return BoolOf("should", std::move(any));
  }

  // An operand as a clause that stands on its own inside an OR.
  static Json::Value Positive(const Json::Value& clause, bool negated, std::string* word) {
    if (!word->empty()) {
      Json::Value match = Clause("match", kFieldAll, *word);
      word->clear();
      return match;
    }
    if (negated) return BoolOf("must_not", {clause});
    return clause;
  }

  Json::Value Unary(int depth, bool* negated, std::string* word) {
    if (Peek().kind == Token::Kind::kNot) {
      const Token& op = Take();
      if (!StartsOperand(Peek().kind) || Peek().kind == Token::Kind::kNot) {
        throw UserQuerySyntaxError(op.position, std::string(op.minus ? "\"-\"" : "\"NOT\"") + " needs a word, phrase, filter or group right after it");
      }
      bool inner_negated = false;
      std::string inner_word;
      Json::Value inner = Primary(depth, &inner_negated, &inner_word);
      *negated = true;
      return inner_word.empty() ? inner : Clause("match", kFieldAll, inner_word);
    }
    return Primary(depth, negated, word);
  }

  Json::Value Primary(int depth, bool* negated, std::string* word) {
    const Token& token = Take();
    if (token.kind == Token::Kind::kOpen) {
      if (Peek().kind == Token::Kind::kClose) throw UserQuerySyntaxError(token.position, "these parentheses hold nothing");
      Json::Value inner = AndList(depth + 1);
      if (Peek().kind != Token::Kind::kClose) throw UserQuerySyntaxError(token.position, "this \"(\" is never closed; add the \")\"");
      Take();
      return inner;
    }
    *negated = token.minus;
    if (!token.filter.empty()) return Filter(token);
    if (token.star) return Clause("prefix", kFieldAll, token.value);
    if (token.quoted) {
      if (token.value.find_first_not_of(" \t\n\r") == std::string::npos) {
        throw UserQuerySyntaxError(token.position, "these quotes hold no words");
      }
      return Clause("match_phrase", kFieldAll, token.value);
    }
    if (token.minus) return Clause("match", kFieldAll, token.value);
    *word = token.value;  // never empty: a bare word holds at least one character
    return Json::Value();
  }

  Json::Value Filter(const Token& token) {
    const std::string& name = token.filter;
    const std::string& value = token.value;
    const auto bad = [&](const std::string& reason) { throw UserQuerySyntaxError(token.value_position, reason); };
    if (name == "name") {
      std::string text = value;
      while (!token.quoted && !text.empty() && text.back() == '*') text.pop_back();  // name:rep* = name:rep
      if (text.empty()) bad("\"name:\" needs part of a file name");
      return Clause("match", kFieldSearchFileName, text);
    }
    if (name == "ext") return Extensions(value, bad);
    if (name == "type") return Category(value, bad);
    if (name == "in" || name == "path") {
      if (value[0] != '/') bad("\"" + name + ":\" needs a folder's full path, like " + name + ":/volume1/docs");
      std::string folder = value;
      while (folder.size() > 1 && folder.back() == '/') folder.pop_back();
      return Clause("prefix", kFieldPath, PrefixOfPathsBelow(folder));
    }
    if (name == "size") return SizeFilter(value, bad);
    if (name == "modified") return DateFilter(value, bad);
    return Owner(value, bad);
  }

  template <typename Bad>
  static Json::Value Extensions(const std::string& value, const Bad& bad) {
    Json::Value list(Json::arrayValue);
    size_t start = 0;
    for (;;) {
      const size_t comma = value.find(',', start);
      std::string ext = value.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
      if (!ext.empty() && ext[0] == '.') ext.erase(0, 1);
      if (ext.empty()) bad("\"ext:\" needs extensions without blanks, like ext:pdf or ext:jpg,png");
      list.append(ext);
      if (comma == std::string::npos) break;
      start = comma + 1;
    }
    return list.size() == 1 ? Clause("term", kFieldExtension, list[0]) : Clause("terms", kFieldExtension, list);
  }

  template <typename Bad>
  static Json::Value Category(const std::string& value, const Bad& bad) {
    const std::string category = Lower(value);
    if (category == "folder") return Clause("term", kFieldIsDir, true);
    FileType type;
    if (!GetFileTypeByCategory(category, &type)) {
      bad("unknown type \"" + value + "\"; use document, audio, video, photo or folder");
    }
    Json::Value list(Json::arrayValue);
    for (const std::string& ext : GetExtensionsByCategory(category)) list.append(ext);
    return Clause("terms", kFieldExtension, list);
  }

  template <typename Bad>
  static Json::Value Range(const char* field, const std::string& op, const Json::Value& number, const Bad& bad) {
    Json::Value bounds(Json::objectValue);
    if (op == ">") bounds["gt"] = number;
    else if (op == ">=") bounds["gte"] = number;
    else if (op == "<") bounds["lt"] = number;
    else if (op == "<=") bounds["lte"] = number;
    else bad("internal: unknown comparison");
    return Clause("range", field, bounds);
  }

  template <typename Bad>
  static Json::Value SizeFilter(std::string value, const Bad& bad) {
    const std::string op = Comparison(&value);
    double bytes = 0;
    if (!ParseSize(value, &bytes)) bad("\"size:\" takes a comparison and a size, like size:>10M, size:<=200k or size:4096");
    const auto number = static_cast<Json::Int64>(bytes);
    if (op.empty() || op == "=") return Clause("term", kFieldFSSize, number);
    return Range(kFieldFSSize, op, number, bad);
  }

  // A date is a whole UTC day; an age ("7d") counts back from now, so
  // "modified:<7d" (less than 7 days old) means a date after now - 7 days.
  template <typename Bad>
  Json::Value DateFilter(std::string value, const Bad& bad) const {
    const std::string op = Comparison(&value);
    int64_t age = 0;
    time_t day = 0;
    if (ParseAge(value, &age)) {
      const auto moment = static_cast<Json::Int64>(now_ - age);
      if (op.empty() || op == "=" || op == "<") return Range(kFieldContentChangeDate, ">", moment, bad);
      if (op == "<=") return Range(kFieldContentChangeDate, ">=", moment, bad);
      return Range(kFieldContentChangeDate, op == ">" ? "<" : "<=", moment, bad);
    }
    if (!ParseDay(value, &day)) {
      bad("\"modified:\" takes a date or an age, like modified:>2026-01-01, modified:2026-03-15 or modified:<7d "
          "(h, d, w, y: hours, days, weeks, years)");
    }
    const auto start = static_cast<Json::Int64>(day), next = static_cast<Json::Int64>(day + 86400);
    if (op == ">") return Range(kFieldContentChangeDate, ">=", next, bad);
    if (op == ">=") return Range(kFieldContentChangeDate, ">=", start, bad);
    if (op == "<") return Range(kFieldContentChangeDate, "<", start, bad);
    if (op == "<=") return Range(kFieldContentChangeDate, "<", next, bad);
    Json::Value bounds(Json::objectValue);
    bounds["gte"] = start;
    bounds["lt"] = next;
    return Clause("range", kFieldContentChangeDate, bounds);
  }

  // Documents store the owner's user id; a name is looked up here.
  template <typename Bad>
  static Json::Value Owner(const std::string& value, const Bad& bad) {
    if (value.find_first_not_of("0123456789") == std::string::npos) return Clause("term", kFieldOwnerUserID, value);
    struct passwd entry;
    struct passwd* found = nullptr;
    std::vector<char> buffer(16384);
    if (getpwnam_r(value.c_str(), &entry, buffer.data(), buffer.size(), &found) != 0 || found == nullptr) {
      bad("no user named \"" + value + "\"; give a user name or a numeric user id");
    }
    return Clause("term", kFieldOwnerUserID, std::to_string(found->pw_uid));
  }

  std::vector<Token> tokens_;
  size_t next_ = 0;
  time_t now_;
};

std::string Describe(size_t position, const std::string& reason) {
  return "Cannot read the query at character " + std::to_string(position + 1) + ": " + reason;
}

}  // namespace

UserQuerySyntaxError::UserQuerySyntaxError(size_t position, const std::string& reason)
    : std::runtime_error(Describe(position, reason)), position_(position), reason_(reason) {}

Json::Value UserQueryToSearch(const std::string& text) { return UserQueryToSearch(text, time(nullptr)); }

Json::Value UserQueryToSearch(const std::string& text, time_t now) {
  Json::Value query(Json::objectValue);
  query["qsl"] = Parser(text, now).Query();
  return query;
}

}  // namespace fileindex
}  // namespace corvlumex
