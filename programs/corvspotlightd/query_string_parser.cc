#include "programs/corvspotlightd/query_string_parser.h"

#include <utility>

namespace corvlumex {
namespace spotlightd {
namespace {

bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }

// Characters that end a word when not escaped.
bool EndsWord(char c) { return IsBlank(c) || c == '(' || c == ')' || c == ':' || c == '"'; }

class Parser {
 public:
  explicit Parser(const std::string& text) : text_(text) {}

  QueryNode Parse() {
    QueryNode node = Expression(0);
    SkipBlanks();
    if (!AtEnd()) Fail("unexpected \"" + std::string(1, text_[pos_]) + "\"");
    return node;
  }

 private:
  [[noreturn]] void Fail(const std::string& what) const {
    throw QueryStringError("bad query string at offset " + std::to_string(pos_) + ": " + what);
  }

  bool AtEnd() const { return pos_ >= text_.size(); }

  void SkipBlanks() {
    while (!AtEnd() && IsBlank(text_[pos_])) ++pos_;
  }

  // True (and consumed) when the next unescaped word is `keyword` or one of
  // its symbols, followed by a word boundary.
  bool Keyword(const std::string& keyword, const std::string& symbol) {
    SkipBlanks();
    if (!symbol.empty() && text_.compare(pos_, symbol.size(), symbol) == 0) {
      pos_ += symbol.size();
      return true;
    }
    if (text_.compare(pos_, keyword.size(), keyword) != 0) return false;
    const size_t end = pos_ + keyword.size();
    if (end < text_.size() && !IsBlank(text_[end]) && text_[end] != '(') return false;
    pos_ = end;
    return true;
  }

  // One node of `kind` over `children`, or the only child itself.
  static QueryNode Combine(QueryNode::Kind kind, std::vector<QueryNode> children) {
    if (children.size() == 1) return std::move(children.front());
    QueryNode node;
    node.kind = kind;
    node.children = std::move(children);
    return node;
  }

  bool StartsClause() {
    SkipBlanks();
    return !AtEnd() && text_[pos_] != ')';
  }

  QueryNode Expression(int depth) {
    if (depth > kMaxQueryDepth) Fail("nested deeper than " + std::to_string(kMaxQueryDepth) + " levels");
    std::vector<QueryNode> alternatives;
    alternatives.push_back(And(depth));
    // "OR", or two clauses side by side (Lucene's default operator).
    while (Keyword("OR", "||") || StartsClause()) alternatives.push_back(And(depth));
    return Combine(QueryNode::Kind::kOr, std::move(alternatives));
  }

  QueryNode And(int depth) {
    std::vector<QueryNode> all;
    all.push_back(Unary(depth));
    while (Keyword("AND", "&&")) all.push_back(Unary(depth));
    return Combine(QueryNode::Kind::kAnd, std::move(all));
  }

  QueryNode Unary(int depth) {
    if (depth > kMaxQueryDepth) Fail("nested deeper than " + std::to_string(kMaxQueryDepth) + " levels");
    SkipBlanks();
    if (AtEnd()) Fail("a clause is missing at the end");
    if (Keyword("NOT", "!")) {
      QueryNode node;
      node.kind = QueryNode::Kind::kNot;
      node.children.push_back(Unary(depth + 1));
      return node;
    }
    if (text_[pos_] == '(') {
      ++pos_;
      QueryNode node = Expression(depth + 1);
      SkipBlanks();
      if (AtEnd() || text_[pos_] != ')') Fail("\")\" expected");
      ++pos_;
      return node;
    }
    return Clause();
  }

  QueryNode Clause() {
    QueryNode node;
    if (text_[pos_] == '"') {
      node.words.push_back(Phrase());
      return node;
    }
    const size_t start = pos_;
    std::string raw = RawWord("");
    if (!AtEnd() && text_[pos_] == ':') {
      ++pos_;
      node.field = Unescape(raw);
      if (node.field.empty()) Fail("empty field name");
      Value(&node);
      return node;
    }
    if (raw.empty()) {
      pos_ = start;
      Fail("a word is missing");
    }
    node.words.push_back(Word(raw));
    return node;
  }

  void Value(QueryNode* node) {
    if (AtEnd()) Fail("a value is missing after \"" + node->field + ":\"");
    const char c = text_[pos_];
    if (c == '"') {
      node->words.push_back(Phrase());
    } else if (c == '(') {
      ++pos_;
      while (true) {
        SkipBlanks();
        if (AtEnd()) Fail("\")\" expected after the list of \"" + node->field + "\"");
        if (text_[pos_] == ')') break;
        if (text_[pos_] == '"') {
          node->words.push_back(Phrase());
        } else {
          const std::string raw = RawWord("");
          if (raw.empty()) Fail("a word is expected in the list of \"" + node->field + "\"");
          node->words.push_back(Word(raw));
        }
      }
      ++pos_;
      if (node->words.empty()) Fail("empty list of \"" + node->field + "\"");
    } else if (c == '[' || c == '{') {
      Range(node);
    } else {
      const std::string raw = RawWord("");
      if (raw.empty()) Fail("a value is missing after \"" + node->field + ":\"");
      node->words.push_back(Word(raw));
    }
  }

  void Range(QueryNode* node) {
    node->kind = QueryNode::Kind::kRange;
    node->low.inclusive = text_[pos_++] == '[';
    node->low = Bound(node->low.inclusive);
    SkipBlanks();
    if (text_.compare(pos_, 2, "TO") != 0) Fail("\"TO\" expected in the range of \"" + node->field + "\"");
    pos_ += 2;
    node->high = Bound(false);
    SkipBlanks();
    if (AtEnd() || (text_[pos_] != ']' && text_[pos_] != '}')) Fail("\"]\" or \"}\" expected");
    node->high.inclusive = text_[pos_++] == ']';
  }

  QueryBound Bound(bool inclusive) {
    SkipBlanks();
    QueryBound bound;
    bound.inclusive = inclusive;
    const std::string raw = RawWord("]}");
    if (raw.empty()) Fail("a range bound is missing");
    bound.open = raw == "*";
    if (!bound.open) bound.text = Unescape(raw);
    return bound;
  }

  // The next word as written (escapes kept), up to an unescaped blank,
  // parenthesis, colon, quote or one of `stops`.
  std::string RawWord(const std::string& stops) {
    std::string raw;
    while (!AtEnd()) {
      const char c = text_[pos_];
      if (c == '\\') {
        if (pos_ + 1 >= text_.size()) Fail("a backslash ends the query");
        raw += text_.substr(pos_, 2);
        pos_ += 2;
        continue;
      }
      if (EndsWord(c) || stops.find(c) != std::string::npos) break;
      raw += c;
      ++pos_;
    }
    return raw;
  }

  std::string Unescape(const std::string& raw) const {
    std::string out;
    for (size_t i = 0; i < raw.size(); ++i) {
      if (raw[i] == '\\') ++i;
      out += raw[i];
    }
    return out;
  }

  QueryWord Word(const std::string& raw) const {
    QueryWord word;
    size_t begin = 0;
    size_t end = raw.size();
    if (raw[0] == '*') {
      word.leading_wildcard = true;
      begin = 1;
    }
    // A trailing star counts unless it is escaped (an odd run of backslashes before it).
    if (end > begin && raw[end - 1] == '*') {
      size_t slashes = 0;
      while (end - 1 - slashes > begin && raw[end - 2 - slashes] == '\\') ++slashes;
      if (slashes % 2 == 0) {
        word.trailing_wildcard = true;
        --end;
      }
    }
    for (size_t i = begin; i < end; ++i) {
      if (raw[i] == '\\') {
        word.text += raw[++i];
      } else if (raw[i] == '*' || raw[i] == '?') {
        throw QueryStringError("bad query string: the wildcard \"" + std::string(1, raw[i]) + "\" inside \"" + raw +
                               "\" is not supported (only at the start or end of a word)");
      } else {
        word.text += raw[i];
      }
    }
    return word;
  }

  QueryWord Phrase() {
    ++pos_;  // the opening quote
    QueryWord word;
    word.phrase = true;
    while (true) {
      if (AtEnd()) Fail("the phrase has no closing quote");
      const char c = text_[pos_++];
      if (c == '"') break;
      if (c == '\\') {
        if (AtEnd()) Fail("a backslash ends the query");
        word.text += text_[pos_++];
      } else {
        word.text += c;
      }
    }
    return word;
  }

  const std::string& text_;
  size_t pos_ = 0;
};

}  // namespace

QueryNode ParseQueryString(const std::string& query) { return Parser(query).Parse(); }

}  // namespace spotlightd
}  // namespace corvlumex
