// The words a person typed in the search box as corvelasticd's query clause,
// through the one query syntax of the system (docs/search.md). A syntax
// error is an ApiError 400 that says where and what.
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace web {

Json::Value QueryFromText(const std::string& text);

}  // namespace web
}  // namespace corvlumex
