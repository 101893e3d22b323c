// What the search daemon needs to create a share's index: the settings, the
// field mappings and the event-handler plug-in. The names of the document
// fields are common/index_fields.h.
#pragma once

#include <json/json.h>

#include "common/export.h"
#include "common/index_fields.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {
namespace elastic {

// Content-extraction option: also extract the file's metadata.
inline constexpr char kOptionNeedMeta[] = "need_meta";

// The built-in source texts, tab-indented; exposed so their member order can
// be checked (a parsed Json::Value keeps members sorted by name).
extern const char kFileIndexMappingsText[];
extern const char kFileIndexEventHandlerText[];

// Each call parses the built-in text afresh and returns a new value; a text
// that does not parse is Error 502.
Json::Value GetFileIndexSettings();
Json::Value GetFileIndexMappings();
// {"lib_path": <handler library>}, the path relocated by the system root.
Json::Value GetFileIndexEventHandler();

}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
