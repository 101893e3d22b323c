// The search language in-process: what each clause compiles to, what it
// refuses and why, and the typed reads of request members. The daemon tests
// check the same language end to end; these pin the SQL each rule gives.
#include <gtest/gtest.h>

#include <functional>

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/query.h"
#include "programs/corvelasticd/request_args.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace elasticd {
namespace {

using testing_support::JsonOf;
// Fields of every kind; "_all" covers body, name and tag (standard words)
// and title (blank-separated words).
const IndexSchema& Schema() {
  static const IndexSchema schema = IndexSchema::FromMappings(JsonOf(R"({"property_id": "path", "properties": {
      "path": {"analyzer": "keyword", "required": true, "_all": false}, "kind": {"analyzer": "keyword", "_all": false},
      "body": {"type": "text"}, "title": {"type": "text", "analyzer": "white space"},
      "name": {"type": "text", "preprocess": ["tolower", "ngram"]}, "tag": {"analyzer": "keyword"},
      "size": {"type": "int"}, "isdir": {"type": "bool", "_all": false}}})"));
  return schema;
}

// `$f` is field f's word column, `%f` its name column, `#f` its stored value.
std::string Expand(std::string text) {
  for (const FieldSpec& field : Schema().fields()) {
    for (const auto& [mark, with] : {std::pair<std::string, std::string>{"$", field.Column()}, {"%", field.NameColumn()},
                                     {"#", "corv_field(d.key, d.doc, " + std::to_string(field.code) + ")"}}) {
      for (size_t at; (at = text.find(mark + field.name)) != std::string::npos;) text.replace(at, mark.size() + field.name.size(), with);
    }
  }
  return text;
}

std::string Show(const std::vector<SqlValue>& values) {
  std::string out;
  for (const SqlValue& value : values) {
    if (!out.empty()) out += " | ";
    if (const auto* text = std::get_if<std::string>(&value)) out += *text;
    if (const auto* integer = std::get_if<int64_t>(&value)) out += "i" + std::to_string(*integer);
    if (const auto* real = std::get_if<double>(&value)) out += "d" + std::to_string(*real);
  }
  return out;
}

struct Compiled {
  std::string qsl;
  std::string condition;  // unranked
  std::string values;     // Show() of the bound values
};

TEST(QueryCompileTest, EachClauseBecomesItsCondition) {
  const char* const kText = "d.rowid IN (SELECT rowid FROM fts_text WHERE fts_text MATCH ?)";
  const char* const kName = "d.rowid IN (SELECT rowid FROM fts_name WHERE fts_name MATCH ?)";
  const Compiled cases[] = {
      {"null", "1", ""},
      {R"({"match_all": {}})", "1", ""},
      // The key field is compared as it stands, never analyzed.
      {R"({"match": {"path": "/v/A B"}})", "d.key IN (?)", "/v/A B"},
      {R"({"terms": {"path": ["/a", 7]}})", "d.key IN (?, ?)", "/a | 7"},
      {R"({"prefix": {"path": "/v/a"}})", "(d.key >= ? AND d.key < ?)", "/v/a | /v/b"},
      {R"({"prefix": {"path": {"value": "\u00ff"}}})", "(d.key >= ? AND d.key < ?)", "\xC3\xBF | \xC3\xC0"},
      // Keyword fields: the whole value is one folded token, its blanks kept as unit separators.
      {R"({"term": {"kind": "PDF File"}})", kText, "{$kind} : \"pdf\x1F" "file\""},
      {R"({"match": {"kind": {"query": "A\"b"}}})", kText, "{$kind} : \"a\"\"b\""},
      {R"({"prefix": {"kind": "Rep"}})", kText, "{$kind} : \"rep\" *"},
      {R"({"terms": {"kind": []}})", "0", ""},
      {R"({"terms": {"kind": ["a", "b"]}})", "((" + std::string(kText) + " OR " + kText + "))", "{$kind} : \"a\" | {$kind} : \"b\""},
      // Text fields: every word (or any, with "or"), each analyzed.
      {R"({"match": {"body": "Hello  wide\tWorld"}})", kText, "{$body} : \"hello\" AND {$body} : \"wide\" AND {$body} : \"world\""},
      {R"({"match": {"body": {"query": "a b", "operator": "or"}}})", kText, "{$body} : \"a\" OR {$body} : \"b\""},
      {R"({"match": {"body": "ac-3"}})", kText, "{$body} : \"ac 3\""},
      {R"({"match": {"body": "  ... "}})", "0", ""},
      {R"({"match_phrase": {"body": "Big Cat"}})", kText, "{$body} : \"big cat\""},
      // "_all": each word in any catch-all column, by analyzer group.
      {R"({"match": {"_all": "Cat"}})", kText, "({$body $name} : \"cat\" OR {$tag} : \"cat\" OR {$title} : \"cat\")"},
      {R"({"prefix": {"_all": "ca"}})", kText, "{$body $name $title} : \"ca\" *"},
      {R"({"prefix": {"_all": ""}})", "1", ""},
      // Names: three characters or more through the trigram index, shorter ones scanned.
      {R"({"match": {"name": "Repo"}})", kName, "{%name} : \"repo\""},
      {R"({"term": {"name": "Ab"}})", "instr(corv_fold(#name), ?) > 0", "ab"},
      {R"({"match": {"name": ""}})", "1", ""},
      // Numbers, dates and bools.
      {R"({"term": {"size": 5}})", "#size IN (?)", "i5"},
      {R"({"terms": {"size": [1, 2.5, "3"]}})", "#size IN (?, ?, ?)", "i1 | d2.500000 | d3.000000"},
      {R"({"term": {"isdir": "true"}})", "#isdir IN (?)", "i1"},
      {R"({"match": {"isdir": false}})", "#isdir IN (?)", "i0"},
      {R"({"range": {"size": {"gt": 10, "lte": 20}}})", "(#size IS NOT NULL AND #size > ? AND #size <= ?)", "i10 | i20"},
      {R"({"range": {"size": {"gte": "1970-01-02", "lt": "1970-01-01T00:01:00Z"}}})",
       "(#size IS NOT NULL AND #size >= ? AND #size < ?)", "i86400 | i60"},
      // bool: "should" filters only without "must"; "filter" is "must".
      {R"({"bool": {}})", "1", ""},
      {R"({"bool": {"should": [{"term": {"size": 1}}, {"term": {"size": 2}}]}})", "((#size IN (?) OR #size IN (?)))", "i1 | i2"},
      {R"({"bool": {"filter": {"term": {"size": 1}}, "should": {"term": {"size": 2}}, "must_not": [{"term": {"size": 3}}]}})",
       "(#size IN (?) AND NOT (#size IN (?)))", "i1 | i3"},
  };
  for (const Compiled& c : cases) {
    std::string condition;
    std::vector<SqlValue> values;
    Query::Parse(JsonOf(c.qsl), Schema()).Compile(false, &condition, &values);
    EXPECT_EQ(condition, Expand(c.condition)) << c.qsl;
    EXPECT_EQ(Show(values), Expand(c.values)) << c.qsl;
  }
}

TEST(QueryCompileTest, TheFirstRequiredWordClauseDrivesARankedSearch) {
  struct Ranked {
    const char* qsl;
    const char* driving;     // "" when none drives
    const char* condition;   // ranked
    const char* name_words;  // the driving clause's words within names
  };
  const Ranked cases[] = {
      {R"({"match": {"body": "x"}})", "{$body} : \"x\"", "1", ""},
      {R"({"bool": {"must": [{"term": {"size": 1}}, {"match": {"_all": "a b"}}, {"match": {"body": "c"}}]}})",
       "({$body $name} : \"a\" OR {$tag} : \"a\" OR {$title} : \"a\") AND ({$body $name} : \"b\" OR {$tag} : \"b\" OR {$title} : \"b\")",
       "(#size IN (?) AND 1 AND d.rowid IN (SELECT rowid FROM fts_text WHERE fts_text MATCH ?))",
       "{$name} : \"a\" AND {$name} : \"b\""},
      // Optional and negated words never drive.
      {R"({"bool": {"should": [{"match": {"body": "x"}}], "must_not": [{"match": {"body": "y"}}]}})", "",
       "((d.rowid IN (SELECT rowid FROM fts_text WHERE fts_text MATCH ?)) AND NOT (d.rowid IN (SELECT rowid FROM fts_text WHERE fts_text MATCH ?)))", ""},
      {R"({"term": {"size": 1}})", "", "#size IN (?)", ""},
  };
  for (const Ranked& c : cases) {
    const Query query = Query::Parse(JsonOf(c.qsl), Schema());
    std::string condition;
    std::vector<SqlValue> values;
    query.Compile(true, &condition, &values);
    EXPECT_EQ(condition, Expand(c.condition)) << c.qsl;
    ASSERT_EQ(query.HasRankedClause(), *c.driving != '\0') << c.qsl;
    if (query.HasRankedClause()) {
      EXPECT_EQ(query.RankedExpression(), Expand(c.driving)) << c.qsl;
      EXPECT_EQ(query.RankedNameExpression(), Expand(c.name_words)) << c.qsl;
    }
  }
  // An exact name needs every word: "or" and prefixes give none.
  EXPECT_EQ(Query::Parse(JsonOf(R"({"match": {"_all": "Big cat"}})"), Schema()).ExactNameTokens(),
            (std::vector<std::string>{"big", "cat"}));
  EXPECT_TRUE(Query::Parse(JsonOf(R"({"match": {"_all": {"query": "a b", "operator": "or"}}})"), Schema()).ExactNameTokens().empty());
}

TEST(QueryCompileTest, HighlightsTheWordsSearchedForButNotTheExcludedOnes) {
  const Query query = Query::Parse(
      JsonOf(R"({"bool": {"must": {"match": {"body": "Alpha beta"}}, "must_not": {"match": {"body": "gamma"}},
                           "should": {"match_phrase": {"_all": "Delta"}}}})"),
      Schema());
  EXPECT_EQ(query.HighlightTokens(), (std::set<std::string>{"alpha", "beta", "delta"}));
}

TEST(QueryParseTest, BadQueriesNameTheFaultyPart) {
  std::string deep = R"({"match_all": {}})";
  for (int i = 0; i < 33; ++i) deep = R"({"bool": {"must": )" + deep + "}}";
  std::string many_terms, many_words, long_words;
  for (int i = 0; i < 1025; ++i) many_terms += (i > 0 ? ", " : "") + std::to_string(i);
  for (int i = 0; i < 65; ++i) many_words += "w" + std::to_string(i) + " ";
  std::string four_clauses;  // 4 x 64 words + 1
  for (int i = 0; i < 4; ++i) four_clauses += R"({"match": {"body": ")" + many_words.substr(0, many_words.rfind(" w64")) + R"("}}, )";
  for (int i = 0; i < 9; ++i) long_words += std::string(8000, 'x') + " ";
  std::string dashed;  // one word that analyzes to 100
  for (int i = 0; i < 100; ++i) dashed += "ab-";
  const std::pair<std::string, std::string> cases[] = {
      {R"({"match": {"nope": "x"}})", "unknown field \"nope\""},
      {R"({"fuzzy": {"body": "x"}})", "unknown clause \"fuzzy\""},
      {R"({"match": {"body": "x"}, "term": {"size": 1}})", "a clause must be an object with exactly one key"},
      {R"("text")", "a clause must be an object with exactly one key: \"text\""},
      {R"({"term": {"size": 1, "kind": "a"}})", "\"term\" needs an object with one field"},
      {R"({"term": {"body": [1]}})", "the value for \"body\" must be a string, a number or a bool"},
      {R"({"match": {"body": {"query": 5}}})", "\"match\" on \"body\" needs a string \"query\""},
      {R"({"match": {"body": {"query": "a", "operator": "xor"}}})", "\"operator\" must be \"and\" or \"or\""},
      {R"({"match": {"body": {"query": "a", "operator": {}}}})",
       "\"operator\" must be \"and\" or \"or\""},
      {R"({"match_phrase": {"size": "1"}})", "\"match_phrase\" needs a text field, \"size\" is not one"},
      {R"({"terms": {"kind": "a"}})", "\"terms\" on \"kind\" needs an array"},
      {R"({"prefix": {"kind": 5}})", "\"prefix\" on \"kind\" needs a string"},
      {R"({"prefix": {"size": "1"}})", "\"prefix\" needs a text or keyword field, \"size\" is not one"},
      {R"({"range": {"kind": {"gt": 1}}})", "\"range\" needs a number or date field, \"kind\" is not one"},
      {R"({"range": {"size": {}}})", "\"range\" on \"size\" needs gt, gte, lt or lte"},
      {R"({"range": {"size": {"between": 1}}})", "unknown range bound \"between\""},
      {R"({"range": {"size": {"gt": "soon"}}})", "\"size\" takes a number or a date (YYYY-MM-DD[THH:MM:SS[Z]]), got \"soon\""},
      {R"({"term": {"isdir": "maybe"}})", "\"isdir\" takes true or false"},
      {R"({"bool": {"must": 5}})", "\"must\" must be a clause or an array of clauses"},
      {R"({"bool": {"maybe": []}})", "unknown \"bool\" member \"maybe\""},
      {R"({"bool": []})", "\"bool\" needs an object"},
      {deep, "clauses nested deeper than 32"},
      {R"({"terms": {"size": [)" + many_terms + "]}}", "more than 1024 clauses and \"terms\" values; split the query"},
      {R"({"match": {"body": ")" + many_words + R"("}})", "more than 64 words in one clause; search for fewer words"},
      {R"({"match": {"body": ")" + dashed + R"("}})",
       "more than 64 words in one clause; search for fewer words"},
      {R"({"bool": {"must": [)" + four_clauses + R"({"match": {"body": "last"}}]}})", "more than 256 words in the query"},
      {R"({"match": {"kind": ")" + long_words + R"("}})", "the texts of the query are longer than 65536 bytes"},
      {R"({"match": {"name": ")" + std::string(1025, 'n') + R"("}})", "the text searched in \"name\" is longer than 1024 bytes"},
  };
  for (const auto& [qsl, message] : cases) {
    try {
      Query::Parse(JsonOf(qsl), Schema());
      ADD_FAILURE() << "accepted: " << qsl.substr(0, 200);
    } catch (const DaemonError& error) {
      EXPECT_EQ(error.code(), kCodeBadQuery) << qsl.substr(0, 200);
      EXPECT_EQ(std::string(error.what()).rfind("Bad query: " + message, 0), 0u) << error.what();
    }
  }
  // The limits leave ordinary queries alone: 64 words in a clause, 256 in all.
  const std::string at_limits = R"({"bool": {"must": [)" + four_clauses + R"({"match_all": {}}]}})";
  EXPECT_NO_THROW(Query::Parse(JsonOf(at_limits), Schema()));
}

TEST(QueryParseTest, PrefixUpperBoundAndPhraseQuoting) {
  EXPECT_EQ(PrefixUpperBound("ab"), "ac");
  EXPECT_EQ(PrefixUpperBound("a\xFF"), "b");
  EXPECT_EQ(PrefixUpperBound("\xFF\xFF"), "");
  EXPECT_EQ(PrefixUpperBound(""), "");
  EXPECT_EQ(FtsPhrase({"say", "\"hi\""}), "\"say \"\"hi\"\"\"");
}

TEST(RequestArgsTest, WrongOrMissingMembersAreNamed) {
  const Json::Value data = JsonOf(R"({"s": "x", "n": 5, "b": true, "o": {}, "l": ["a"], "nil": null, "bad": [1]})");
  EXPECT_EQ(RequiredString(data, "s"), "x");
  EXPECT_TRUE(RequiredObject(data, "o").isObject());
  EXPECT_EQ(OptionalString(data, "nil", "f"), "f");
  EXPECT_EQ(OptionalInt(data, "missing", 7), 7);
  EXPECT_EQ(OptionalInt(data, "n", 7), 5);
  EXPECT_FALSE(OptionalBool(data, "nil", false));
  EXPECT_TRUE(OptionalBool(data, "b", false));
  EXPECT_EQ(OptionalStrings(data, "l"), std::vector<std::string>{"a"});
  EXPECT_TRUE(OptionalStrings(data, "missing").empty());
  const std::pair<std::function<void()>, const char*> cases[] = {
      {[&] { RequiredString(data, "missing"); }, "\"missing\" is missing"},
      {[&] { RequiredString(Json::Value("text"), "s"); }, "\"s\" is missing"},
      {[&] { RequiredString(data, "n"); }, "\"n\" must be a string"},
      {[&] { RequiredObject(data, "s"); }, "\"s\" must be an object"},
      {[&] { OptionalString(data, "b", ""); }, "\"b\" must be a string"},
      {[&] { OptionalInt(data, "s", 0); }, "\"s\" must be an integer"},
      {[&] { OptionalBool(data, "n", false); }, "\"n\" must be true or false"},
      {[&] { OptionalStrings(data, "s"); }, "\"s\" must be an array of strings"},
      {[&] { OptionalStrings(data, "bad"); }, "\"bad\" must be an array of strings"},
  };
  for (const auto& [read, message] : cases) {
    try {
      read();
      ADD_FAILURE() << "accepted: " << message;
    } catch (const DaemonError& error) {
      EXPECT_EQ(error.code(), kCodeBadArgument);
      EXPECT_STREQ(error.what(), message);
    }
  }
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex
