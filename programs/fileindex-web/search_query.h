// The words a person typed as corvelasticd's query clause. An empty text
// searches everything (the filters alone choose).
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace web {

Json::Value QueryFromText(const std::string& text);

}  // namespace web
}  // namespace corvlumex
