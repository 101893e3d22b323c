#include "programs/corvelasticd/highlight.h"

#include <utility>
#include <vector>

#include "programs/corvelasticd/text_analysis.h"

namespace corvlumex {
namespace elasticd {
namespace {

// Moves a byte offset back to the start of the UTF-8 character it falls in.
size_t CharacterStart(const std::string& text, size_t pos) {
  while (pos > 0 && pos < text.size() && (static_cast<unsigned char>(text[pos]) & 0xC0) == 0x80) --pos;
  return pos;
}

}  // namespace

std::string Highlight(const std::string& text, const std::set<std::string>& tokens, const HighlightStyle& style) {
  if (tokens.empty() || text.empty()) return std::string();
  std::vector<std::pair<size_t, size_t>> matches;
  size_t first_beyond_window = std::string::npos;
  ForEachWord(text, [&](size_t begin, size_t end) {
    if (first_beyond_window != std::string::npos) return;
    if (!matches.empty() && end > matches.front().first + style.size) {
      first_beyond_window = begin;
      return;
    }
    std::vector<std::string> folded;
    Analyze(Analyzer::kStandard, std::string_view(text).substr(begin, end - begin), &folded);
    for (const std::string& token : folded) {
      if (tokens.count(token) != 0) {
        matches.emplace_back(begin, end);
        break;
      }
    }
  });
  if (matches.empty()) return std::string();
  // A little context before the first match, the rest after it.
  const size_t lead = style.size / 4;
  size_t start = CharacterStart(text, matches.front().first > lead ? matches.front().first - lead : 0);
  // Start on a word: skip the partial word the cut landed in.
  if (start > 0) {
    size_t word_start = start;
    ForEachWord(std::string_view(text).substr(start, matches.front().first - start + 1), [&](size_t begin, size_t) {
      if (word_start == start && begin > 0) word_start = start + begin;
    });
    start = word_start;
  }
  const size_t stop = CharacterStart(text, std::min(text.size(), start + style.size));
  std::string out = start > 0 ? "…" : "";
  size_t pos = start;
  for (const auto& [begin, end] : matches) {
    if (begin < pos || end > stop) continue;
    out.append(text, pos, begin - pos);
    out += style.pre;
    out.append(text, begin, end - begin);
    out += style.post;
    pos = end;
  }
  out.append(text, pos, stop - pos);
  if (stop < text.size()) out += "…";
  return out;
}

}  // namespace elasticd
}  // namespace corvlumex
