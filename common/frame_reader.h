// Reading one frame from a peer without trusting it: the length is bounded
// before anything is kept, memory grows only with the bytes that really
// arrive, a peer that closes or stalls is noticed, and a closed socket never
// makes the reader spin. Every daemon reads its requests through this.
#pragma once

#include <cstddef>
#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

enum class FrameStatus {
  kOk,
  kClosed,    // the peer closed before a new frame began
  kIdle,      // no new frame began in time
  kTooLarge,  // the announced length is over the bound (the body is not read)
  kTimeout,   // only part of a frame arrived in time
  kBroken,    // the peer closed in the middle of a frame, or the socket failed
};

// `idle_ms` bounds the wait for a frame to begin (negative: no bound),
// `stall_ms` the wait for each further piece of it, and `total_ms` (when not
// negative) the whole frame from its first byte on, so a client trickling a
// byte at a time cannot hold the reader for ever. A trailing NUL of the body is dropped.
FrameStatus ReadFrameBounded(int fd, size_t max_bytes, int idle_ms, int stall_ms, std::string* text, int total_ms = -1);

}  // namespace corvlumex

CORVLUMEX_API_END
