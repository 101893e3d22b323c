#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

constexpr char kReplacement[] = "\xEF\xBF\xBD";

// Length of the valid UTF-8 sequence at `p` (at most `left` bytes), 0 when invalid.
size_t ValidSequence(const unsigned char* p, size_t left) {
  const unsigned char c = p[0];
  if (c < 0x80) return 1;
  size_t length;
  unsigned char low = 0x80, high = 0xBF;  // bounds of the second byte
  if (c >= 0xC2 && c <= 0xDF) {
    length = 2;
  } else if (c >= 0xE0 && c <= 0xEF) {
    length = 3;
    if (c == 0xE0) low = 0xA0;   // no overlong forms
    if (c == 0xED) high = 0x9F;  // no surrogates
  } else if (c >= 0xF0 && c <= 0xF4) {
    length = 4;
    if (c == 0xF0) low = 0x90;
    if (c == 0xF4) high = 0x8F;  // nothing past U+10FFFF
  } else {
    return 0;
  }
  if (left < length) return 0;
  if (p[1] < low || p[1] > high) return 0;
  for (size_t i = 2; i < length; ++i) {
    if ((p[i] & 0xC0) != 0x80) return 0;
  }
  return length;
}

}  // namespace

void TextSink::Put(const char* bytes, size_t size) {
  if (full_) return;
  if (text_.size() + size > cap_) {
    full_ = true;
    return;
  }
  text_.append(bytes, size);
}

void TextSink::Append(const char* data, size_t size) {
  const unsigned char* p = reinterpret_cast<const unsigned char*>(data);
  size_t i = 0;
  while (i < size && !full_) {
    const size_t length = ValidSequence(p + i, size - i);
    if (length == 0) {
      Put(kReplacement, 3);
      ++i;
      continue;
    }
    if (length == 1 && (p[i] < 0x20 || p[i] == 0x7F) && p[i] != '\t' && p[i] != '\n' && p[i] != '\r') {
      Put(" ", 1);
    } else {
      Put(data + i, length);
    }
    i += length;
  }
}

void TextSink::Break() {
  while (!text_.empty() && (text_.back() == ' ' || text_.back() == '\t')) text_.pop_back();
  if (!text_.empty() && text_.back() != '\n') Put("\n", 1);
}

void TextSink::Space() {
  if (!text_.empty() && text_.back() != ' ' && text_.back() != '\n') Put(" ", 1);
}

std::string TextSink::Trimmed() const {
  const size_t begin = text_.find_first_not_of(" \t\r\n");
  if (begin == std::string::npos) return std::string();
  const size_t end = text_.find_last_not_of(" \t\r\n");
  return text_.substr(begin, end - begin + 1);
}

std::string TextSink::TakeTrimmed() {
  const size_t end = text_.find_last_not_of(" \t\r\n");
  text_.erase(end == std::string::npos ? 0 : end + 1);
  text_.erase(0, text_.find_first_not_of(" \t\r\n"));
  std::string taken;
  taken.swap(text_);
  return taken;
}

bool IsValidUtf8(const std::string& bytes) {
  const unsigned char* p = reinterpret_cast<const unsigned char*>(bytes.data());
  const size_t size = bytes.size();
  size_t i = 0;
  while (i < size) {
    const unsigned char c = p[i];
    size_t length = c < 0x80 ? 1 : (c >= 0xC2 && c <= 0xDF) ? 2 : (c >= 0xE0 && c <= 0xEF) ? 3
                                                            : (c >= 0xF0 && c <= 0xF4) ? 4 : 0;
    if (length == 0) return false;
    if (i + length > size) return size - i < 4;
    for (size_t k = 1; k < length; ++k) {
      if ((p[i + k] & 0xC0) != 0x80) return false;
    }
    i += length;
  }
  return true;
}

std::string CleanUtf8(const std::string& text) {
  TextSink sink(text.size() * 3 + 3);
  sink.Append(text);
  return sink.Trimmed();
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
