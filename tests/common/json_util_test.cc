#include <gtest/gtest.h>
#include <sys/stat.h>

#include <type_traits>

#include "common/error.h"
#include "common/json_util.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace {

using testing_support::JsonOf;

// What GetJsonValue<T> leaves in a variable that held 42 (or "default"), or
// "error: <reason>" (always code 120).
template <typename T>
std::string Read(const std::string& data, const std::string& key, bool required) {
  T out{};
  if constexpr (std::is_arithmetic<T>::value) out = 42;
  if constexpr (!std::is_arithmetic<T>::value) out = T("default");
  try {
    GetJsonValue<T>(out, data == "null" ? Json::Value() : JsonOf(data), key, required);
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrorBadArgument);
    return "error: " + error.reason;
  }
  if constexpr (std::is_same<T, Json::Value>::value) return JsonToString(out);
  return ::testing::PrintToString(out);
}

// Required members that are missing or mistyped are named with the whole
// data (one text for every type); data that is no object is refused even
// when not required; null data (a state file that does not exist) reads as
// an empty object; what is not required keeps the default; conversions follow
// the JSON library's rules.
TEST(GetJsonValueTest, Table) {
  using Reader = std::string (*)(const std::string&, const std::string&, bool);
  const std::string typed = R"({"n":1.5,"o":{},"s":"x"})";
  const std::string values = R"({"n":7,"big":9000000000,"b":true,"d":2.5,"v":{"x":[1]}})";
  const struct {
    Reader read;
    std::string data, key;
    bool required;
    std::string result;
  } rows[] = {
      {Read<std::string>, R"({"a":1})", "path", true, R"(error: Missing property: path, data={"a":1})"},
      {Read<bool>, R"({"a":1})", "flag", true, R"(error: Missing property: flag, data={"a":1})"},
      {Read<long long>, typed, "n", true, "error: Not a string, data=" + typed},
      {Read<int>, typed, "o", true, "error: Not a string, data=" + typed},
      {Read<bool>, typed, "s", true, "error: Not a string, data=" + typed},
      {Read<std::string>, "[1,2]", "k", false, "error: Not an object, data=[1,2]"},
      {Read<Json::Value>, "\"text\"", "k", true, "error: Not an object, data=\"text\""},
      {Read<std::string>, "3", "k", false, "error: Not an object, data=3"},
      {Read<int>, "null", "resume_time", false, "42"},
      {Read<int>, "null", "resume_time", true, "error: Missing property: resume_time, data=null"},
      {Read<std::string>, R"({"s":[1],"n":"7"})", "s", false, "\"default\""},
      {Read<long long>, R"({"s":[1],"n":"7"})", "n", false, "42"},
      {Read<long long>, values, "n", true, "7"},
      {Read<long long>, values, "big", true, "9000000000"},
      {Read<int>, values, "big", true, "error: Not a string, data=" + JsonToString(JsonOf(values))},
      {Read<int>, values, "b", true, "1"},  // a boolean converts to int
      {Read<double>, values, "d", true, "2.5"},
      {Read<Json::Value>, values, "v", true, R"({"x":[1]})"},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(row.read(row.data, row.key, row.required), row.result) << row.data << " " << row.key;
  }
}

TEST(JsonApplyChangesTest, DeepMergeDeletesAndReplaces) {
  Json::Value target = JsonOf(R"({"a":1,"o":{"y":2},"l":[2,3],"keep":"k"})");
  JsonApplyChanges(target, JsonOf(R"({"a":null,"o":{"x":1},"l":[1],"missing":null})"));
  EXPECT_EQ(target, JsonOf(R"({"o":{"x":1,"y":2},"l":[1],"keep":"k"})"));

  Json::Value empty(Json::objectValue);
  JsonApplyChanges(empty, JsonOf(R"({"o":{}})"));
  ASSERT_TRUE(empty.isMember("o"));
  EXPECT_TRUE(empty["o"].isNull());
}

TEST(JsonArrayTest, ConvertsBothWays) {
  EXPECT_EQ(Vec2JsonArr<std::string>({}), Json::Value(Json::arrayValue));
  EXPECT_EQ(Vec2JsonArr<std::string>({"b", "a"}), JsonOf(R"(["b","a"])"));
  EXPECT_EQ(JsonArr2Vec<std::string>(JsonOf(R"(["a",{},"b"])")), (std::vector<std::string>{"a", "b"}));
  EXPECT_TRUE(JsonArr2Vec<std::string>(JsonOf(R"({"a":"b"})")).empty());
}

TEST(JsonFileTest, ConveniencesReportSuccess) {
  testing_support::Sandbox root(false);
  Json::Value value;
  EXPECT_FALSE(JsonFromString(value, "{"));
  EXPECT_FALSE(JsonFromFile(value, root.path() + "/missing.json"));
  root.WriteFile("bad.json", "{\"a\":");
  EXPECT_FALSE(JsonFromFile(value, root.path() + "/bad.json"));

  const Json::Value stored = JsonOf(R"({"name":"Ünïcode","n":[1,2]})");
  ASSERT_TRUE(JsonToFile(stored, root.path() + "/good.json", 0600));
  ASSERT_TRUE(JsonFromFile(value, root.path() + "/good.json"));
  EXPECT_EQ(value, stored);
  struct stat st;
  ASSERT_EQ(stat((root.path() + "/good.json").c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 0777, 0600u);
  EXPECT_FALSE(JsonToFile(stored, root.path() + "/no/such/dir/x.json"));
}

// Text that merely starts with a value is not JSON: a queue line or a reply
// with something after the value, a comment or a trailing comma is refused,
// and the value keeps what it held. Too deep a nesting is invalid, not a throw.
TEST(JsonFileTest, OnlyValidJsonIsAccepted) {
  Json::Value value = JsonOf(R"({"kept":1})");
  const std::string deep = std::string(5000, '[') + std::string(5000, ']');
  for (const std::string text : {R"({"a":1} junk)", R"({"a":1}})", "// c\n{}", R"({"a":1} // c)", "[1,]",
                                 R"({"a":1,})", "", "  ", deep.c_str()}) {
    EXPECT_FALSE(JsonFromString(value, text)) << text;
    EXPECT_EQ(value, JsonOf(R"({"kept":1})")) << text;
  }
  for (const char* text : {"{}\n", " [1, 2] ", "3", "\"text\"", "null"}) {
    EXPECT_TRUE(JsonFromString(value, text)) << text;
  }
  testing_support::Sandbox root(false);
  root.WriteFile("extra.json", "{\"a\":1}\n{\"b\":2}\n");
  EXPECT_FALSE(JsonFromFile(value, root.path() + "/extra.json"));
}

}  // namespace
}  // namespace corvlumex
