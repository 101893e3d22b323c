// A stand-in for corvelasticd in tests: listens on the search socket of the
// current sandbox root (or any given path), records every request and answers
// from a script, then from a handler. Runs on its own thread; one connection
// at a time, one frame each way, like the real daemon's clients expect.
#pragma once

#include <json/json.h>

#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace testing_support {

// What the fake daemon does with one request.
struct FakeAnswer {
  enum class Action { kAnswer, kHangUp, kCloseUnread };
  Action action = Action::kAnswer;
  std::string text;  // framed and sent as it stands (kAnswer)

  static FakeAnswer Json(const Json::Value& value);
  // {"success": true, "data": data}
  static FakeAnswer Success(const Json::Value& data = Json::Value(Json::objectValue));
  // {"success": false, "error": {"code": code, "msg": msg}}
  static FakeAnswer Failure(int code, const std::string& msg);
  static FakeAnswer Raw(const std::string& text);
  // Reads the request, then closes without answering.
  static FakeAnswer HangUp();
  // Closes the connection without reading the request.
  static FakeAnswer CloseUnread();
};

// The Error that `action` throws (code 0 when it throws none).
Error ErrorOrNone(const std::function<void()>& action);

// The default handler's answer: success, and for a compound request one
// successful sub-answer per element with "has_fail": false.
FakeAnswer AnswerSuccess(const Json::Value& request);

class FakeSearchDaemon {
 public:
  // Empty path: the system's search socket under the current root.
  explicit FakeSearchDaemon(const std::string& socket_path = std::string());
  ~FakeSearchDaemon();
  FakeSearchDaemon(const FakeSearchDaemon&) = delete;
  FakeSearchDaemon& operator=(const FakeSearchDaemon&) = delete;

  // Scripted answers, used one per request in order, before the handler.
  void Enqueue(const FakeAnswer& answer, int times = 1);
  // Answers requests once the script is used up.
  void SetHandler(std::function<FakeAnswer(const Json::Value& request)> handler);

  // Requests as received (null where the text was not JSON), in order.
  std::vector<Json::Value> Requests() const;
  // Number of connections accepted so far.
  int Connections() const;

  const std::string& socket_path() const { return socket_path_; }

 private:
  void Serve();
  void HandleConnection(int fd);
  FakeAnswer NextAnswer(const Json::Value& request);

  std::string socket_path_;
  int listen_fd_ = -1;
  int wake_pipe_[2] = {-1, -1};
  mutable std::mutex mutex_;
  std::deque<FakeAnswer> script_;
  std::function<FakeAnswer(const Json::Value&)> handler_;
  std::vector<Json::Value> requests_;
  int connections_ = 0;
  std::thread thread_;
};

}  // namespace testing_support
}  // namespace corvlumex
