// Folding and tokenizing: the rules every stored value and every query go through.
#include <gtest/gtest.h>
#include <utf8proc.h>

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/index_schema.h"
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

// ASCII is split without the Unicode table; each character must still be
// a word character exactly when its category says so (letters, marks, numbers).
TEST(AnalyzeTest, EveryAsciiCharacterJoinsOrSplitsWordsByItsUnicodeCategory) {
  for (int c = 1; c < 0x80; ++c) {
    const utf8proc_category_t category = utf8proc_category(c);
    const bool word = c == '_' || (category >= UTF8PROC_CATEGORY_LU && category <= UTF8PROC_CATEGORY_NO);
    const std::string text = std::string("ab") + static_cast<char>(c) + "cd";
    const std::vector<std::string> tokens = Tokens(Analyzer::kStandard, text);
    if (c == '_') {
      EXPECT_EQ(tokens, std::vector<std::string>({"ab_cd", "ab", "cd"}));
    } else if (word) {
      const char lower = static_cast<char>(c >= 'A' && c <= 'Z' ? c + 32 : c);
      // A capital after a small letter starts a camelCase part.
      std::vector<std::string> whole = {std::string("ab") + lower + "cd"};
      if (c >= 'A' && c <= 'Z') whole.insert(whole.end(), {"ab", std::string(1, lower) + "cd"});
      EXPECT_EQ(tokens, whole) << c;
    } else {
      EXPECT_EQ(tokens, std::vector<std::string>({"ab", "cd"})) << c;
    }
  }
}

// The index is handed each field's tokens joined by blanks; the joined form
// made without a string per token must be that exactly, appended to what
// the field's earlier values gave.
TEST(AnalyzeTest, JoinedTokensAreTheTokensJoinedByBlanks) {
  const struct {
    Analyzer analyzer;
    std::string text;
  } cases[] = {
      {Analyzer::kStandard, "readFileSync of pthread_mutex_lock, XMLParser 42"},
      {Analyzer::kStandard, "Caf\xC3\xA9 na\xC3\xAFve \xE6\x9D\xB1\xE4\xBA\xAC"},
      {Analyzer::kStandard, "a \xCC\x81 B\xCC\x81" "c"},  // a lone mark folds to nothing
      {Analyzer::kWhitespace, "  Two  WORDS\there "},
      {Analyzer::kKeyword, "My File.TXT"},
      {Analyzer::kStandard, " ,;. "},
  };
  for (const auto& c : cases) {
    for (const std::string& before : {std::string(), std::string("earlier")}) {
      std::string expected = before;
      for (const std::string& token : Tokens(c.analyzer, c.text)) {
        if (!expected.empty()) expected += ' ';
        expected += token;
      }
      std::string joined = before;
      EXPECT_EQ(AnalyzeJoined(c.analyzer, c.text, &joined), !Tokens(c.analyzer, c.text).empty()) << c.text;
      EXPECT_EQ(joined, expected) << c.text;
    }
  }
}

TEST(AnalyzeTest, EachAnalyzerSplitsAndFoldsAsItsFieldsNeed) {
  const struct {
    Analyzer analyzer;
    const char* text;
    std::vector<std::string> tokens;
  } cases[] = {
      // Joined and camelCase words give the whole word, then each part.
      {Analyzer::kStandard, "pthread_mutex_lock",
       {"pthread_mutex_lock", "pthread", "mutex", "lock"}},
      {Analyzer::kStandard, "readFileSync", {"readfilesync", "read", "file", "sync"}},
      {Analyzer::kStandard, "XMLParser", {"xmlparser", "xml", "parser"}},
      {Analyzer::kStandard, "utf8Decode", {"utf8decode", "utf8", "decode"}},
      {Analyzer::kStandard, "__init__", {"__init__", "init"}},
      {Analyzer::kStandard, "IPv6 iPhone", {"ipv6", "iphone", "i", "phone"}},
      {Analyzer::kStandard, "plain Words UPPER", {"plain", "words", "upper"}},
      {Analyzer::kStandard, "foo_bar e-mail C++", {"foo_bar", "foo", "bar", "e", "mail", "c"}},
      // Punctuation splits, accents fold away, and each CJK character is a word.
      {Analyzer::kStandard, "AC-3 decoder_v2, \xC3\x89t\xC3\xA9!",
       {"ac", "3", "decoder_v2", "decoder", "v2", "ete"}},
      {Analyzer::kStandard, "\xE6\x9D\xB1\xE4\xBA\xAC", {"\xE6\x9D\xB1", "\xE4\xBA\xAC"}},
      // Keyword values stay whole, their blanks kept as unit separators.
      {Analyzer::kKeyword, "My File.TXT", {"my\x1F" "file.txt"}},
      {Analyzer::kKeyword, "", {}},
      // Names' words ("white space" fields) keep their punctuation and are not split.
      {Analyzer::kWhitespace, " Smith,John\tO'Neil ", {"smith,john", "o'neil"}},
      {Analyzer::kWhitespace, "read_me.txt", {"read_me.txt"}},
  };
  for (const auto& c : cases) EXPECT_EQ(Tokens(c.analyzer, c.text), c.tokens) << c.text;
}

TEST(AnalyzeTest, QueryWordsGroupTheirTokens) {
  EXPECT_EQ(AnalyzeQuery(Analyzer::kStandard, "ac-3 tokyo"),
            (std::vector<std::vector<std::string>>{{"ac", "3"}, {"tokyo"}}));
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
