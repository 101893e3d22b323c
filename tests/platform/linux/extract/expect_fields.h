// Field checks of the extraction tests as table rows: each expected value is
// the field's JSON text, so its type counts too (400 is not "400").
#pragma once

#include <gtest/gtest.h>
#include <json/json.h>

#include <string>
#include <utility>
#include <vector>

#include "common/json_util.h"

namespace corvlumex {
namespace testing_support {

using FieldRows = std::vector<std::pair<const char*, std::string>>;

inline void ExpectFields(const Json::Value& document, const FieldRows& rows) {
  for (const auto& [field, json] : rows) EXPECT_EQ(json, JsonToString(document[field])) << field;
}

}  // namespace testing_support
}  // namespace corvlumex
