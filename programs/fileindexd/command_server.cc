#include "programs/fileindexd/command_server.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <thread>
#include <cstring>
#include <vector>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/communication.h"

namespace corvlumex {
namespace fileindexd {
namespace {

constexpr uint32_t kMaxRequestBytes = 1u << 20;
constexpr int kRequestTimeoutMs = 5000;

// Waits until a whole frame has arrived, so that reading it cannot block on
// a client that went away in the middle. False for a client that closed,
// sent too much or took too long.
bool WholeFrameArrived(int fd) {
  using Clock = std::chrono::steady_clock;
  const Clock::time_point deadline = Clock::now() + std::chrono::milliseconds(kRequestTimeoutMs);
  size_t need = sizeof(uint32_t);
  bool have_length = false;
  for (;;) {
    int queued = 0;
    if (ioctl(fd, FIONREAD, &queued) != 0) return false;
    if (static_cast<size_t>(queued) >= need) {
      if (have_length) return true;
      uint32_t length = 0;
      if (recv(fd, &length, sizeof(length), MSG_PEEK) != static_cast<ssize_t>(sizeof(length))) return false;
      if (length > kMaxRequestBytes) return false;
      need += length;
      have_length = true;
      continue;
    }
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
    if (left <= 0) return false;
    struct pollfd pfd = {fd, POLLIN | POLLRDHUP, 0};
    const int ready = poll(&pfd, 1, static_cast<int>(left));
    if (ready < 0 && errno != EINTR) return false;
    if (ready > 0 && (pfd.revents & (POLLRDHUP | POLLHUP | POLLERR))) {
      // The client is done sending: what is queued now is all there will be.
      if (ioctl(fd, FIONREAD, &queued) != 0 || static_cast<size_t>(queued) < need) return false;
      continue;
    }
    if (ready > 0 && queued > 0) std::this_thread::sleep_for(std::chrono::milliseconds(1));  // part of a frame
  }
}

}  // namespace

CommandServer::CommandServer(std::string socket_path, Handler handler, ReadOnly read_only)
    : socket_path_(std::move(socket_path)), handler_(std::move(handler)), read_only_(std::move(read_only)) {}

CommandServer::~CommandServer() {
  if (listen_fd_ >= 0) {
    close(listen_fd_);
    unlink(socket_path_.c_str());
  }
  for (int fd : stop_pipe_) {
    if (fd >= 0) close(fd);
  }
}

void CommandServer::Listen() {
  struct sockaddr_un address;
  memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  CORV_CHECK_THROW(socket_path_.size() >= sizeof(address.sun_path), kErrorBadArgument,
                   "socket path too long: " + socket_path_);
  memcpy(address.sun_path, socket_path_.c_str(), socket_path_.size());
  CORV_CHECK_THROW(pipe2(stop_pipe_, O_CLOEXEC | O_NONBLOCK) != 0, kErrorSystem, "pipe failed");
  listen_fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  CORV_CHECK_THROW(listen_fd_ < 0, kErrorSystem, "socket failed");
  // A socket file nobody answers on is left from a crash: replace it.
  const int probe = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const bool live = probe >= 0 && connect(probe, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0;
  if (probe >= 0) close(probe);
  errno = 0;
  CORV_CHECK_THROW(live, kErrorSystem, "another fileindexd is serving " + socket_path_);
  unlink(socket_path_.c_str());
  errno = 0;
  const std::string dir = Dirname(socket_path_);
  if (!IsDirExist(dir, true)) mkdir(dir.c_str(), 0755);
  errno = 0;
  CORV_CHECK_THROW(bind(listen_fd_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0, kErrorSystem,
                   "bind failed: " + socket_path_);
  chmod(socket_path_.c_str(), 0666);
  CORV_CHECK_THROW(listen(listen_fd_, 64) != 0, kErrorSystem, "listen failed: " + socket_path_);
}

void CommandServer::Stop() {
  const char byte = 1;
  if (stop_pipe_[1] >= 0 && write(stop_pipe_[1], &byte, 1) < 0) {
  }
}

void CommandServer::Run() {
  for (;;) {
    struct pollfd fds[2] = {{listen_fd_, POLLIN, 0}, {stop_pipe_[0], POLLIN, 0}};
    if (poll(fds, 2, -1) < 0) {
      if (errno == EINTR) {
        errno = 0;
        continue;
      }
      CORV_LOG("poll failed on the command socket");
      return;
    }
    if (fds[1].revents & POLLIN) return;
    if (!(fds[0].revents & POLLIN)) continue;
    const int fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0) {
      errno = 0;
      continue;
    }
    Serve(fd);
    close(fd);
  }
}

void CommandServer::Serve(int fd) {
  struct ucred peer;
  socklen_t peer_size = sizeof(peer);
  if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &peer_size) != 0) {
    errno = 0;
    return;
  }
  if (!WholeFrameArrived(fd)) {
    errno = 0;
    return;
  }
  try {
    const std::string answer = Answer(fileindex::ReadFrame(fd), peer.uid);
    fileindex::WriteFrame(fd, answer);
  } catch (const Error& error) {
    CORV_LOG("command connection dropped: %s", error.reason.c_str());
  }
}

std::string CommandServer::Answer(const std::string& text, uid_t uid) {
  Json::Value request;
  if (!JsonFromString(request, text) || !request.isObject() || !request["type"].isString()) {
    return JsonToString(fileindex::FailureAnswer(kErrorBadArgument, "The request must be a JSON object with a string \"type\""));
  }
  const std::string type = request["type"].asString();
  if (uid != 0 && uid != geteuid() && !read_only_(type)) {
    return JsonToString(fileindex::FailureAnswer(kErrorBadArgument, "\"" + type + "\" is allowed to root and the daemon's user only"));
  }
  try {
    Json::Value answer(Json::objectValue);
    answer["success"] = true;
    answer["data"] = handler_(type, request["data"]);
    return JsonToString(answer);
  } catch (const Error& error) {
    return JsonToString(fileindex::FailureAnswer(error.code, error.reason));
  } catch (const std::exception& error) {
    return JsonToString(fileindex::FailureAnswer(kErrorUnexpected, error.what()));
  }
}

}  // namespace fileindexd
}  // namespace corvlumex
