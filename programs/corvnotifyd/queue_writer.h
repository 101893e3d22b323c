// Appends the notifier's lines to the share queues: the lines of one queue
// are gathered in memory and written as one batch, under the queue's lock
// file (the lock the indexer takes to rename the queue away). A batch that
// cannot be written stays in memory and is tried again later.
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <string>
#include <unordered_map>

namespace corvlumex {
namespace notifyd {

// Appends `lines` (whole lines, each ended by "\n") to the queue file in one
// write through the library's batched append (under the queue's lock file).
// Creates the queue (and its folder,
// when the share's folder exists) if missing. On failure the file is cut
// back to its former length, so no half line is left, and false is returned
// with `error` set.
bool AppendQueueLines(const std::string& queue_path, const std::string& lines, std::string* error);

class QueueWriter {
 public:
  using Clock = std::chrono::steady_clock;
  // Called when a queue's lines had to be thrown away (the queue stayed
  // unwritable while they piled up past the limit): its share must be
  // reindexed.
  using LostFn = std::function<void(const std::string& queue)>;

  QueueWriter(size_t max_pending_bytes, LostFn lost);

  // The buffer of a queue's pending lines (whole lines, each ended by "\n").
  std::string& Buffer(const std::string& queue) { return pending_[queue].lines; }

  // Writes what is pending. A queue that failed is retried no sooner than its
  // retry time, unless `force` (at shutdown).
  void Flush(Clock::time_point now, bool force);
  bool HasPending() const;
  // The earliest retry time of a queue that failed; max() when none.
  Clock::time_point NextRetry() const;

 private:
  struct Pending {
    std::string lines;
    Clock::time_point retry_at{};
    Clock::duration retry_delay{};
    bool failing = false;
  };

  const size_t max_pending_bytes_;
  LostFn lost_;
  std::unordered_map<std::string, Pending> pending_;
};

}  // namespace notifyd
}  // namespace corvlumex
