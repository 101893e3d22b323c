#include "programs/corvelasticd/text_analysis.h"

#include <utf8proc.h>

#include <algorithm>
#include <cstdint>

namespace corvlumex {
namespace elasticd {
namespace {

bool IsAscii(std::string_view text) {
  for (const unsigned char c : text) {
    if (c >= 0x80) return false;
  }
  return true;
}

// Lowers the ASCII letters of `text` in place; true when all of it is ASCII.
bool LowerAscii(std::string* text) {
  unsigned char bits = 0;
  for (char& c : *text) {
    bits |= static_cast<unsigned char>(c);
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return bits < 0x80;
}

std::string AsciiLower(std::string_view text) {
  std::string out(text);
  LowerAscii(&out);
  return out;
}

// Combining diacritical marks used with Latin, Greek and Cyrillic letters.
// Marks of other scripts (kana voicing marks, Indic vowel signs) change the
// letter itself and are kept.
bool IsStrippableMark(int32_t cp) { return cp >= 0x0300 && cp <= 0x036F; }

bool IsCjkCharacter(int32_t cp) {
  return (cp >= 0x3040 && cp <= 0x30FF) ||    // hiragana, katakana
         (cp >= 0x3400 && cp <= 0x4DBF) ||    // CJK extension A
         (cp >= 0x4E00 && cp <= 0x9FFF) ||    // CJK unified ideographs
         (cp >= 0xF900 && cp <= 0xFAFF) ||    // compatibility ideographs
         (cp >= 0x20000 && cp <= 0x3134F);    // CJK extensions B..G
}

// Which ASCII characters are word characters (1) or not (0), looked up
// rather than worked out: most text is ASCII, and this runs for every
// character. Its letters, digits and '_' are its only characters of the
// categories IsWordCharacter takes.
struct AsciiKinds {
  unsigned char kind[0x80];
};

constexpr AsciiKinds MakeAsciiStandardKinds() {
  AsciiKinds kinds{};
  for (int cp = 0; cp < 0x80; ++cp) {
    kinds.kind[cp] = cp == '_' || (cp >= '0' && cp <= '9') || ((cp | 0x20) >= 'a' && (cp | 0x20) <= 'z') ? 1 : 0;
  }
  return kinds;
}

constexpr AsciiKinds kAsciiStandardKinds = MakeAsciiStandardKinds();

bool IsWordCharacter(int32_t cp) {
  if (cp < 0x80) return kAsciiStandardKinds.kind[cp] != 0;
  switch (utf8proc_category(cp)) {
    case UTF8PROC_CATEGORY_LU: case UTF8PROC_CATEGORY_LL: case UTF8PROC_CATEGORY_LT:
    case UTF8PROC_CATEGORY_LM: case UTF8PROC_CATEGORY_LO:
    case UTF8PROC_CATEGORY_MN: case UTF8PROC_CATEGORY_MC: case UTF8PROC_CATEGORY_ME:
    case UTF8PROC_CATEGORY_ND: case UTF8PROC_CATEGORY_NL: case UTF8PROC_CATEGORY_NO:
      return true;
    default:
      return false;
  }
}

bool IsBlank(int32_t cp) {
  if (cp < 0x80) return cp == ' ' || (cp >= 0x09 && cp <= 0x0D) || cp == 0x1F;
  const utf8proc_category_t category = utf8proc_category(cp);
  return category == UTF8PROC_CATEGORY_ZS || category == UTF8PROC_CATEGORY_ZL ||
         category == UTF8PROC_CATEGORY_ZP;
}

// Next code point at `pos`; an invalid byte is returned as a code point of
// its own (negative) and consumes one byte, so no input stops the scan.
int32_t NextCodePoint(std::string_view text, size_t* pos) {
  const unsigned char first = static_cast<unsigned char>(text[*pos]);
  if (first < 0x80) {
    *pos += 1;
    return first;
  }
  utf8proc_int32_t cp = 0;
  const auto* start = reinterpret_cast<const utf8proc_uint8_t*>(text.data() + *pos);
  const utf8proc_ssize_t used = utf8proc_iterate(start, static_cast<utf8proc_ssize_t>(text.size() - *pos), &cp);
  if (used <= 0) {
    *pos += 1;
    return -1;
  }
  *pos += static_cast<size_t>(used);
  return cp;
}

// Splits folded text into runs: `kind(cp)` says 0 = separator, 1 = part of a
// word, 2 = a word of its own.
template <typename Kind, typename Visit>
void SplitRuns(std::string_view text, Kind kind, const Visit& visit) {
  size_t pos = 0;
  size_t word_start = std::string_view::npos;
  while (pos < text.size()) {
    const size_t here = pos;
    // ASCII, most characters, without the call.
    const auto byte = static_cast<unsigned char>(text[pos]);
    int32_t cp = byte;
    if (byte < 0x80) {
      ++pos;
    } else {
      cp = NextCodePoint(text, &pos);
    }
    const int k = cp < 0 ? 1 : kind(cp);
    if (k == 1) {
      if (word_start == std::string_view::npos) word_start = here;
      continue;
    }
    if (word_start != std::string_view::npos) {
      visit(word_start, here);
      word_start = std::string_view::npos;
    }
    if (k == 2) visit(here, pos);
  }
  if (word_start != std::string_view::npos) visit(word_start, text.size());
}

inline int StandardKind(int32_t cp) {
  if (cp < 0x80) return kAsciiStandardKinds.kind[cp];
  if (IsCjkCharacter(cp)) return 2;
  return IsWordCharacter(cp) ? 1 : 0;
}

int WhitespaceKind(int32_t cp) { return IsBlank(cp) ? 0 : 1; }

bool IsAsciiUpper(char c) { return c >= 'A' && c <= 'Z'; }
bool IsAsciiLowerOrDigit(char c) { return (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9'); }

// Calls `emit` with the folded word: a std::string_view that lives only for
// the call. An ASCII word (most words) is lowered in `buffer`, without the
// Unicode fold, which gives the same for ASCII.
template <typename Emit>
void EmitFolded(std::string_view word, std::string* buffer, const Emit& emit) {
  buffer->assign(word.data(), word.size());
  if (!LowerAscii(buffer)) *buffer = Fold(word, FoldMode::kSearch);
  emit(std::string_view(*buffer));
}

// Calls `emit(std::string_view)` with each folded part of a word that has
// parts, in order, as each is found; `buffer` holds the folded part.
template <typename Emit>
void ForEachWordPart(std::string_view word, std::string* buffer, const Emit& emit) {
  bool split = false;
  size_t start = 0;
  for (size_t i = 0; i < word.size(); ++i) {
    bool cut_before = false, skip = false;
    if (word[i] == '_') {
      skip = true;
    } else if (i > start && IsAsciiUpper(word[i])) {
      // "readFile": a capital after a small letter or digit starts a part;
      // "XMLParser": so does the last capital of a run followed by a small
      // letter, when the run is an acronym of two letters or more.
      if (IsAsciiLowerOrDigit(word[i - 1])) {
        cut_before = true;
      } else if (i + 1 < word.size() && word[i + 1] >= 'a' && word[i + 1] <= 'z' && i - start >= 2 &&
                 IsAsciiUpper(word[i - 1]) && IsAsciiUpper(word[i - 2])) {
        cut_before = true;
      }
    }
    if (skip || cut_before) {
      split = true;
      if (i > start) EmitFolded(word.substr(start, i - start), buffer, emit);
      start = skip ? i + 1 : i;
    }
  }
  if (split && start < word.size()) EmitFolded(word.substr(start), buffer, emit);
}

}  // namespace

std::string Fold(std::string_view text, FoldMode mode) {
  if (IsAscii(text)) return AsciiLower(text);
  const auto* input = reinterpret_cast<const utf8proc_uint8_t*>(text.data());
  const auto length = static_cast<utf8proc_ssize_t>(text.size());
  const auto options = static_cast<utf8proc_option_t>(UTF8PROC_STABLE | UTF8PROC_DECOMPOSE | UTF8PROC_CASEFOLD);
  std::vector<utf8proc_int32_t> buffer(text.size() + 16);
  utf8proc_ssize_t count = utf8proc_decompose(input, length, buffer.data(), static_cast<utf8proc_ssize_t>(buffer.size()), options);
  if (count > static_cast<utf8proc_ssize_t>(buffer.size())) {
    buffer.resize(static_cast<size_t>(count));
    count = utf8proc_decompose(input, length, buffer.data(), count, options);
  }
  if (count < 0) return AsciiLower(text);
  if (mode == FoldMode::kSearch) {
    utf8proc_ssize_t kept = 0;
    for (utf8proc_ssize_t i = 0; i < count; ++i) {
      if (!IsStrippableMark(buffer[i])) buffer[kept++] = buffer[i];
    }
    count = kept;
  }
  const utf8proc_ssize_t bytes = utf8proc_reencode(
      buffer.data(), count, static_cast<utf8proc_option_t>(UTF8PROC_STABLE | UTF8PROC_COMPOSE));
  if (bytes < 0) return AsciiLower(text);
  return std::string(reinterpret_cast<const char*>(buffer.data()), static_cast<size_t>(bytes));
}

namespace {

// Calls `emit` with each token of `text`, in order (see Analyze): a
// std::string or a std::string_view into text that lives only for the call.
template <typename Emit>
void ForEachToken(Analyzer analyzer, std::string_view text, const Emit& emit) {
  if (analyzer == Analyzer::kKeyword) {
    if (text.empty()) return;
    std::string token = Fold(text, FoldMode::kCase);
    for (char& c : token) {
      if (c == ' ') c = '\x1F';
    }
    emit(std::move(token));
    return;
  }
  if (analyzer == Analyzer::kWhitespace) {
    const std::string folded = Fold(text, FoldMode::kSearch);
    const std::string_view view(folded);
    SplitRuns(view, WhitespaceKind, [&](size_t begin, size_t end) { emit(view.substr(begin, end - begin)); });
    return;
  }
  if (text.find('_') == std::string_view::npos &&
      std::none_of(text.begin(), text.end(), [](char c) { return IsAsciiUpper(c); })) {
    // No word can have parts: fold once and split, which costs less than
    // folding word by word and gives the same words.
    const std::string folded = Fold(text, FoldMode::kSearch);
    const std::string_view view(folded);
    SplitRuns(view, StandardKind, [&](size_t begin, size_t end) { emit(view.substr(begin, end - begin)); });
    return;
  }
  // Words are found before folding: the case of the letters marks where a
  // camelCase word's parts meet.
  std::string folded;
  SplitRuns(text, StandardKind, [&](size_t begin, size_t end) {
    const std::string_view word = text.substr(begin, end - begin);
    EmitFolded(word, &folded, emit);
    ForEachWordPart(word, &folded, emit);
  });
}

}  // namespace

void AddWordParts(std::string_view word, std::vector<std::string>* tokens) {
  std::string folded;
  ForEachWordPart(word, &folded, [tokens](std::string_view part) { tokens->emplace_back(part); });
}

void Analyze(Analyzer analyzer, std::string_view text, std::vector<std::string>* tokens) {
  ForEachToken(analyzer, text, [tokens](auto&& token) { tokens->emplace_back(std::forward<decltype(token)>(token)); });
}

bool AnalyzeJoined(Analyzer analyzer, std::string_view text, std::string* joined) {
  bool any = false;
  ForEachToken(analyzer, text, [&](std::string_view token) {
    if (!joined->empty()) joined->push_back(' ');
    joined->append(token);
    any = true;
  });
  return any;
}

std::vector<std::vector<std::string>> AnalyzeQuery(Analyzer analyzer, std::string_view text) {
  std::vector<std::vector<std::string>> groups;
  if (analyzer == Analyzer::kKeyword) {
    std::vector<std::string> tokens;
    Analyze(analyzer, text, &tokens);
    if (!tokens.empty()) groups.push_back(std::move(tokens));
    return groups;
  }
  SplitRuns(text, WhitespaceKind, [&](size_t begin, size_t end) {
    std::vector<std::string> tokens;
    Analyze(analyzer, text.substr(begin, end - begin), &tokens);
    if (!tokens.empty()) groups.push_back(std::move(tokens));
  });
  return groups;
}

void ForEachWord(std::string_view text, const std::function<void(size_t, size_t)>& visit) {
  SplitRuns(text, StandardKind, visit);
}

}  // namespace elasticd
}  // namespace corvlumex
