#include "programs/fileindexd/queue_watch.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/file_util.h"
#include "common/log.h"

namespace corvlumex {
namespace fileindexd {

QueueWatch::QueueWatch(const std::string& queue_path, std::chrono::milliseconds fallback_poll)
    : queue_dir_(Dirname(queue_path)), queue_name_(Basename(queue_path)), fallback_poll_(fallback_poll) {
  inotify_fd_ = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
  wake_fd_ = eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
  if (inotify_fd_ < 0 || wake_fd_ < 0) CORV_LOG("cannot watch %s; polling instead", queue_path.c_str());
  errno = 0;
}

QueueWatch::~QueueWatch() {
  if (inotify_fd_ >= 0) close(inotify_fd_);
  if (wake_fd_ >= 0) close(wake_fd_);
}

void QueueWatch::Wake() {
  const uint64_t one = 1;
  if (wake_fd_ >= 0 && write(wake_fd_, &one, sizeof(one)) < 0) errno = 0;
}

bool QueueWatch::EnsureWatch() {
  if (watch_ >= 0) return true;
  if (inotify_fd_ < 0) return false;
  // Lines are appended (modify, close) or a fresh queue is made (create,
  // moved in); the folder itself going away drops the watch (ignored).
  watch_ = inotify_add_watch(inotify_fd_, queue_dir_.c_str(),
                             IN_MODIFY | IN_CLOSE_WRITE | IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF);
  errno = 0;
  return watch_ >= 0;
}

bool QueueWatch::Drain() {
  alignas(struct inotify_event) char buffer[16384];
  bool relevant = false;
  for (;;) {
    const ssize_t length = read(inotify_fd_, buffer, sizeof(buffer));
    if (length <= 0) break;
    for (ssize_t offset = 0; offset < length;) {
      const auto* event = reinterpret_cast<const struct inotify_event*>(buffer + offset);
      if (event->mask & (IN_IGNORED | IN_DELETE_SELF | IN_MOVE_SELF)) {
        if (event->mask & IN_IGNORED) watch_ = -1;
        relevant = true;
      } else if (event->len > 0 && strncmp(event->name, queue_name_.c_str(), queue_name_.size()) == 0) {
        relevant = true;
      } else if (event->mask & IN_Q_OVERFLOW) {
        relevant = true;
      }
      offset += sizeof(struct inotify_event) + event->len;
    }
  }
  errno = 0;
  return relevant;
}

void QueueWatch::Wait(std::chrono::milliseconds timeout) {
  using Clock = std::chrono::steady_clock;
  const bool watching = EnsureWatch();
  if (!watching) timeout = std::min(timeout, fallback_poll_);
  const Clock::time_point deadline = Clock::now() + timeout;
  for (;;) {
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
    if (left.count() <= 0) return;
    struct pollfd fds[2] = {{wake_fd_, POLLIN, 0}, {inotify_fd_, POLLIN, 0}};
    const int ready = poll(fds, watching ? 2 : 1, static_cast<int>(std::min<long long>(left.count(), 1 << 30)));
    if (ready < 0 && errno != EINTR) {
      errno = 0;
      return;
    }
    errno = 0;
    if (ready <= 0) continue;
    if (fds[0].revents & POLLIN) {
      uint64_t count = 0;
      if (read(wake_fd_, &count, sizeof(count)) < 0) errno = 0;
      return;
    }
    if (watching && (fds[1].revents & POLLIN) && Drain()) return;
  }
}

}  // namespace fileindexd
}  // namespace corvlumex
