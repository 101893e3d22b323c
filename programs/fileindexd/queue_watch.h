// Wakes a share's worker when its queue file gets new lines (inotify on the
// queue's folder), when another thread calls Wake(), or when the timeout
// ends. When the queue's folder does not exist yet the watch falls back to
// a short poll and tries to watch again at each wait.
#pragma once

#include <chrono>
#include <string>

namespace corvlumex {
namespace fileindexd {

class QueueWatch {
 public:
  QueueWatch(const std::string& queue_path, std::chrono::milliseconds fallback_poll);
  ~QueueWatch();
  QueueWatch(const QueueWatch&) = delete;
  QueueWatch& operator=(const QueueWatch&) = delete;

  // Any thread.
  void Wake();
  // Sets the watch up (when the folder exists). Call it before looking at
  // the queue, so that a queue made after the look wakes the next Wait.
  void Arm() { EnsureWatch(); }
  // Returns after a change of the queue file, a Wake(), or `timeout`.
  void Wait(std::chrono::milliseconds timeout);

 private:
  bool EnsureWatch();
  bool Drain();  // true when an event names the queue (or its temporary copy)

  std::string queue_dir_;
  std::string queue_name_;
  std::chrono::milliseconds fallback_poll_;
  int inotify_fd_ = -1;
  int wake_fd_ = -1;
  int watch_ = -1;
};

}  // namespace fileindexd
}  // namespace corvlumex
