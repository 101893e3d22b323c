// A fast reader for the queue lines the notifier writes in the common
// shape: one flat object with "event" (plain unsigned digits), "is_dir"
// (true/false), "path" and "path_old" (strings with simple escapes) and
// "data" (null). It accepts a line only when the general JSON parser would
// read exactly the same values from it; anything else (other keys, \u
// escapes, comments, numbers of other forms, duplicate keys, missing
// required keys, malformed text) is left to the general parser, which also
// produces the exact error texts.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace corvlumex {
namespace fileindex {

struct FastEventFields {
  uint32_t event = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
};

// True when `line` was read completely into `out`; false means "use the
// general parser" (then `out` holds nothing meaningful).
bool ParseEventLineFast(std::string_view line, FastEventFields& out);

}  // namespace fileindex
}  // namespace corvlumex
