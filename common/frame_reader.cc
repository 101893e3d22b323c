#include "common/frame_reader.h"

#include <poll.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdint>

#include "common/error.h"
#include "common/frame.h"

namespace corvlumex {
namespace {

// What one read may add to a body: a peer that announces 64 MiB and sends
// ten bytes costs ten bytes, not 64 MiB.
constexpr size_t kGrowStep = 64u << 10;

using Clock = std::chrono::steady_clock;

// The wait for the next piece: `wait_ms`, cut to what is left before
// `deadline` (none when it is the clock's largest value).
int WaitMs(int wait_ms, Clock::time_point deadline) {
  if (deadline == Clock::time_point::max()) return wait_ms;
  const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
  const int bounded = static_cast<int>(std::max<long long>(0, left));
  return wait_ms < 0 ? bounded : std::min(wait_ms, bounded);
}

// Waits for bytes; how many are waiting, 0 when the peer closed, -1 when none
// came in time or the socket failed (`status` says which).
long Waiting(int fd, int wait_ms, Clock::time_point deadline, bool frame_begun, FrameStatus* status) {
  for (;;) {
    struct pollfd poller = {fd, POLLIN, 0};
    const int ready = poll(&poller, 1, WaitMs(wait_ms, deadline));
    if (ready < 0 && errno == EINTR) continue;
    if (ready < 0) {
      *status = FrameStatus::kBroken;
      return -1;
    }
    if (ready == 0) {
      *status = frame_begun ? FrameStatus::kTimeout : FrameStatus::kIdle;
      return -1;
    }
    int waiting = 0;
    if (ioctl(fd, FIONREAD, &waiting) != 0) {
      *status = FrameStatus::kBroken;
      return -1;
    }
    if (waiting <= 0) *status = frame_begun ? FrameStatus::kBroken : FrameStatus::kClosed;  // readable and empty: closed
    return waiting;
  }
}

// Appends exactly `size` bytes to `out`. BufferRead is only asked for bytes
// already waiting, so it never spins on a closed socket.
FrameStatus Receive(int fd, size_t size, int first_wait_ms, int stall_ms, Clock::time_point deadline, bool frame_begun,
                    std::string* out) {
  const size_t start = out->size();
  size_t received = 0;
  while (received < size) {
    FrameStatus status = FrameStatus::kOk;
    const long waiting = Waiting(fd, received == 0 ? first_wait_ms : stall_ms, deadline, frame_begun || received > 0, &status);
    if (waiting <= 0) return status;
    const size_t chunk = std::min({size - received, static_cast<size_t>(waiting), kGrowStep});
    out->resize(start + received + chunk);
    try {
      BufferRead(fd, static_cast<unsigned int>(chunk), reinterpret_cast<unsigned char*>(&(*out)[start + received]));
    } catch (const Error&) {
      return FrameStatus::kBroken;
    }
    received += chunk;
  }
  return FrameStatus::kOk;
}

}  // namespace

FrameStatus ReadFrameBounded(int fd, size_t max_bytes, int idle_ms, int stall_ms, std::string* text, int total_ms) {
  FrameStatus status = FrameStatus::kOk;
  if (Waiting(fd, idle_ms, Clock::time_point::max(), false, &status) <= 0) return status;
  // The frame has begun: from now on it must arrive whole in time.
  const Clock::time_point deadline = total_ms < 0 ? Clock::time_point::max() : Clock::now() + std::chrono::milliseconds(total_ms);
  std::string header;
  status = Receive(fd, sizeof(uint32_t), stall_ms, stall_ms, deadline, true, &header);
  if (status != FrameStatus::kOk) return status;
  uint32_t length = 0;
  std::copy(header.begin(), header.end(), reinterpret_cast<char*>(&length));
  if (length > max_bytes) return FrameStatus::kTooLarge;
  text->clear();
  status = Receive(fd, length, stall_ms, stall_ms, deadline, true, text);
  if (status != FrameStatus::kOk) return status;
  if (!text->empty() && text->back() == '\0') text->pop_back();
  return FrameStatus::kOk;
}

}  // namespace corvlumex
