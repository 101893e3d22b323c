// One line of a share's queue file: the file-change event the notifier (or
// AddCustomEvent) appended, parsed into a record.
//
// Line format: one JSON object on one line, terminated by "\n":
//   {"event": <mask, unsigned>, "is_dir": <bool, optional>, "path": <full path>,
//    "path_old": <old full path of a rename, optional>, "data": <any, optional>}
#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// Bits of the "event" mask. A line normally carries one bit; readers test
// each bit on its own, and unknown bits are carried and ignored.
enum EventMask : uint32_t {
  kEventModify = 0x2,
  kEventAttr = 0x4,
  kEventCreate = 0x40,
  kEventDelete = 0x80,
  kEventRename = 0x100,
  kEventQueueCrash = 0x200,
  kEventReindex = 0x10000,
  kEventUpdateCfg = 0x20000,
};

class Event {
 public:
  // Parses one queue line (without its "\n"). A line that is not JSON is
  // logged and thrown as Error 906 "Malformed event_raw: <line>"; a missing
  // required key or a mistyped value throws the typed-read Error 120
  // without a log line.
  explicit Event(const std::string& event_raw);
  ~Event();

  uint32_t event = 0;     // "event", required
  bool is_dir = false;    // "is_dir"
  std::string path;       // "path", required; for a rename the new path
  std::string path_old;   // "path_old"; for a rename the previous path
  Json::Value data;       // "data"; settings payload of kEventUpdateCfg
};

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
