// The "search" and "suggest" commands: one query over one or several
// indexes, filtered for the asking user before paging, merged in order.
#pragma once

#include <json/json.h>

#include "programs/corvelasticd/access_filter.h"
#include "programs/corvelasticd/index_registry.h"

namespace corvlumex {
namespace elasticd {

// {"id" | "ids", "query": {"qsl": ...}, "from", "size", "sort", "load_field",
//  "highlight", "track_total"} -> {"total", "total_exact", "hits": [...]}
Json::Value RunSearch(const IndexRegistry& registry, const Json::Value& data, const AccessFilter& filter);

// {"id" | "ids", "field", "text", "size"} -> {"suggestions": [{"term", "freq"}]}
Json::Value RunSuggest(const IndexRegistry& registry, const Json::Value& data, const AccessFilter& filter);

}  // namespace elasticd
}  // namespace corvlumex
