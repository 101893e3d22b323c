// Reading one request frame from a client without trusting it: the length
// is bounded before anything is allocated, a peer that closes or stalls is
// noticed, and the bytes themselves go through the shared framing helpers.
#pragma once

#include <cstddef>
#include <string>

namespace corvlumex {
namespace elasticd {

enum class FrameStatus {
  kOk,
  kClosed,    // the peer closed before a new frame began
  kIdle,      // no new frame began in time
  kTooLarge,  // the announced length is over the bound (the body is not read)
  kTimeout,   // nothing, or only part of a frame, arrived in time
  kBroken,    // the peer closed in the middle of a frame, or the socket failed
};

// `idle_ms` bounds the wait for a frame to begin, `stall_ms` the wait for
// each further piece of it.
FrameStatus ReadRequestFrame(int fd, size_t max_bytes, int idle_ms, int stall_ms, std::string* text);

}  // namespace elasticd
}  // namespace corvlumex
