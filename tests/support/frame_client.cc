#include "tests/support/frame_client.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <stdexcept>

#include "common/error.h"
#include "common/frame.h"
#include "common/frame_reader.h"
#include "tests/support/child_process.h"

namespace corvlumex {
namespace testing_support {

namespace {
// A socket and the address of `path` for it; -1 when the path does not fit.
int SocketFor(const std::string& path, sockaddr_un* address) {
  memset(address, 0, sizeof(*address));
  address->sun_family = AF_UNIX;
  if (path.size() >= sizeof(address->sun_path)) return -1;
  memcpy(address->sun_path, path.c_str(), path.size());
  return socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
}
}  // namespace

int ConnectTo(const std::string& path) {
  sockaddr_un address;
  const int fd = SocketFor(path, &address);
  if (fd >= 0 && connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0) return fd;
  if (fd >= 0) close(fd);
  return -1;
}

int BindSocket(const std::string& path, bool listening) {
  sockaddr_un address;
  const int fd = SocketFor(path, &address);
  if (fd >= 0 && bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 &&
      (!listening || listen(fd, 16) == 0)) {
    return fd;
  }
  if (fd >= 0) close(fd);
  return -1;
}

bool WaitUntilListening(const std::string& socket, std::chrono::milliseconds timeout) {
  return PollUntil(
      [&] {
        const int fd = ConnectTo(socket);
        if (fd >= 0) close(fd);
        return fd >= 0;
      },
      timeout);
}

std::string Frame(const std::string& text) {
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  std::string frame(reinterpret_cast<const char*>(&length), sizeof(length));
  frame += text;
  frame += '\0';
  return frame;
}

std::string SendRaw(const std::string& socket, const std::string& bytes, int wait_ms) {
  // The daemon may answer and hang up before a refused request is fully sent.
  signal(SIGPIPE, SIG_IGN);
  const int fd = ConnectTo(socket);
  if (fd < 0) throw std::runtime_error("cannot connect to " + socket);
  try {
    if (!bytes.empty()) BufferWrite(fd, static_cast<unsigned int>(bytes.size()), reinterpret_cast<const unsigned char*>(bytes.data()));
  } catch (const Error&) {
    // Hung up early: its answer, if any, is still waiting to be read.
  }
  // Everything is sent: a cut frame is seen as one at once.
  shutdown(fd, SHUT_WR);
  std::string answer;
  const FrameStatus status = ReadFrameBounded(fd, 1u << 30, wait_ms, wait_ms, &answer);
  close(fd);
  return status == FrameStatus::kOk ? answer : std::string();
}

}  // namespace testing_support
}  // namespace corvlumex
