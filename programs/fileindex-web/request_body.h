// Reading what a browser sent: a JSON object body with only the members a
// call knows, each of the type it needs, and query parameters likewise.
// Anything else is an ApiError 400 naming the member and what it should be,
// so a mistyped field is reported instead of silently ignored.
#pragma once

#include <json/json.h>

#include <initializer_list>
#include <map>
#include <optional>
#include <string>

namespace corvlumex {
namespace web {

// Parses `text` (strict JSON, one object) and refuses members not in `known`.
Json::Value ParseBody(const std::string& text, std::initializer_list<const char*> known);

std::string RequiredString(const Json::Value& body, const char* key);
std::optional<std::string> OptionalString(const Json::Value& body, const char* key);
std::optional<bool> OptionalBool(const Json::Value& body, const char* key);
std::optional<long long> OptionalInteger(const Json::Value& body, const char* key, long long min, long long max);
// A non-empty array of strings.
Json::Value RequiredStringList(const Json::Value& body, const char* key);

// Query parameters: refuses names not in `known`, and repeated names.
using Params = std::multimap<std::string, std::string>;
void CheckParams(const Params& params, std::initializer_list<const char*> known);
std::optional<std::string> Param(const Params& params, const char* key);
std::optional<long long> IntegerParam(const Params& params, const char* key, long long min, long long max);

}  // namespace web
}  // namespace corvlumex
