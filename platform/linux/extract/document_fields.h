// The value types of an extracted document's fields as the search index
// stores them (the names are common/index_fields.h). One table, so the
// library and the worker agree, and so a value of the wrong type never
// reaches the index.
#pragma once

#include <json/json.h>

#include <string>

#include "common/index_fields.h"

namespace corvlumex {
namespace platform {
namespace extract {

enum class FieldType { kString, kText, kInt, kDouble, kBool };

// True and `type` set when `name` is a field the worker may return.
bool ContentFieldType(const std::string& name, FieldType* type);

// True when `value` fits a field of `type` (an int field takes any integer
// that fits in 64 bits, a double field any number).
bool ValueFitsType(const Json::Value& value, FieldType type);

// Sets the picture's width and height in pixels when both are known (a
// format that does not say gives 0).
void SetPixelSize(Json::Value& fields, long width, long height);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
