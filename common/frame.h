// The frame every Unix-socket peer of the system speaks (the search daemon,
// fileindexd, the extraction worker and their clients): a 4-byte host-order
// length, then the body.
#pragma once

#include <json/json.h>
#include <signal.h>
#include <time.h>

#include <cerrno>
#include <string>
#include <string_view>
#include <vector>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// The library is called from programs that may not ignore SIGPIPE (a web
// handler, a hook). A daemon that drops the connection must give them an
// Error ("write failed"), not kill them: SIGPIPE is blocked in this thread
// while a message is sent, and one raised meanwhile is consumed.
class SigpipeBlock {
 public:
  SigpipeBlock() {
    sigemptyset(&pipe_set_);
    sigaddset(&pipe_set_, SIGPIPE);
    sigset_t pending;
    sigpending(&pending);
    was_pending_ = sigismember(&pending, SIGPIPE) == 1;
    blocked_ = pthread_sigmask(SIG_BLOCK, &pipe_set_, &old_mask_) == 0;
  }
  ~SigpipeBlock() {
    if (!blocked_) return;
    const int saved_errno = errno;
    sigset_t pending;
    sigpending(&pending);
    if (!was_pending_ && sigismember(&pending, SIGPIPE) == 1) {
      const struct timespec no_wait = {0, 0};
      while (sigtimedwait(&pipe_set_, nullptr, &no_wait) < 0 && errno == EINTR) {
      }
    }
    pthread_sigmask(SIG_SETMASK, &old_mask_, nullptr);
    errno = saved_errno;
  }
  SigpipeBlock(const SigpipeBlock&) = delete;
  SigpipeBlock& operator=(const SigpipeBlock&) = delete;

 private:
  sigset_t pipe_set_;
  sigset_t old_mask_;
  bool was_pending_ = false;
  bool blocked_ = false;
};

// Read / write exactly `size` bytes, at most 1024 per system call; throw
// Error 502 on failure (no log line).
void BufferRead(int fd, unsigned int size, unsigned char* buffer);
void BufferWrite(int fd, unsigned int size, const unsigned char* buffer);

// One frame: 4-byte host-order length (counting a trailing NUL), then the
// text and the NUL.
void WriteFrame(int fd, const std::string& text);

// The same frame from pieces written one after the other, as if they were
// one text: a request made of several written-out documents is not copied
// into one string first. Written in large system calls (not BufferWrite's
// kilobyte): a document of megabytes would otherwise take thousands.
void WriteFrameParts(int fd, const std::vector<std::string_view>& parts);

// The answer a daemon gives to a request it refuses:
// {"success": false, "error": {"code": code, "msg": message}}.
Json::Value FailureAnswer(int code, const std::string& message);

// Reads one frame body; a trailing NUL, when present, is dropped.
std::string ReadFrame(int fd);

}  // namespace corvlumex

CORVLUMEX_API_END
