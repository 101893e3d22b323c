#include "tests/fileindex/elastic/fake_search_daemon.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <stdexcept>

#include "common/error.h"
#include "common/frame.h"
#include "common/frame_reader.h"
#include "common/json_util.h"
#include "fileindex/elastic/comm.h"
#include "tests/support/frame_client.h"

namespace corvlumex {
namespace testing_support {

Error ErrorOrNone(const std::function<void()>& action) {
  try {
    action();
  } catch (const Error& error) {
    return error;
  }
  return Error(static_cast<ErrorCode>(0));
}

FakeAnswer FakeAnswer::Json(const Json::Value& value) { return Raw(JsonToString(value)); }

FakeAnswer FakeAnswer::Success(const Json::Value& data) {
  Json::Value value(Json::objectValue);
  value["success"] = true;
  value["data"] = data;
  return Json(value);
}

FakeAnswer FakeAnswer::Failure(int code, const std::string& msg) {
  Json::Value value(Json::objectValue);
  value["success"] = false;
  value["error"]["code"] = code;
  value["error"]["msg"] = msg;
  return Json(value);
}

FakeAnswer FakeAnswer::Raw(const std::string& text) {
  FakeAnswer answer;
  answer.text = text;
  return answer;
}

FakeAnswer FakeAnswer::HangUp() {
  FakeAnswer answer;
  answer.action = Action::kHangUp;
  return answer;
}

FakeAnswer FakeAnswer::CloseUnread() {
  FakeAnswer answer;
  answer.action = Action::kCloseUnread;
  return answer;
}

FakeAnswer AnswerSuccess(const Json::Value& request) {
  if (!request.isObject() || !request.isMember("compound")) return FakeAnswer::Success();
  Json::Value value(Json::objectValue);
  value["success"] = true;
  value["has_fail"] = false;
  value["data"] = Json::Value(Json::arrayValue);
  for (Json::ArrayIndex i = 0; i < request["compound"].size(); ++i) {
    Json::Value sub(Json::objectValue);
    sub["success"] = true;
    value["data"].append(sub);
  }
  return FakeAnswer::Json(value);
}

FakeSearchDaemon::FakeSearchDaemon(const std::string& socket_path)
    : socket_path_(socket_path.empty() ? ElasticSocketPath() : socket_path), handler_(AnswerSuccess) {
  std::filesystem::create_directories(std::filesystem::path(socket_path_).parent_path());
  unlink(socket_path_.c_str());
  listen_fd_ = BindSocket(socket_path_, true);
  if (listen_fd_ < 0 || pipe2(wake_pipe_, O_CLOEXEC) != 0) {
    const std::string why = strerror(errno);
    if (listen_fd_ >= 0) close(listen_fd_);
    throw std::runtime_error("fake search daemon cannot listen on " + socket_path_ + ": " + why);
  }
  thread_ = std::thread(&FakeSearchDaemon::Serve, this);
}

FakeSearchDaemon::~FakeSearchDaemon() {
  const char stop = 's';
  if (write(wake_pipe_[1], &stop, 1) != 1) std::terminate();
  thread_.join();
  close(listen_fd_);
  close(wake_pipe_[0]);
  close(wake_pipe_[1]);
  unlink(socket_path_.c_str());
}

void FakeSearchDaemon::Enqueue(const FakeAnswer& answer, int times) {
  std::lock_guard<std::mutex> guard(mutex_);
  for (int i = 0; i < times; ++i) script_.push_back(answer);
}

void FakeSearchDaemon::SetHandler(std::function<FakeAnswer(const Json::Value&)> handler) {
  std::lock_guard<std::mutex> guard(mutex_);
  handler_ = std::move(handler);
}

std::vector<Json::Value> FakeSearchDaemon::Requests() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return requests_;
}

int FakeSearchDaemon::Connections() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return connections_;
}

void FakeSearchDaemon::Serve() {
  for (;;) {
    struct pollfd fds[2] = {{listen_fd_, POLLIN, 0}, {wake_pipe_[0], POLLIN, 0}};
    if (poll(fds, 2, -1) < 0) {
      if (errno == EINTR) continue;
      return;
    }
    if (fds[1].revents != 0) return;
    const int fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0) continue;
    HandleConnection(fd);
    close(fd);
  }
}

FakeAnswer FakeSearchDaemon::NextAnswer(const Json::Value& request) {
  std::function<FakeAnswer(const Json::Value&)> handler;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    if (!script_.empty()) {
      FakeAnswer answer = script_.front();
      script_.pop_front();
      return answer;
    }
    handler = handler_;
  }
  return handler(request);
}

void FakeSearchDaemon::HandleConnection(int fd) {
  {
    std::lock_guard<std::mutex> guard(mutex_);
    ++connections_;
    // Closing unread must happen before anything is read.
    if (!script_.empty() && script_.front().action == FakeAnswer::Action::kCloseUnread) {
      script_.pop_front();
      return;
    }
  }
  std::string text;
  if (ReadFrameBounded(fd, size_t{1} << 30, -1, 10000, &text) != FrameStatus::kOk) return;
  Json::Value request;
  if (!JsonFromString(request, text)) request = Json::Value();
  {
    std::lock_guard<std::mutex> guard(mutex_);
    requests_.push_back(request);
  }
  const FakeAnswer answer = NextAnswer(request);
  if (answer.action != FakeAnswer::Action::kAnswer) return;
  const SigpipeBlock no_sigpipe;
  try {
    WriteFrame(fd, answer.text);
  } catch (const Error&) {
    // The client went away; nothing to answer.
  }
}

}  // namespace testing_support
}  // namespace corvlumex
