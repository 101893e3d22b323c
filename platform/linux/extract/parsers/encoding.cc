#include "platform/linux/extract/parsers/encoding.h"

#include <iconv.h>
#include <uchardet/uchardet.h>

#include <cerrno>
#include <cstring>

#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

// What a guess is based on: enough text to be sure, little enough to be quick.
constexpr size_t kDetectBytes = 64 * 1024;

bool StartsWith(const std::string& bytes, const char* prefix, size_t length) {
  return bytes.size() >= length && memcmp(bytes.data(), prefix, length) == 0;
}

// UTF-16 without a mark: Latin text then has a zero byte in every other
// place, which no 8-bit text has.
std::string GuessUtf16WithoutMark(const std::string& bytes) {
  const size_t sample = (bytes.size() < kDetectBytes ? bytes.size() : kDetectBytes) & ~static_cast<size_t>(1);
  if (sample < 4) return std::string();
  size_t zero_even = 0, zero_odd = 0;
  for (size_t i = 0; i < sample; i += 2) {
    if (bytes[i] == '\0') ++zero_even;
    if (bytes[i + 1] == '\0') ++zero_odd;
  }
  const size_t pairs = sample / 2;
  if (zero_odd * 10 >= pairs * 4 && zero_even * 20 < pairs) return "UTF-16LE";
  if (zero_even * 10 >= pairs * 4 && zero_odd * 20 < pairs) return "UTF-16BE";
  return std::string();
}

std::string Detect(const std::string& bytes) {
  uchardet_t detector = uchardet_new();
  uchardet_handle_data(detector, bytes.data(), bytes.size() < kDetectBytes ? bytes.size() : kDetectBytes);
  uchardet_data_end(detector);
  std::string charset = uchardet_get_charset(detector);
  uchardet_delete(detector);
  // Nothing recognised: the most common single-byte encoding of Western text
  // decodes every byte, so nothing is lost.
  if (charset.empty() || charset == "ASCII") return "WINDOWS-1252";
  return charset;
}

bool Convert(const std::string& bytes, size_t skip, const std::string& charset, std::string* out) {
  iconv_t converter = iconv_open("UTF-8", charset.c_str());
  if (converter == reinterpret_cast<iconv_t>(-1)) {
    errno = 0;
    return false;
  }
  char* in = const_cast<char*>(bytes.data()) + skip;
  size_t in_left = bytes.size() - skip;
  char buffer[16384];
  while (in_left > 0) {
    char* next = buffer;
    size_t out_left = sizeof(buffer);
    const size_t result = iconv(converter, &in, &in_left, &next, &out_left);
    out->append(buffer, static_cast<size_t>(next - buffer));
    if (result != static_cast<size_t>(-1)) continue;
    if (errno == E2BIG) continue;
    // An invalid or cut sequence: mark it and go on with the next byte.
    out->append("\xEF\xBF\xBD");
    ++in;
    --in_left;
  }
  iconv_close(converter);
  errno = 0;
  return true;
}

}  // namespace

std::string ConvertToUtf8(const std::string& bytes, std::string* out) {
  if (StartsWith(bytes, "\xEF\xBB\xBF", 3)) {
    out->append(bytes, 3, std::string::npos);
    return "UTF-8";
  }
  // UTF-32 marks first: the little-endian one begins like UTF-16's.
  if (StartsWith(bytes, "\xFF\xFE\x00\x00", 4) && Convert(bytes, 4, "UTF-32LE", out)) return "UTF-32LE";
  if (StartsWith(bytes, "\x00\x00\xFE\xFF", 4) && Convert(bytes, 4, "UTF-32BE", out)) return "UTF-32BE";
  if (StartsWith(bytes, "\xFF\xFE", 2) && Convert(bytes, 2, "UTF-16LE", out)) return "UTF-16LE";
  if (StartsWith(bytes, "\xFE\xFF", 2) && Convert(bytes, 2, "UTF-16BE", out)) return "UTF-16BE";
  const std::string wide = GuessUtf16WithoutMark(bytes);
  if (!wide.empty() && Convert(bytes, 0, wide, out)) return wide;
  if (IsValidUtf8(bytes)) {
    out->append(bytes);
    return "UTF-8";
  }
  const std::string charset = Detect(bytes);
  if (charset != "UTF-8" && Convert(bytes, 0, charset, out)) return charset;
  Convert(bytes, 0, "WINDOWS-1252", out);
  return "WINDOWS-1252";
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
