#include "programs/corvnotifyd/queue_writer.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/file_util.h"
#include "common/log.h"
#include "fileindex/queue/queue_mgr.h"

namespace corvlumex {
namespace notifyd {
namespace {

constexpr std::chrono::seconds kFirstRetry(1);
constexpr std::chrono::seconds kLongestRetry(60);

// The queue lives in the share's metadata folder, which may not exist yet
// on a fresh share. It is made only inside an existing share folder: a
// vanished share gets no folder tree re-created under its old name.
bool EnsureQueueFolder(const std::string& queue_path, std::string* error) {
  const std::string folder = Dirname(queue_path);
  if (folder.empty() || IsDirExist(folder, true)) return true;
  if (!IsDirExist(Dirname(folder), true)) {
    *error = "the folder " + Dirname(folder) + " of the queue does not exist";
    return false;
  }
  if (mkdir(folder.c_str(), 0755) != 0 && errno != EEXIST) {
    *error = "cannot create " + folder + ": " + strerror(errno);
    return false;
  }
  return true;
}

}  // namespace

bool AppendQueueLines(const std::string& queue_path, const std::string& lines, std::string* error) {
  return EnsureQueueFolder(queue_path, error) && fileindex::AppendQueueLines(queue_path, lines, error);
}

QueueWriter::QueueWriter(size_t max_pending_bytes, LostFn lost)
    : max_pending_bytes_(max_pending_bytes), lost_(std::move(lost)) {}

void QueueWriter::Flush(Clock::time_point now, bool force) {
  for (auto it = pending_.begin(); it != pending_.end();) {
    const std::string& queue = it->first;
    Pending& pending = it->second;
    if (!pending.lines.empty() && (force || !pending.failing || now >= pending.retry_at)) {
      std::string error;
      if (AppendQueueLines(queue, pending.lines, &error)) {
        if (pending.failing) CORV_LOG("queue %s is writable again", queue.c_str());
        pending.lines.clear();
        pending.failing = false;
        pending.retry_delay = Clock::duration::zero();
      } else {
        if (!pending.failing) {
          CORV_LOG("cannot append to queue %s (%s); the lines are kept and tried again", queue.c_str(),
                   error.c_str());
        }
        pending.failing = true;
        pending.retry_delay = std::clamp<Clock::duration>(pending.retry_delay * 2, kFirstRetry, kLongestRetry);
        pending.retry_at = now + pending.retry_delay;
        if (pending.lines.size() > max_pending_bytes_) {
          CORV_LOG("queue %s stayed unwritable: %zu bytes of lines dropped, the share will be reindexed",
                   queue.c_str(), pending.lines.size());
          pending.lines.clear();
          pending.lines.shrink_to_fit();
          lost_(queue);
        }
      }
    }
    if (pending.lines.empty() && !pending.failing) {
      it = pending_.erase(it);
    } else {
      ++it;
    }
  }
}

bool QueueWriter::HasPending() const {
  for (const auto& [queue, pending] : pending_) {
    if (!pending.lines.empty()) return true;
  }
  return false;
}

QueueWriter::Clock::time_point QueueWriter::NextRetry() const {
  Clock::time_point next = Clock::time_point::max();
  for (const auto& [queue, pending] : pending_) {
    if (pending.failing && !pending.lines.empty()) next = std::min(next, pending.retry_at);
  }
  return next;
}

}  // namespace notifyd
}  // namespace corvlumex
