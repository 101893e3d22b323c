#include "fileindex/elastic/comm.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "common/error.h"
#include "common/json_util.h"
#include "common/sys.h"
#include "fileindex/elastic/daemon_codes.h"
#include "tests/fileindex/elastic/fake_search_daemon.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace {

using testing_support::FakeAnswer;
using testing_support::FakeSearchDaemon;
using testing_support::JsonOf;
using testing_support::LogCapture;
using testing_support::Sandbox;
using testing_support::SleepRecorder;

// Runs one exchange and returns the Error it threw (code 0 when none).
Error ExchangeError(const Json::Value& req) {
  Json::Value res;
  return testing_support::ErrorOrNone([&] { SendRequestImpl(res, req); });
}

class SendRequestTest : public ::testing::Test {
 protected:
  Sandbox root_;
  SleepRecorder sleeps_;
  LogCapture log_;
  Json::Value req_ = JsonOf(R"({"command": "index_delete", "data": {"id": "fileindex_music"}})");
};

// One framed request per connection, through the platform's Unix-socket
// client; a connection that is not connected refuses to carry.
TEST_F(SendRequestTest, OneFramedRequestPerConnectionAndTheAnswerIsReturned) {
  FakeSearchDaemon daemon;
  daemon.Enqueue(FakeAnswer::Success(JsonOf(R"({"hits": 2})")), 2);
  Json::Value res;
  SendRequestImpl(res, req_);
  SendRequestImpl(res, req_);
  EXPECT_EQ(res["data"]["hits"].asInt(), 2);
  EXPECT_EQ(daemon.Requests(), std::vector<Json::Value>(2, req_));
  EXPECT_EQ(daemon.Connections(), 2);
  EXPECT_TRUE(sleeps_.Sleeps().empty());
  EXPECT_TRUE(log_.Lines().empty());
  corvdaemon::DomainSockConnection idle(ElasticSocketPath());
  std::string raw;
  EXPECT_FALSE(idle.Send("{}"));
  EXPECT_FALSE(idle.Recv(raw));
}

TEST_F(SendRequestTest, MissingSocketIsWaitedForFifteenSecondsThenConnectFails) {
  const Error error = ExchangeError(req_);
  EXPECT_EQ(error.code, kErrorSearchRequest);
  EXPECT_EQ(error.reason, "Connect failed");
  ASSERT_EQ(sleeps_.Sleeps().size(), 15u);
  for (const auto& sleep : sleeps_.Sleeps()) EXPECT_EQ(sleep, std::chrono::seconds(1));
  const auto waits = log_.Matching("elastic socket is not ready, retry ... ");
  ASSERT_EQ(waits.size(), 15u);
  EXPECT_NE(waits.front().find("retry ... 1"), std::string::npos);
  EXPECT_NE(waits.back().find("retry ... 15"), std::string::npos);
  const auto failed = log_.Matching("(SendRequestImpl) Failed [!conn.Connect()], reason: Connect failed");
  EXPECT_EQ(failed.size(), 1u);
}

TEST_F(SendRequestTest, SocketThatAppearsWhileWaitingIsUsed) {
  std::unique_ptr<FakeSearchDaemon> daemon;
  int waits = 0;
  SetSleepHook([&](std::chrono::microseconds) {
    if (++waits == 3) daemon = std::make_unique<FakeSearchDaemon>();
  });
  Json::Value res;
  SendRequestImpl(res, req_);
  SetSleepHook(nullptr);
  EXPECT_EQ(waits, 3);
  EXPECT_EQ(daemon->Requests().size(), 1u);
}

TEST_F(SendRequestTest, SocketFileWithoutListenerFailsToConnect) {
  root_.WriteFile("var/run/corvelasticd.sock", "");
  const Error error = ExchangeError(req_);
  EXPECT_EQ(error.code, kErrorSearchRequest);
  EXPECT_EQ(error.reason, "Connect failed");
  EXPECT_TRUE(sleeps_.Sleeps().empty());
  EXPECT_EQ(log_.Matching("[err: ").size(), 1u) << "the system error is shown";
}

TEST_F(SendRequestTest, DaemonThatClosesBeforeReadingFailsTheSend) {
  FakeSearchDaemon daemon;
  daemon.Enqueue(FakeAnswer::CloseUnread());
  // Larger than the socket buffer, so the write is still under way when the
  // daemon closes. SIGPIPE keeps its default here: the send must not kill us.
  Json::Value big = req_;
  big["data"]["padding"] = std::string(4 << 20, 'x');
  const Error error = ExchangeError(big);
  EXPECT_EQ(error.code, kErrorSearchRequest);
  EXPECT_EQ(error.reason, "Send failed");
  EXPECT_EQ(log_.Matching("Failed [!conn.Send(req.toString())], reason: Send failed").size(), 1u);
}

// An answer that is not a JSON object with a bool "success" fails with its
// raw text and a log line; a failure answer carries the daemon's code and
// message without a log line, or is a bad argument when it lacks them.
TEST_F(SendRequestTest, EachAnswerGivesItsErrorAndOnlyUnusableOnesALogLine) {
  FakeSearchDaemon daemon;
  const std::string bad_answer =
      "Failed [!conn.Recv(resp_raw) || !res.fromString(resp_raw) || "
      "!res.isMember(\"success\") || !res[\"success\"].isBool()], reason: ";
  const struct {
    FakeAnswer answer;
    int code;
    std::string reason;  // the whole reason, or its start for a bad argument
    std::string logged;  // the one log line's part; "" for none
  } cases[] = {
      {FakeAnswer::Raw("not json"), kErrorSearchRequest, "Recv failed, res=not json", bad_answer},
      {FakeAnswer::Raw(R"({"data": {}})"), kErrorSearchRequest, R"(Recv failed, res={"data": {}})",
       bad_answer},
      {FakeAnswer::Raw(R"({"success": "true"})"), kErrorSearchRequest,
       R"(Recv failed, res={"success": "true"})", bad_answer},
      {FakeAnswer::Raw("[true]"), kErrorSearchRequest, "Recv failed, res=[true]", bad_answer},
      {FakeAnswer::HangUp(), kErrorSearchRequest, "Recv failed, res=", bad_answer},
      {FakeAnswer::Failure(1300, "no such index"), 1300, "Request failed, msg=no such index", ""},
      {FakeAnswer::Failure(elasticd::kCodeOpening, "not ready"), elasticd::kCodeOpening,
       "Request failed, msg=not ready", ""},
      {FakeAnswer::Raw(R"({"success": false, "error": {"msg": "x"}})"), kErrorBadArgument,
       "Missing property: code", "?"},
      {FakeAnswer::Raw(R"({"success": false, "error": {"code": 1300}})"), kErrorBadArgument,
       "Missing property: msg", "?"},
      {FakeAnswer::Raw(R"({"success": false})"), kErrorBadArgument, "", "?"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.reason);
    daemon.Enqueue(c.answer);
    log_.Clear();
    const Error error = ExchangeError(req_);
    EXPECT_EQ(error.code, c.code);
    const bool start_only = c.code == kErrorBadArgument;
    EXPECT_EQ(start_only ? error.reason.substr(0, c.reason.size()) : error.reason, c.reason);
    if (c.logged == "?") continue;  // what a bad argument logs is the JSON reader's
    EXPECT_EQ(c.logged.empty() ? log_.Lines().size() : log_.Matching(c.logged + c.reason).size(),
              c.logged.empty() ? 0u : 1u);
  }
}

class CompoundTest : public SendRequestTest {
 protected:
  Json::Value compound_ = JsonOf(R"({"compound": [
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/a"}},
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/b"}},
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/c"}}]})");
  FakeSearchDaemon daemon_;
};

// Sub-answers are read only when the daemon reports a failure: failed ones
// are logged and ignored, malformed ones count as failed, and a busy one
// fails the whole request with its bare message (and ends the reading).
TEST_F(CompoundTest, FailedSubRequestsAreLoggedAndABusyOneFailsTheWhole) {
  const auto sub = [&](int i) { return JsonToString(compound_["compound"][i]); };
  const std::string busy =
      R"("data": [{"success": false, "error": {"code": 1400, "msg": "busy"}}])";
  const struct {
    std::string answer;
    int code;
    std::vector<std::string> logged;  // a part of each "Compound failed" line, in order
    bool compound;
  } cases[] = {
      {R"({"success": true, "has_fail": true, "data": [{"success": true},
          {"success": false, "error": {"code": 1300, "msg": "no such doc"}},
          {"success": false, "error": {"code": 1301, "msg": "bad field"}}]})",
       0, {sub(1) + " (1300) no such doc", sub(2) + " (1301) bad field"}, true},
      {R"({"success": true, "has_fail": true, "data": [
          {"success": false, "error": {"code": 1300, "msg": "no such doc"}},
          {"success": false, "error": {"code": 1400, "msg": "busy"}},
          {"success": false, "error": {"code": 1300, "msg": "never looked at"}}]})",
       elasticd::kCodeBusy, {sub(0) + " (1300) no such doc"}, true},
      {R"({"success": true, "has_fail": true, "data": [
          5, {"success": "no"}, {"success": false, "error": "oops"},
          {"success": false, "error": {"code": "x"}}]})",
       0, {sub(0) + " (0) ", sub(1) + " (0) ", sub(2) + " (0) ", "null (0) "}, true},
      {R"({"success": true, "has_fail": false, )" + busy + "}", 0, {}, true},
      {R"({"success": true, )" + busy + "}", 0, {}, true},
      {R"({"success": true, "has_fail": true, )" + busy + "}", 0, {}, false},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.answer);
    daemon_.Enqueue(FakeAnswer::Raw(c.answer));
    log_.Clear();
    const Error error = ExchangeError(c.compound ? compound_ : req_);
    EXPECT_EQ(error.code, c.code);
    EXPECT_EQ(error.reason, c.code != 0 ? "busy" : "");
    const auto lines = log_.Matching("(SendRequestImpl) Compound failed: ");
    ASSERT_EQ(lines.size(), c.logged.size()) << ::testing::PrintToString(log_.Lines());
    for (size_t i = 0; i < lines.size(); ++i) {
      EXPECT_NE(lines[i].find(c.logged[i]), std::string::npos) << lines[i];
    }
    EXPECT_TRUE(!c.logged.empty() || log_.Lines().empty())
        << ::testing::PrintToString(log_.Lines());
  }
}

}  // namespace
}  // namespace corvlumex
