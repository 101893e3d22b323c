#include "fileindex/queue/op_fast_json.h"

namespace corvlumex {
namespace fileindex {
namespace {

enum Key : unsigned { kKeyEvent = 1, kKeyIsDir = 2, kKeyPath = 4, kKeyPathOld = 8, kKeyData = 16 };

class Cursor {
 public:
  explicit Cursor(std::string_view text) : p_(text.data()), end_(text.data() + text.size()) {}

  bool AtEnd() const { return p_ == end_; }
  // The same four bytes the general parser skips.
  void SkipSpaces() {
    while (p_ != end_ && (*p_ == ' ' || *p_ == '\t' || *p_ == '\r' || *p_ == '\n')) ++p_;
  }
  bool Consume(char c) {
    if (p_ == end_ || *p_ != c) return false;
    ++p_;
    return true;
  }
  bool ConsumeWord(std::string_view word) {
    if (static_cast<size_t>(end_ - p_) < word.size() || std::string_view(p_, word.size()) != word) return false;
    if (!DelimitedAt(p_ + word.size())) return false;
    p_ += word.size();
    return true;
  }
  // A value must be followed by a separator the fast reader understands.
  bool Delimited() const { return DelimitedAt(p_); }
  bool DelimitedAt(const char* p) const {
    return p != end_ && (*p == ',' || *p == '}' || *p == ' ' || *p == '\t' || *p == '\r' || *p == '\n');
  }

  // Plain decimal digits without a leading zero, small enough for 32 bits.
  bool ReadUnsigned(uint32_t& out) {
    const char* start = p_;
    uint32_t value = 0;
    while (p_ != end_ && *p_ >= '0' && *p_ <= '9') value = value * 10 + static_cast<uint32_t>(*p_++ - '0');
    const size_t digits = static_cast<size_t>(p_ - start);
    if (digits == 0 || digits > 9 || (digits > 1 && *start == '0')) return false;
    out = value;
    return Delimited();
  }

  // A string after its opening quote; \u escapes and control bytes are left
  // to the general parser.
  bool ReadString(std::string& out) {
    const char* run = p_;
    out.clear();
    while (p_ != end_) {
      const unsigned char c = static_cast<unsigned char>(*p_);
      if (c == '"') {
        out.append(run, p_);
        ++p_;
        return true;
      }
      if (c < 0x20) return false;
      if (c != '\\') {
        ++p_;
        continue;
      }
      out.append(run, p_);
      if (++p_ == end_) return false;
      switch (*p_) {
        case '"': out += '"'; break;
        case '\\': out += '\\'; break;
        case '/': out += '/'; break;
        case 'b': out += '\b'; break;
        case 'f': out += '\f'; break;
        case 'n': out += '\n'; break;
        case 'r': out += '\r'; break;
        case 't': out += '\t'; break;
        default: return false;
      }
      run = ++p_;
    }
    return false;
  }

  // A key without escapes, after its opening quote.
  bool ReadKey(std::string_view& key) {
    const char* start = p_;
    while (p_ != end_ && *p_ != '"') {
      if (*p_ == '\\' || static_cast<unsigned char>(*p_) < 0x20) return false;
      ++p_;
    }
    if (p_ == end_) return false;
    key = std::string_view(start, static_cast<size_t>(p_ - start));
    ++p_;
    return true;
  }

 private:
  const char* p_;
  const char* end_;
};

unsigned KeyOf(std::string_view key) {
  if (key == "event") return kKeyEvent;
  if (key == "is_dir") return kKeyIsDir;
  if (key == "path") return kKeyPath;
  if (key == "path_old") return kKeyPathOld;
  if (key == "data") return kKeyData;
  return 0;
}

}  // namespace

bool ParseEventLineFast(std::string_view line, FastEventFields& out) {
  Cursor cursor(line);
  cursor.SkipSpaces();
  if (!cursor.Consume('{')) return false;
  unsigned seen = 0;
  out.is_dir = false;
  out.path_old.clear();
  for (;;) {
    cursor.SkipSpaces();
    std::string_view name;
    if (!cursor.Consume('"') || !cursor.ReadKey(name)) return false;
    const unsigned key = KeyOf(name);
    if (key == 0 || (seen & key) != 0) return false;  // unknown or repeated key
    seen |= key;
    cursor.SkipSpaces();
    if (!cursor.Consume(':')) return false;
    cursor.SkipSpaces();
    bool ok = false;
    switch (key) {
      case kKeyEvent: ok = cursor.ReadUnsigned(out.event); break;
      case kKeyIsDir:
        if (cursor.ConsumeWord("true")) {
          out.is_dir = true;
          ok = true;
        } else if (cursor.ConsumeWord("false")) {
          out.is_dir = false;
          ok = true;
        }
        break;
      case kKeyPath: ok = cursor.Consume('"') && cursor.ReadString(out.path); break;
      case kKeyPathOld: ok = cursor.Consume('"') && cursor.ReadString(out.path_old); break;
      case kKeyData: ok = cursor.ConsumeWord("null"); break;
    }
    if (!ok) return false;
    cursor.SkipSpaces();
    if (cursor.Consume(',')) continue;
    if (!cursor.Consume('}')) return false;
    break;
  }
  cursor.SkipSpaces();
  // Text after the object and missing required keys go the general way.
  return cursor.AtEnd() && (seen & (kKeyEvent | kKeyPath)) == (kKeyEvent | kKeyPath);
}

}  // namespace fileindex
}  // namespace corvlumex
