// One queue line as the notifier writes it: a flat JSON object on one line,
// ended by "\n", with the keys "event", "is_dir", "path" and, for a rename,
// "path_old". Paths are byte strings and are written byte for byte (only
// quotes, backslashes and control bytes are escaped), so a name that is not
// valid UTF-8 reaches the indexer unchanged.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "fileindex/queue/event.h"

namespace corvlumex {
namespace notifyd {

// The event bits this program writes, from the queue line's own definition.
using fileindex::kEventAttr;
using fileindex::kEventCreate;
using fileindex::kEventDelete;
using fileindex::kEventModify;
using fileindex::kEventQueueCrash;
using fileindex::kEventRename;

// Appends one finished line (with its "\n") to `out`. `path_old` is written
// only when it is not empty.
void FormatQueueLine(std::string& out, uint32_t event, bool is_dir, std::string_view path,
                     std::string_view path_old = std::string_view());

// Appends `text` as a JSON string literal (quotes included).
void AppendJsonString(std::string& out, std::string_view text);

}  // namespace notifyd
}  // namespace corvlumex
