#include "fileindex/queue/event.h"

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/queue/op_fast_json.h"

namespace corvlumex {
namespace fileindex {
namespace {

// The general parser throws instead of failing for some inputs (nesting
// deeper than its stack limit); for a queue line that is malformed too.
bool ParseJson(Json::Value& value, const std::string& text) {
  try {
    return JsonFromString(value, text);
  } catch (const Json::Exception&) {
    return false;
  }
}

}  // namespace

Event::Event(const std::string& event_raw) {
  // Nearly every line has the notifier's flat shape; reading it directly
  // keeps large queues cheap. Everything else takes the general road below.
  FastEventFields fields;
  if (ParseEventLineFast(event_raw, fields)) {
    event = fields.event;
    is_dir = fields.is_dir;
    path = std::move(fields.path);
    path_old = std::move(fields.path_old);
    return;
  }
  Json::Value root;
  CORV_CHECK_THROW_TEXT(!ParseJson(root, event_raw), "!data.fromString(event_raw)", kErrorMalformedEvent,
                        "Malformed event_raw: " + event_raw);
  unsigned int mask = 0;
  GetJsonValue<unsigned int>(mask, root, "event", true);
  event = mask;
  GetJsonValue<bool>(is_dir, root, "is_dir", false);
  GetJsonValue<std::string>(path, root, "path", true);
  GetJsonValue<std::string>(path_old, root, "path_old", false);
  GetJsonValue<Json::Value>(data, root, "data", false);
}

Event::~Event() = default;

}  // namespace fileindex
}  // namespace corvlumex
