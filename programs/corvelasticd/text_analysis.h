// Turns field values and query text into the tokens the index stores.
// Every comparison of names and words goes through Fold, so a name written
// decomposed (as some clients send accents) and the same name typed
// precomposed, in any case, meet on one token.
#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace corvlumex {
namespace elasticd {

enum class FoldMode {
  kCase,    // NFC + Unicode case folding: keyword values stay whole and keep their accents
  kSearch,  // kCase, and the combining diacritics of Latin, Greek and Cyrillic letters removed
};

// Folded text. Bytes that are not valid UTF-8 (Linux names may hold any
// byte) are kept as they are, with ASCII letters lowered.
std::string Fold(std::string_view text, FoldMode mode);

enum class Analyzer {
  kKeyword,     // the whole value is one token
  kWhitespace,  // "white space": tokens are the runs between blanks
  kStandard,    // "corvstandard": letters, digits and marks form words; each CJK character is its own word
};

// Appends the tokens of `text` (folded first) to `tokens`. Keyword tokens
// have their blanks replaced by '\x1F' so no token ever holds a blank.
void Analyze(Analyzer analyzer, std::string_view text, std::vector<std::string>* tokens);

// Appends the tokens of `text` as Analyze gives them to `joined`, each
// after one blank when `joined` is not empty (the form the full-text index
// is handed), without a string per token; true when there was a token.
bool AnalyzeJoined(Analyzer analyzer, std::string_view text, std::string* joined);

// Appends the parts of one word of kStandard when it is joined by '_' or
// written in camelCase ("pthread_mutex_lock": pthread, mutex, lock;
// "readFileSync": read, file, sync; "XMLParser": xml, parser), folded;
// nothing for a plain word. kStandard gives a word's parts right after the
// whole word, so the whole word and each part are found, and a phrase
// query, analysed the same way, still matches the same run of tokens.
void AddWordParts(std::string_view word, std::vector<std::string>* tokens);

// The tokens of the query text, grouped by the blank-separated word they
// came from ("ac-3 tokyo" under kStandard gives [[ac, 3], [tokyo]]); a group
// of several tokens is searched as a phrase.
std::vector<std::vector<std::string>> AnalyzeQuery(Analyzer analyzer, std::string_view text);

// Calls `visit(begin, end)` for every word of the raw text, in order, with
// byte offsets, using the word rules of kStandard (used for highlighting).
void ForEachWord(std::string_view text, const std::function<void(size_t, size_t)>& visit);

}  // namespace elasticd
}  // namespace corvlumex
