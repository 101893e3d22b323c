#include "fileindex/communication.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/sys.h"
#include "fileindex/constants.h"

namespace corvlumex {
namespace fileindex {
namespace {

constexpr unsigned int kChunk = 1024;
constexpr int kMaxEintr = 10;
constexpr int kConnectAttempts = 5;

template <typename Transfer>
void TransferAll(int fd, unsigned int size, Transfer transfer, const char* what) {
  unsigned int offset = 0;
  int interrupted = 0;  // a budget for the whole call, not reset by progress
  while (offset < size) {
    const unsigned int chunk = size - offset < kChunk ? size - offset : kChunk;
    const ssize_t n = transfer(fd, offset, chunk);
    if (n < 0) {
      if (errno == EINTR && ++interrupted <= kMaxEintr) continue;
      throw Error(kErrorSystem, std::string(what) + " failed, reason=" + strerror(errno));
    }
    // Zero is not an error: the loop simply asks again.
    offset += static_cast<unsigned int>(n);
  }
}

// Closes the descriptor on every way out of SendCommandToDaemon.
class Socket {
 public:
  explicit Socket(int fd) : fd_(fd) {}
  ~Socket() { close(fd_); }
  Socket(const Socket&) = delete;
  Socket& operator=(const Socket&) = delete;
  int fd() const { return fd_; }

 private:
  int fd_;
};

}  // namespace

void BufferRead(int fd, unsigned int size, unsigned char* buffer) {
  TransferAll(
      fd, size, [buffer](int f, unsigned int off, unsigned int len) { return read(f, buffer + off, len); },
      "read");
}

void BufferWrite(int fd, unsigned int size, const unsigned char* buffer) {
  TransferAll(
      fd, size, [buffer](int f, unsigned int off, unsigned int len) { return write(f, buffer + off, len); },
      "write");
}

void WriteFrame(int fd, const std::string& text) {
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  BufferWrite(fd, sizeof(length), reinterpret_cast<const unsigned char*>(&length));
  BufferWrite(fd, length, reinterpret_cast<const unsigned char*>(text.c_str()));
}

std::string ReadFrame(int fd) {
  uint32_t length = 0;
  BufferRead(fd, sizeof(length), reinterpret_cast<unsigned char*>(&length));
  std::string body(length, '\0');
  if (length > 0) BufferRead(fd, length, reinterpret_cast<unsigned char*>(&body[0]));
  if (!body.empty() && body.back() == '\0') body.pop_back();
  return body;
}

void SendCommandToDaemon(const std::string& command, const Json::Value& data) {
  int fd_socket = -1;
  CORV_CHECK_THROW_TEXT(0 > (fd_socket = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)),
                        "0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))", kErrorSystem,
                        std::string("socket failed, reason=") + strerror(errno));
  const Socket socket_guard(fd_socket);

  struct sockaddr_un address;
  memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  const std::string path = SysPath(kFileIndexDaemonSocketPath);
  // A cut path would reach some other socket, or none: say so instead.
  CORV_CHECK_THROW(path.size() >= sizeof(address.sun_path), kErrorSystem, "socket path too long, path=" + path);
  memcpy(address.sun_path, path.c_str(), path.size());
  // The daemon may not be listening yet; a failed connect is not an error of
  // its own: the first write reports it.
  for (int attempt = 1; attempt <= kConnectAttempts; ++attempt) {
    if (connect(fd_socket, reinterpret_cast<struct sockaddr*>(&address), sizeof(address)) == 0) break;
    if (errno != ENOENT || attempt == kConnectAttempts) break;
    SleepFor(std::chrono::seconds(1));
  }
  errno = 0;

  struct timeval timeout = {1, 0};
  CORV_CHECK_THROW_TEXT(0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof(timeout)),
                        "0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, (char *)&timeout, sizeof(timeout))",
                        kErrorSystem, std::string("setsockopt failed, reason=") + strerror(errno));

  const SigpipeBlock no_sigpipe;
  Json::Value request(Json::objectValue);
  request["type"] = command;
  request["data"] = data;
  WriteFrame(fd_socket, JsonToString(request));

  uint32_t length = 0;
  BufferRead(fd_socket, sizeof(length), reinterpret_cast<unsigned char*>(&length));
  std::vector<unsigned char> reply(length);
  if (length > 0) BufferRead(fd_socket, length, reply.data());
}

Json::Value FailureAnswer(int code, const std::string& message) {
  Json::Value answer(Json::objectValue);
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["msg"] = message;
  return answer;
}

void OnStopSignals(void (*handler)(int)) {
  struct sigaction action;
  memset(&action, 0, sizeof(action));
  action.sa_handler = handler;
  sigaction(SIGTERM, &action, nullptr);
  sigaction(SIGINT, &action, nullptr);
}

}  // namespace fileindex
}  // namespace corvlumex
