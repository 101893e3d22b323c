// Words analysed one by one (text with '_' or capitals): ASCII words take a
// path of their own, and every other word must still be folded as Fold
// folds it, whole and in parts, whatever the words before it were.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "programs/corvelasticd/text_analysis.h"

namespace corvlumex {
namespace elasticd {
namespace {

TEST(WordFoldingTest, WordsAndTheirPartsFoldAlikeInBothForms) {
  const struct {
    const char* text;
    std::vector<std::string> tokens;
  } cases[] = {
      // Accented words and parts between ASCII ones.
      {"caf\xC3\xA9_\xC3\x9C" "ber na\xC3\xAF" "veReader",
       {"cafe_uber", "cafe", "uber", "naivereader", "naive", "reader"}},
      // A short word after a long one: nothing of the longer is left over.
      {"Supercalifragilistic_x y_Z", {"supercalifragilistic_x", "supercalifragilistic", "x", "y_z", "y", "z"}},
      // Bytes that are not UTF-8 stay as they are, ASCII letters lowered.
      {"AB\xFF_Cd", {"ab\xFF_cd", "ab\xFF", "cd"}},
  };
  for (const auto& c : cases) {
    std::vector<std::string> tokens;
    Analyze(Analyzer::kStandard, c.text, &tokens);
    EXPECT_EQ(tokens, c.tokens) << c.text;
    std::string expected;
    for (const std::string& token : c.tokens) expected += (expected.empty() ? "" : " ") + token;
    std::string joined;
    AnalyzeJoined(Analyzer::kStandard, c.text, &joined);
    EXPECT_EQ(joined, expected) << c.text;
  }
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex
