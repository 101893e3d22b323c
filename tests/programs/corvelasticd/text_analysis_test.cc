// Folding and tokenizing: the rules every stored value and every query go through.
#include <gtest/gtest.h>

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/index_schema.h"
#include "programs/corvelasticd/query.h"
#include "programs/corvelasticd/text_analysis.h"
#include "tests/programs/corvelasticd/daemon_harness.h"

namespace corvlumex {
namespace elasticd {
namespace {

std::vector<std::string> Tokens(Analyzer analyzer, const std::string& text) {
  std::vector<std::string> tokens;
  Analyze(analyzer, text, &tokens);
  return tokens;
}

TEST(FoldTest, DecomposedAndPrecomposedFormsMeetOtherMarksAndBadBytesAreKept) {
  const struct {
    std::string text;
    FoldMode mode;
    std::string folded;
  } cases[] = {
      {"Cafe\xCC\x81", FoldMode::kCase, "caf\xC3\xA9"},
      {"CAF\xC3\x89", FoldMode::kCase, "caf\xC3\xA9"},
      {"Cafe\xCC\x81", FoldMode::kSearch, "cafe"},
      {"Stra\xC3\x9F" "e", FoldMode::kCase, "strasse"},
      // A kana voicing mark changes the letter: "が" must not become "か".
      {"\xE3\x81\x8C", FoldMode::kSearch, "\xE3\x81\x8C"},
      // Invalid UTF-8 is kept, with ASCII lowered.
      {std::string("AB\xFF\xFE" "C", 5), FoldMode::kSearch, std::string("ab\xFF\xFE" "c", 5)},
  };
  for (const auto& c : cases) EXPECT_EQ(Fold(c.text, c.mode), c.folded) << c.text;
}

TEST(AnalyzeTest, KeywordValuesStayWholeWithoutBlanks) {
  EXPECT_EQ(Tokens(Analyzer::kKeyword, "My File.TXT"), std::vector<std::string>({"my\x1F" "file.txt"}));
  EXPECT_TRUE(Tokens(Analyzer::kKeyword, "").empty());
}

TEST(AnalyzeTest, StandardSplitsOnPunctuationAndCjkCharacters) {
  EXPECT_EQ(Tokens(Analyzer::kStandard, "AC-3 decoder_v2, \xC3\x89t\xC3\xA9!"),
            std::vector<std::string>({"ac", "3", "decoder_v2", "decoder", "v2", "ete"}));
  EXPECT_EQ(Tokens(Analyzer::kStandard, "\xE6\x9D\xB1\xE4\xBA\xAC"), std::vector<std::string>({"\xE6\x9D\xB1", "\xE4\xBA\xAC"}));
}

TEST(AnalyzeTest, JoinedAndCamelCaseWordsGiveTheWholeWordThenEachPart) {
  const struct {
    const char* text;
    std::vector<std::string> tokens;
  } cases[] = {
      {"pthread_mutex_lock", {"pthread_mutex_lock", "pthread", "mutex", "lock"}},
      {"readFileSync", {"readfilesync", "read", "file", "sync"}},
      {"XMLParser", {"xmlparser", "xml", "parser"}},
      {"utf8Decode", {"utf8decode", "utf8", "decode"}},
      {"__init__", {"__init__", "init"}},
      {"IPv6 iPhone", {"ipv6", "iphone", "i", "phone"}},
      {"plain Words UPPER", {"plain", "words", "upper"}},
      {"foo_bar e-mail C++", {"foo_bar", "foo", "bar", "e", "mail", "c"}},
  };
  for (const auto& c : cases) EXPECT_EQ(Tokens(Analyzer::kStandard, c.text), c.tokens) << c.text;
  // Names' words ("white space" fields) are not split.
  EXPECT_EQ(Tokens(Analyzer::kWhitespace, "read_me.txt"), std::vector<std::string>({"read_me.txt"}));
}

TEST(AnalyzeTest, WhiteSpaceKeepsPunctuationInsideTokens) {
  EXPECT_EQ(Tokens(Analyzer::kWhitespace, " Smith,John\tO'Neil "), std::vector<std::string>({"smith,john", "o'neil"}));
}

TEST(AnalyzeTest, QueryWordsGroupTheirTokens) {
  const auto groups = AnalyzeQuery(Analyzer::kStandard, "ac-3 tokyo");
  ASSERT_EQ(groups.size(), 2u);
  EXPECT_EQ(groups[0], std::vector<std::string>({"ac", "3"}));
  EXPECT_EQ(groups[1], std::vector<std::string>({"tokyo"}));
}

TEST(QueryTest, PrefixUpperBoundSkipsTrailingFFBytes) {
  EXPECT_EQ(PrefixUpperBound("/a/"), "/a0");
  EXPECT_EQ(PrefixUpperBound(std::string("a\xFF", 2)), "b");
  EXPECT_EQ(PrefixUpperBound(std::string("\xFF\xFF", 2)), "");
}

TEST(QueryTest, RankedClauseIsTheFirstRequiredFullTextClause) {
  const IndexSchema schema = IndexSchema::FromMappings(elasticd_test::LibraryMappings());
  Json::Value clause;
  Json::Value text;
  text["match"]["_all"] = "hello";
  clause["bool"]["must"].append(text);
  EXPECT_TRUE(Query::Parse(clause, schema).HasRankedClause());
  Json::Value should;
  should["bool"]["should"].append(text);
  EXPECT_FALSE(Query::Parse(should, schema).HasRankedClause());
  EXPECT_EQ(Query::Parse(clause, schema).HighlightTokens(), std::set<std::string>({"hello"}));
}

TEST(SchemaTest, MappingsDecideHowEachFieldIsStored) {
  const IndexSchema schema = IndexSchema::FromMappings(elasticd_test::LibraryMappings());
  EXPECT_EQ(schema.property_id(), "CORVMDPath");
  EXPECT_EQ(schema.Find("CORVMDFSName")->kind, FieldKind::kKeyword);
  EXPECT_EQ(schema.Find("CORVMDSearchFileName")->kind, FieldKind::kNgram);
  EXPECT_EQ(schema.Find("CORVMDAuthors")->analyzer, Analyzer::kWhitespace);
  EXPECT_EQ(schema.Find("CORVMDFSSize")->kind, FieldKind::kNumber);
  EXPECT_TRUE(schema.Find("CORVMDKeywords")->in_all);
  EXPECT_FALSE(schema.Find("CORVMDParent")->in_all);
  Json::Value bad = elasticd_test::LibraryMappings();
  bad["properties"]["CORVMDTitle"]["analyzer"] = "snowball";
  EXPECT_THROW(IndexSchema::FromMappings(bad), DaemonError);
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex
