// One queue line as the notifier writes it: a flat JSON object on one line,
// ended by "\n", with the keys "event", "is_dir", "path" and, for a rename,
// "path_old". Paths are byte strings and are written byte for byte (only
// quotes, backslashes and control bytes are escaped), so a name that is not
// valid UTF-8 reaches the indexer unchanged.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace corvlumex {
namespace notifyd {

// Bits of a line's "event" mask.
enum QueueEventBit : uint32_t {
  kEventModify = 0x2,
  kEventAttr = 0x4,
  kEventCreate = 0x40,
  kEventDelete = 0x80,
  kEventRename = 0x100,
  kEventQueueCrash = 0x200,
};

// Appends one finished line (with its "\n") to `out`. `path_old` is written
// only when it is not empty.
void FormatQueueLine(std::string& out, uint32_t event, bool is_dir, std::string_view path,
                     std::string_view path_old = std::string_view());

// Appends `text` as a JSON string literal (quotes included).
void AppendJsonString(std::string& out, std::string_view text);

}  // namespace notifyd
}  // namespace corvlumex
