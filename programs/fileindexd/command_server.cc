#include "programs/fileindexd/command_server.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <system_error>
#include <thread>

#include "common/error.h"
#include "common/file_util.h"
#include "common/frame.h"
#include "common/frame_reader.h"
#include "common/json_util.h"
#include "common/log.h"

namespace corvlumex {
namespace fileindexd {
namespace {

std::string Failure(int code, const std::string& message) { return JsonToString(FailureAnswer(code, message)); }

void SendAnswer(int fd, const std::string& answer) {
  try {
    WriteFrame(fd, answer);
  } catch (const Error& error) {
    CORV_LOG("command connection dropped: %s", error.reason.c_str());
  }
}

}  // namespace

CommandServer::CommandServer(std::string socket_path, Handler handler, ReadOnly read_only, CommandLimits limits)
    : socket_path_(std::move(socket_path)), handler_(std::move(handler)), read_only_(std::move(read_only)), limits_(limits) {}

CommandServer::~CommandServer() {
  listener_.reset();
  for (int fd : stop_pipe_) {
    if (fd >= 0) close(fd);
  }
}

void CommandServer::Listen() {
  CORV_CHECK_THROW(pipe2(stop_pipe_, O_CLOEXEC | O_NONBLOCK) != 0, kErrorSystem, "pipe failed");
  const std::string dir = Dirname(socket_path_);
  if (!IsDirExist(dir, true)) mkdir(dir.c_str(), 0755);
  errno = 0;
  fileindex::UnixListenerOptions options;
  options.mode = 0666;
  listener_ = std::make_unique<fileindex::UnixListener>(socket_path_, options);
}

void CommandServer::Stop() {
  const char byte = 1;
  if (stop_pipe_[1] >= 0 && write(stop_pipe_[1], &byte, 1) < 0) {
  }
}

void CommandServer::Run() {
  for (;;) {
    struct pollfd fds[2] = {{listener_->fd(), POLLIN, 0}, {stop_pipe_[0], POLLIN, 0}};
    if (poll(fds, 2, -1) < 0) {
      if (errno == EINTR) {
        errno = 0;
        continue;
      }
      CORV_LOG("poll failed on the command socket");
      break;
    }
    if (fds[1].revents & POLLIN) break;
    if (!(fds[0].revents & POLLIN)) continue;
    fileindex::PeerCredentials peer;
    const int fd = listener_->Accept(&peer);
    if (fd < 0) {  // taken back by the client, or it hid who it is
      errno = 0;
      continue;
    }
    // Root and the daemon's own user (the management operations) are never
    // turned away; every other user has a share of the connections.
    const bool counted = peer.uid != 0 && peer.uid != geteuid();
    Connections& open = *connections_;
    std::unique_lock<std::mutex> lock(open.mutex);
    if (counted && (open.counted >= limits_.max_connections || open.per_user[peer.uid] >= limits_.max_connections_per_user)) {
      lock.unlock();
      SendAnswer(fd, Failure(kErrorSystem, "Too many connections to fileindexd; try again later"));
      close(fd);
      continue;
    }
    open.fds.insert(fd);
    if (counted) ++open.counted, ++open.per_user[peer.uid];
    const auto finished = [fd, counted, uid = peer.uid](Connections& connections) {
      connections.fds.erase(fd);
      if (counted) {
        --connections.counted;
        if (--connections.per_user[uid] == 0) connections.per_user.erase(uid);
      }
    };
    try {
      std::thread([this, fd, uid = peer.uid, finished, connections = connections_] {
        Serve(fd, uid);
        std::lock_guard<std::mutex> guard(connections->mutex);
        finished(*connections);
        close(fd);
        connections->all_closed.notify_all();
      }).detach();
    } catch (const std::system_error&) {
      finished(open);
      lock.unlock();
      SendAnswer(fd, Failure(kErrorSystem, "fileindexd cannot take the connection now; try again later"));
      close(fd);
    }
  }
  // Readers still waiting for a request give up now; a command being run finishes.
  Connections& open = *connections_;
  std::unique_lock<std::mutex> lock(open.mutex);
  for (const int fd : open.fds) shutdown(fd, SHUT_RD);
  open.all_closed.wait(lock, [&open] { return open.fds.empty(); });
}

void CommandServer::Serve(int fd, uid_t uid) {
  // A client that does not read its answer holds its own thread only so long.
  const struct timeval send_timeout = {limits_.request_timeout_ms / 1000, (limits_.request_timeout_ms % 1000) * 1000};
  setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &send_timeout, sizeof(send_timeout));
  std::string request;
  switch (ReadFrameBounded(fd, limits_.max_request_bytes, limits_.request_timeout_ms, limits_.request_timeout_ms, &request,
                                     limits_.request_timeout_ms)) {
    case FrameStatus::kOk: break;
    case FrameStatus::kTooLarge:
      SendAnswer(fd, Failure(kErrorBadArgument, "The request is larger than " + std::to_string(limits_.max_request_bytes) + " bytes"));
      return;
    case FrameStatus::kIdle:
    case FrameStatus::kTimeout:
      SendAnswer(fd, Failure(kErrorBadArgument, "The request did not arrive within " + std::to_string(limits_.request_timeout_ms) + " ms"));
      return;
    default:  // the client went away: nobody to answer
      errno = 0;
      return;
  }
  std::string answer;
  {
    // Commands are run one at a time, as they always were.
    std::lock_guard<std::mutex> guard(handler_mutex_);
    answer = Answer(request, uid);
  }
  SendAnswer(fd, answer);
}

std::string CommandServer::Answer(const std::string& text, uid_t uid) {
  Json::Value request;
  if (!JsonFromString(request, text) || !request.isObject() || !request["type"].isString()) {
    return JsonToString(FailureAnswer(kErrorBadArgument, "The request must be a JSON object with a string \"type\""));
  }
  const std::string type = request["type"].asString();
  if (uid != 0 && uid != geteuid() && !read_only_(type)) {
    return JsonToString(FailureAnswer(kErrorBadArgument, "\"" + type + "\" is allowed to root and the daemon's user only"));
  }
  try {
    Json::Value answer(Json::objectValue);
    answer["success"] = true;
    answer["data"] = handler_(type, request["data"]);
    return JsonToString(answer);
  } catch (const Error& error) {
    return JsonToString(FailureAnswer(error.code, error.reason));
  } catch (const std::exception& error) {
    return JsonToString(FailureAnswer(kErrorUnexpected, error.what()));
  } catch (...) {
    return JsonToString(FailureAnswer(kErrorUnexpected, "the command failed unexpectedly"));
  }
}

}  // namespace fileindexd
}  // namespace corvlumex
