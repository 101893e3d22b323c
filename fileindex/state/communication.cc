#include "fileindex/state/communication.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <vector>

#include "common/error.h"
#include "common/frame.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/sys.h"
#include "fileindex/state/constants.h"

namespace corvlumex {
namespace fileindex {
namespace {

constexpr int kConnectAttempts = 5;

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

}  // namespace fileindex
}  // namespace corvlumex
