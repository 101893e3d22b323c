// The hand-off between the inotify reader and the event thread: chunks of
// raw inotify records, exactly as read() returned them, in order. The reader
// only ever waits for the mutex here, never for the disk.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>
#include <string>

namespace corvlumex {
namespace notifyd {

class RawEventQueue {
 public:
  // Beyond `max_bytes` queued, new chunks are dropped and a single overflow
  // record stands for them, as the kernel does with its own queue.
  explicit RawEventQueue(size_t max_bytes);

  void Push(std::string chunk);
  // The reader is done: nothing more will be pushed.
  void Close();

  // Takes every queued chunk into `out` (appended). Waits until there is one,
  // the queue is closed, or `timeout` passes. Returns false once the queue is
  // closed and empty.
  bool Take(std::deque<std::string>* out, std::chrono::milliseconds timeout);
  bool Empty() const;

 private:
  const size_t max_bytes_;
  mutable std::mutex mutex_;
  std::condition_variable ready_;
  std::deque<std::string> chunks_;
  size_t bytes_ = 0;
  bool dropping_ = false;
  bool closed_ = false;
};

// One IN_Q_OVERFLOW record, as the kernel reports a lost stretch of events.
std::string OverflowRecord();

}  // namespace notifyd
}  // namespace corvlumex
