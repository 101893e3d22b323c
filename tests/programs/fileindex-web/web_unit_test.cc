// The web daemon's pieces that decide alone, with time passed in: session
// expiry, the sign-in throttle, request bodies, and the path rule.
#include <gtest/gtest.h>

#include "programs/fileindex-web/api_error.h"
#include "programs/fileindex-web/path_checks.h"
#include "programs/fileindex-web/request_body.h"
#include "programs/fileindex-web/session_store.h"
#include "programs/fileindex-web/sign_in_throttle.h"

namespace corvlumex {
namespace web {
namespace {

using std::chrono::minutes;
using std::chrono::seconds;

TEST(SessionStoreTest, SessionsEndWhenIdleTooLongTooOldOrSignedOut) {
  const auto start = SessionStore::Clock::time_point{} + std::chrono::hours(1000);
  const struct {
    const char* what;
    std::vector<minutes> uses;  // requests after sign-in, each from the previous
    bool alive;
  } cases[] = {
      {"used within the idle time", {minutes(29)}, true},
      {"idle too long", {minutes(31)}, false},
      {"kept busy but past its lifetime", {minutes(25), minutes(25), minutes(25), minutes(25), minutes(25)}, false},
      {"kept busy within its lifetime", {minutes(25), minutes(25), minutes(25), minutes(25)}, true},
  };
  for (const auto& c : cases) {
    SessionStore store(minutes(30), minutes(110));
    const Session session = store.Create("alice", 1000, false, start);
    auto now = start;
    bool alive = true;
    for (const minutes step : c.uses) {
      now += step;
      alive = store.Find(session.id, now).has_value();
    }
    EXPECT_EQ(alive, c.alive) << c.what;
  }
  SessionStore store(minutes(30), minutes(110));
  const Session a = store.Create("alice", 1000, true, start);
  const Session b = store.Create("bob", 1001, false, start);
  EXPECT_NE(a.id, b.id);
  EXPECT_NE(a.csrf_token, b.csrf_token);
  EXPECT_EQ(a.id.size(), 64u);
  store.End(a.id);
  EXPECT_FALSE(store.Find(a.id, start).has_value());
  EXPECT_EQ(store.Find(b.id, start)->user, "bob");
  EXPECT_FALSE(store.Find("", start).has_value());
  // One character changed (to one it is not already) is another, unknown id.
  EXPECT_FALSE(store.Find(b.id.substr(0, 63) + (b.id.back() == '0' ? "1" : "0"), start).has_value());
}

TEST(SignInThrottleTest, FailuresMakeTheNextAttemptWaitLongerEachTime) {
  const auto start = SignInThrottle::Clock::time_point{} + std::chrono::hours(1000);
  SignInThrottle throttle;
  std::vector<long long> waits;
  for (int i = 0; i < 6; ++i) {
    throttle.Failed("alice", "10.0.0.1", start);
    waits.push_back(throttle.WaitSeconds("alice", "10.0.0.2", start));
  }
  EXPECT_EQ(waits, (std::vector<long long>{0, 0, 4, 8, 16, 32}));
  EXPECT_EQ(throttle.WaitSeconds("alice", "10.0.0.2", start + seconds(32)), 0);
  // Another account from another address is not slowed by alice's failures.
  EXPECT_EQ(throttle.WaitSeconds("bob", "10.0.0.2", start), 0);
  throttle.Succeeded("alice");
  EXPECT_EQ(throttle.WaitSeconds("alice", "10.0.0.2", start), 0);
  // Many names tried from one address slow that address down.
  for (int i = 0; i < 9; ++i) throttle.Failed("name" + std::to_string(i), "10.0.0.9", start);
  EXPECT_GT(throttle.WaitSeconds("someone-else", "10.0.0.9", start), 0);
  // The wait has a ceiling.
  for (int i = 0; i < 40; ++i) throttle.Failed("carol", "10.0.0.3", start);
  EXPECT_EQ(throttle.WaitSeconds("carol", "10.0.0.4", start), SignInThrottle::kLongestWait.count());
}

TEST(RequestBodyTest, RefusesWhatACallDoesNotTake) {
  const struct {
    std::string body;
    const char* reason_part;  // nullptr: accepted
  } cases[] = {
      {R"({"path": "/share/a", "document": true})", nullptr},
      {"", nullptr},
      {R"({"path": "/share/a",})", "not valid JSON"},
      {R"({"path": "/share/a"} trailing)", "not valid JSON"},
      {R"(["/share/a"])", "must be a JSON object"},
      {R"({"path": "/share/a", "colour": "red"})", "unknown field \"colour\""},
      {R"({"path": "/share/a", "path": "/share/b"})", "not valid JSON"},
      {std::string(200, '['), "not valid JSON"},
  };
  for (const auto& c : cases) {
    try {
      ParseBody(c.body, {"path", "document"});
      EXPECT_EQ(c.reason_part, nullptr) << c.body;
    } catch (const ApiError& error) {
      ASSERT_NE(c.reason_part, nullptr) << c.body << ": " << error.what();
      EXPECT_NE(std::string(error.what()).find(c.reason_part), std::string::npos) << error.what();
      EXPECT_EQ(error.status(), 400);
    }
  }
  const Json::Value body = ParseBody(R"({"path": 5, "hours": "1", "document": "yes"})", {"path", "hours", "document"});
  EXPECT_THROW(RequiredString(body, "path"), ApiError);
  EXPECT_THROW(OptionalInteger(body, "hours", 0, 10), ApiError);
  EXPECT_THROW(OptionalBool(body, "document"), ApiError);
  EXPECT_THROW(OptionalInteger(ParseBody(R"({"hours": 99999999999})", {"hours"}), "hours", 0, 8760), ApiError);
  EXPECT_EQ(OptionalInteger(ParseBody(R"({"hours": 2})", {"hours"}), "hours", 0, 8760), 2);
  EXPECT_THROW(CheckParams({{"q", "a"}, {"q", "b"}}, {"q"}), ApiError);
  EXPECT_THROW(CheckParams({{"qq", "a"}}, {"q"}), ApiError);
  EXPECT_THROW(IntegerParam({{"from", "12abc"}}, "from", 0, 100), ApiError);
  EXPECT_THROW(IntegerParam({{"from", "-1"}}, "from", 0, 100), ApiError);
}

TEST(PathChecksTest, OnlyCleanAbsolutePathsPass) {
  const struct {
    std::string path;
    bool clean;
  } cases[] = {
      {"/share", true},         {"/share/a b/c.txt", true}, {"", false},          {"/", false},
      {"share/a", false},       {"/share/../etc", false},   {"/share/..", false}, {"/share/./a", false},
      {"/share//a", false},     {"/share/a/", false},       {"/share/..a", true}, {std::string("/share/a\0b", 10), false},
  };
  for (const auto& c : cases) EXPECT_EQ(IsCleanAbsolutePath(c.path), c.clean) << c.path;
}

}  // namespace
}  // namespace web
}  // namespace corvlumex
