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

int ConnectTo(const std::string& path) {
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address;
  memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
  if (connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0) {
    close(fd);
    return -1;
  }
  return fd;
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
