// Collects the text content of one document as valid UTF-8, up to a fixed
// cap, so no file can make the index entry (or the worker's reply) grow
// without bound.
#pragma once

#include <cstddef>
#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

// The text content kept per document by default: 8 MiB of UTF-8 (long
// manuals and source files run past 1 MiB); CORVLUMEX_EXTRACT_TEXT_MB
// changes it (worker_client.h).
constexpr size_t kTextContentCap = 8u << 20;
// The largest text cap a setting may ask for, in MiB.
constexpr long kMaxTextCapMb = 64;

class TextSink {
 public:
  explicit TextSink(size_t cap = kTextContentCap) : cap_(cap) {}

  // Appends text: invalid UTF-8 becomes U+FFFD, control characters other
  // than tab and line breaks become blanks, and a character that would cross
  // the cap is dropped together with everything after it.
  void Append(const char* data, size_t size);
  void Append(const std::string& text) { Append(text.data(), text.size()); }
  // Separates blocks (paragraphs, cells, pages) with one line break.
  void Break();
  // Separates words with one blank.
  void Space();

  bool full() const { return full_; }
  size_t cap() const { return cap_; }
  const std::string& text() const { return text_; }
  // The text without blanks and line breaks at either end.
  std::string Trimmed() const;
  // The same, handed over: the sink is left empty, and a text of megabytes
  // is not copied.
  std::string TakeTrimmed();

 private:
  void Put(const char* bytes, size_t size);

  size_t cap_;
  bool full_ = false;
  std::string text_;
};

// Whether `bytes` (the start of a file) are UTF-8: a sequence cut by the
// end of the sample does not make them invalid.
bool IsValidUtf8(const std::string& bytes);

// Text made valid UTF-8 the same way and trimmed (for metadata values).
std::string CleanUtf8(const std::string& text);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
