#include "programs/corvelasticd/request_frame.h"

#include <poll.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>

#include "common/error.h"
#include "fileindex/communication.h"

namespace corvlumex {
namespace elasticd {
namespace {

// Receives exactly `size` bytes. BufferRead is only asked for bytes already
// waiting, so it never spins on a closed socket.
FrameStatus Receive(int fd, size_t size, int first_wait_ms, int stall_ms, unsigned char* buffer) {
  size_t received = 0;
  while (received < size) {
    struct pollfd poller = {fd, POLLIN, 0};
    const int ready = poll(&poller, 1, received == 0 ? first_wait_ms : stall_ms);
    if (ready < 0 && errno == EINTR) continue;
    if (ready < 0) return FrameStatus::kBroken;
    if (ready == 0) return received == 0 ? FrameStatus::kIdle : FrameStatus::kTimeout;
    int waiting = 0;
    if (ioctl(fd, FIONREAD, &waiting) != 0) return FrameStatus::kBroken;
    if (waiting <= 0) return received == 0 ? FrameStatus::kClosed : FrameStatus::kBroken;  // readable and empty: closed
    const size_t chunk = std::min(size - received, static_cast<size_t>(waiting));
    try {
      fileindex::BufferRead(fd, static_cast<unsigned int>(chunk), buffer + received);
    } catch (const Error&) {
      return FrameStatus::kBroken;
    }
    received += chunk;
  }
  return FrameStatus::kOk;
}

}  // namespace

FrameStatus ReadRequestFrame(int fd, size_t max_bytes, int idle_ms, int stall_ms, std::string* text) {
  uint32_t length = 0;
  FrameStatus status = Receive(fd, sizeof(length), idle_ms, stall_ms, reinterpret_cast<unsigned char*>(&length));
  if (status != FrameStatus::kOk) return status;
  if (length > max_bytes) return FrameStatus::kTooLarge;
  text->assign(length, '\0');
  if (length > 0) {
    status = Receive(fd, length, stall_ms, stall_ms, reinterpret_cast<unsigned char*>(&(*text)[0]));
    if (status == FrameStatus::kClosed) status = FrameStatus::kBroken;
    if (status == FrameStatus::kIdle) status = FrameStatus::kTimeout;
    if (status != FrameStatus::kOk) return status;
  }
  if (!text->empty() && text->back() == '\0') text->pop_back();
  return FrameStatus::kOk;
}

}  // namespace elasticd
}  // namespace corvlumex
