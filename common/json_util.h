// Typed access to JSON members, deep merging of change sets, and the four
// conveniences every state file and request relies on.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <string>
#include <vector>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

template <typename T>
bool isJsonType(const Json::Value& value);
template <typename T>
T asJsonType(const Json::Value& value);

// Reads member `key` of object `data` into `out` (see json_util.cc for the
// exact rules). A null `data` counts as an empty object, so reads of a state
// file that does not exist yet behave like reads of "{}".
template <typename T>
void GetJsonValue(T& out, const Json::Value& data, const std::string& key, bool required);

// ", data=" and the JSON text: the common tail of every reason text here.
std::string AppendData(const Json::Value& data);

// Deep merge: null deletes a member, objects merge recursively, anything
// else (arrays included) replaces the stored value.
void JsonApplyChanges(Json::Value& target, const Json::Value& changes);

template <typename T>
Json::Value Vec2JsonArr(const std::vector<T>& values);
template <typename T>
std::vector<T> JsonArr2Vec(const Json::Value& array);

// Parses text; false when it is not valid JSON (the value is then untouched).
bool JsonFromString(Json::Value& value, const std::string& text);
// Reads and parses a whole file; false when it is missing or not valid JSON.
bool JsonFromFile(Json::Value& value, const std::string& path);
// Replaces the file atomically (temporary file beside it, synced, renamed
// over the old one) with the given mode; false on any failure.
bool JsonToFile(const Json::Value& value, const std::string& path, mode_t mode = 0644);
// Compact JSON text on one line.
std::string JsonToString(const Json::Value& value);

}  // namespace corvlumex

CORVLUMEX_API_END
