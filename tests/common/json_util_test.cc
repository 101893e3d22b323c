#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>

#include "common/error.h"
#include "common/json_util.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace {

using testing_support::JsonOf;

template <typename T>
std::string ReasonOf(const Json::Value& data, const std::string& key, bool required) {
  T out{};
  try {
    GetJsonValue<T>(out, data, key, required);
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrorBadArgument);
    return error.reason;
  }
  return "no error";
}

TEST(GetJsonValueTest, RequiredReadsReportMissingAndMistypedMembers) {
  const Json::Value data = JsonOf(R"({"a":1})");
  EXPECT_EQ(ReasonOf<std::string>(data, "path", true), "Missing property: path, data=" + JsonToString(data));
  EXPECT_EQ(ReasonOf<bool>(data, "flag", true), "Missing property: flag, data=" + JsonToString(data));
  const Json::Value typed = JsonOf(R"({"n":1.5,"s":"x","o":{}})");
  // One shared text for every type.
  EXPECT_EQ(ReasonOf<long long>(typed, "n", true), "Not a string, data=" + JsonToString(typed));
  EXPECT_EQ(ReasonOf<int>(typed, "o", true), "Not a string, data=" + JsonToString(typed));
  EXPECT_EQ(ReasonOf<bool>(typed, "s", true), "Not a string, data=" + JsonToString(typed));
}

TEST(GetJsonValueTest, NonObjectDataIsRefusedEvenWhenNotRequired) {
  for (const char* text : {"[1,2]", "\"text\"", "3"}) {
    const Json::Value data = JsonOf(text);
    EXPECT_EQ(ReasonOf<std::string>(data, "k", false), "Not an object, data=" + JsonToString(data));
    EXPECT_EQ(ReasonOf<Json::Value>(data, "k", true), "Not an object, data=" + JsonToString(data));
  }
}

// Null data (a state file that does not exist) reads as an empty object; a
// missing or mistyped member that is not required leaves the default.
TEST(GetJsonValueTest, NonRequiredReadsLeaveTheDefault) {
  int out = 42;
  GetJsonValue(out, Json::Value(), "resume_time", false);
  EXPECT_EQ(out, 42);
  EXPECT_EQ(ReasonOf<int>(Json::Value(), "resume_time", true), "Missing property: resume_time, data=null");
  const Json::Value data = JsonOf(R"({"s":[1],"n":"7"})");
  std::string text = "default";
  GetJsonValue(text, data, "s", false);
  EXPECT_EQ(text, "default");
  long long number = -1;
  GetJsonValue(number, data, "n", false);
  EXPECT_EQ(number, -1);
}

TEST(GetJsonValueTest, ConversionsFollowTheLibraryRules) {
  const Json::Value data = JsonOf(R"({"n":7,"big":9000000000,"b":true,"d":2.5,"v":{"x":[1]}})");
  long long number = 0;
  GetJsonValue(number, data, "n", true);
  EXPECT_EQ(number, 7);
  GetJsonValue(number, data, "big", true);
  EXPECT_EQ(number, 9000000000LL);
  int small = 0;
  EXPECT_EQ(ReasonOf<int>(data, "big", true), "Not a string, data=" + JsonToString(data));
  GetJsonValue(small, data, "b", true);  // a boolean converts to int
  EXPECT_EQ(small, 1);
  double real = 0;
  GetJsonValue(real, data, "d", true);
  EXPECT_DOUBLE_EQ(real, 2.5);
  Json::Value value;
  GetJsonValue(value, data, "v", true);
  EXPECT_EQ(value["x"][0].asInt(), 1);
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

// A writer rewrites the file as fast as it can while a reader parses it: the
// reader must only ever see a whole old or a whole new file. A writer that
// rewrites in place is caught within a few reads; 60 rounds leave a margin.
TEST(JsonFileTest, ReaderNeverSeesATornFile) {
  testing_support::Sandbox root(false);
  const std::string path = root.path() + "/state.json";
  Json::Value big(Json::arrayValue);
  for (int i = 0; i < 2000; ++i) big.append("entry number " + std::to_string(i));
  ASSERT_TRUE(JsonToFile(big, path));

  const pid_t writer = fork();
  ASSERT_GE(writer, 0);
  if (writer == 0) {
    Json::Value value = big;
    for (int round = 0; round < 60; ++round) {
      value[0] = "round " + std::to_string(round);
      if (!JsonToFile(value, path)) _exit(1);
    }
    _exit(0);
  }
  int reads = 0;
  int status = 0;
  while (waitpid(writer, &status, WNOHANG) == 0) {
    Json::Value value;
    ASSERT_TRUE(JsonFromFile(value, path)) << "torn or missing file after " << reads << " reads";
    ASSERT_EQ(value.size(), 2000u);
    ++reads;
  }
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  EXPECT_GT(reads, 0);
}

}  // namespace
}  // namespace corvlumex
