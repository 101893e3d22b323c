// JSON text in and out for the request path. The reader and the writer are
// built once per thread: setting them up costs more than parsing or writing
// a typical request or answer.
#pragma once

#include <json/json.h>

#include <string>
#include <string_view>

namespace corvlumex {
namespace elasticd {

// False (and `value` untouched) when `text` is not JSON, or nests deeper
// than the JSON reader allows. Never throws.
bool ParseJsonText(std::string_view text, Json::Value* value);
// One line, UTF-8 kept as it is.
std::string JsonText(const Json::Value& value);

}  // namespace elasticd
}  // namespace corvlumex
