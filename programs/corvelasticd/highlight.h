// The highlighted snippet of a search hit: a short window of the text around
// the first words the query looked for, each such word wrapped in markers.
#pragma once

#include <set>
#include <string>

namespace corvlumex {
namespace elasticd {

struct HighlightStyle {
  size_t size = 160;          // bytes of text in the window (cut on character boundaries)
  std::string pre = "<em>";
  std::string post = "</em>";
};

// Empty when no word of `text` folds to one of `tokens`.
std::string Highlight(const std::string& text, const std::set<std::string>& tokens, const HighlightStyle& style);

}  // namespace elasticd
}  // namespace corvlumex
