// Turns text of any common encoding into UTF-8: a byte-order mark decides
// first, valid UTF-8 stays as it is, anything else is identified by uchardet
// and converted by iconv.
#pragma once

#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

// Appends the UTF-8 form of `bytes` to `out`; returns the encoding used
// ("UTF-8", "UTF-16LE", "WINDOWS-1252", ...). Bytes the encoding cannot
// explain become U+FFFD.
std::string ConvertToUtf8(const std::string& bytes, std::string* out);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
