#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/queue/event.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace fileindex {
namespace {

using testing_support::LogCapture;

// Reads a line the general way only, to check that the fast reader never
// disagrees with it.
struct Reference {
  bool ok = false;
  ErrorCode code = kErrorUnexpected;
  std::string reason;
  unsigned event = 0;
  bool is_dir = false;
  std::string path, path_old;
  Json::Value data;
};

Reference ReadGenerally(const std::string& line) {
  Reference ref;
  try {
    Json::Value root;
    bool parsed = false;
    try {
      parsed = JsonFromString(root, line);
    } catch (const Json::Exception&) {
    }
    if (!parsed) throw Error(kErrorMalformedEvent, "Malformed event_raw: " + line);
    GetJsonValue<unsigned int>(ref.event, root, "event", true);
    GetJsonValue<bool>(ref.is_dir, root, "is_dir", false);
    GetJsonValue<std::string>(ref.path, root, "path", true);
    GetJsonValue<std::string>(ref.path_old, root, "path_old", false);
    GetJsonValue<Json::Value>(ref.data, root, "data", false);
    ref.ok = true;
  } catch (const Error& error) {
    ref.code = error.code;
    ref.reason = error.reason;
  }
  return ref;
}

// Each line is read as the general parser reads it: the same fields
// (absent optional ones default), or the same error code and reason. Only a
// line that is not JSON is logged, once.
TEST(EventTest, FastReaderAgreesWithTheGeneralParser) {
  const std::vector<std::string> lines = {
      "",
      "{\"event\":64,",
      "garbage",
      std::string(5000, '[') + std::string(5000, ']'),  // nesting beyond the parser's limit
      "{\"event\":2,\"path\":\"/v/s/a\"}\r",
      R"({"event":-1,"path":"/v/s/a"})",
      R"({"event":"64","path":"/v/s/a"})",
      R"({"path":"/v/s/a"})",
      R"({"event":64})",
      "[1,2]",
      R"({"event":64,"is_dir":false,"path":"/v/s/a b/c.txt"})",
      R"({"data":null,"event":256,"is_dir":true,"path":"/v/s/new","path_old":"/v/s/old"})",
      R"(  { "event" : 128 , "path" : "/v/s/x" , "is_dir" : true }  )",
      "\t{\"event\":2,\"path\":\"/v/s/tab\"}\t",
      R"({"event":2,"path":"/v/s/q\"uote\\back\/slash\n\t\r\b\f"})",
      R"({"event":2,"path":"/v/s/\u00e9t\u00E9"})",
      R"({"event":2,"path":"/v/s/\ud83d\ude00"})",
      R"({"event":2,"path":"/v/s/bad\x"})",
      "{\"event\":2,\"path\":\"/v/s/\xc3\xa9\xff\"}",
      "{\"event\":2,\"path\":\"/v/s/ctl\x01\"}",
      std::string("{\"event\":2,\"path\":\"/v/s/nul\0x\"}", 29),
      R"({"event":064,"path":"/v/s/a"})",
      R"({"event":0,"path":"/v/s/a"})",
      R"({"event":64.0,"path":"/v/s/a"})",
      R"({"event":6.4e1,"path":"/v/s/a"})",
      R"({"event":1e400,"path":"/v/s/a"})",
      R"({"event":4294967295,"path":"/v/s/a"})",
      R"({"event":4294967296,"path":"/v/s/a"})",
      R"({"event":999999999,"path":"/v/s/a"})",
      R"({"event":-0,"path":"/v/s/a"})",
      R"({"event":64,"is_dir":1,"path":"/v/s/a"})",
      R"({"event":64,"is_dir":"yes","path":"/v/s/a"})",
      R"({"event":64,"is_dir":null,"path":"/v/s/a"})",
      R"({"event":64,"is_dir":truex,"path":"/v/s/a"})",
      R"({"event":64,"path":5})",
      R"({"event":64,"path":null})",
      R"({"event":64,"path":"/v/s/a","path_old":7})",
      R"({"event":64,"path":"/a","path":"/b"})",
      R"({"event":64,"event":2,"path":"/a"})",
      R"({"event":64,"path":"/a","extra":[1,{"x":2}]})",
      R"({"event":131072,"path":"/a","data":{"document":true}})",
      R"({"event":131072,"path":"/a","data":"text"})",
      R"({"event":64,"path":"/a"} trailing)",
      R"({"event":64,"path":"/a"}})",
      R"({"event":64,"path":"/a",})",
      R"({"event":64 /* c */,"path":"/a"})",
      R"({"event":64,"path":"/a"} // c)",
      "\xef\xbb\xbf{\"event\":64,\"path\":\"/a\"}",
      R"({"ev\u0065nt":64,"path":"/a"})",
      R"({"event":64,"path":"/a")",
      R"({"event":64,"path":"/a)",
      R"({event:64,"path":"/a"})",
      R"({'event':64,"path":"/a"})",
      R"({})",
      R"(null)",
      R"("text")",
      R"(64)",
  };
  for (const std::string& line : lines) {
    SCOPED_TRACE(line.substr(0, 100));
    const Reference ref = ReadGenerally(line);
    LogCapture log;
    try {
      const Event event(line);
      ASSERT_TRUE(ref.ok) << ref.reason;
      EXPECT_EQ(event.event, ref.event);
      EXPECT_EQ(event.is_dir, ref.is_dir);
      EXPECT_EQ(event.path, ref.path);
      EXPECT_EQ(event.path_old, ref.path_old);
      EXPECT_EQ(event.data, ref.data);
    } catch (const Error& error) {
      ASSERT_FALSE(ref.ok);
      EXPECT_EQ(error.code, ref.code);
      EXPECT_EQ(error.reason, ref.reason);
    }
    const bool malformed = !ref.ok && ref.code == kErrorMalformedEvent;
    ASSERT_EQ(log.Lines().size(), malformed ? 1u : 0u);
    if (malformed) {  // (the log line ends at a NUL in the text)
      EXPECT_NE(log.Lines()[0].find("(Event) Failed [!data.fromString(event_raw)], reason: " +
                                    std::string(ref.reason.c_str())),
                std::string::npos);
    }
  }
  // The reasons the general parser gives, as the daemon's log shows them.
  const std::vector<std::pair<std::string, std::string>> reasons = {
      {"garbage", "Malformed event_raw: garbage"},
      {R"({"event":-1,"path":"/v/s/a"})", R"(Not a string, data={"event":-1,"path":"/v/s/a"})"},
      {R"({"path":"/v/s/a"})", "Missing property: event, data="},
      {R"({"event":64})", "Missing property: path, data="},
      {"[1,2]", "Not an object, data=[1,2]"}};
  for (const auto& [line, reason] : reasons) {
    EXPECT_EQ(ReadGenerally(line).reason.substr(0, reason.size()), reason) << line;
    EXPECT_EQ(ReadGenerally(line).code, line == "garbage" ? kErrorMalformedEvent : kErrorBadArgument) << line;
  }
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
