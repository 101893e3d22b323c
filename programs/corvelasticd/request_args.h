// Typed reads of request members that answer a wrong or missing member with
// kCodeBadArgument naming it (the library's GetJsonValue throws the
// library's own code, which is not the daemon's answer).
#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>
#include <vector>

namespace corvlumex {
namespace elasticd {

std::string RequiredString(const Json::Value& data, const char* key);
const Json::Value& RequiredObject(const Json::Value& data, const char* key);
std::string OptionalString(const Json::Value& data, const char* key, const std::string& fallback);
int64_t OptionalInt(const Json::Value& data, const char* key, int64_t fallback);
bool OptionalBool(const Json::Value& data, const char* key, bool fallback);
std::vector<std::string> OptionalStrings(const Json::Value& data, const char* key);

}  // namespace elasticd
}  // namespace corvlumex
