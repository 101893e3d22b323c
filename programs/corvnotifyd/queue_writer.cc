#include "programs/corvnotifyd/queue_writer.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/file_util.h"
#include "common/lock_file.h"
#include "common/log.h"

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

bool WriteAll(int fd, const std::string& data, std::string* error) {
  size_t written = 0;
  while (written < data.size()) {
    const ssize_t n = write(fd, data.data() + written, data.size() - written);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      *error = std::string("write failed: ") + (n < 0 ? strerror(errno) : "nothing written");
      return false;
    }
    written += static_cast<size_t>(n);
  }
  return true;
}

}  // namespace

bool AppendQueueLines(const std::string& queue_path, const std::string& lines, std::string* error) {
  if (!EnsureQueueFolder(queue_path, error)) return false;
  try {
    LockFile lock(queue_path, true);
    const int fd = open(queue_path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
    if (fd < 0) {
      *error = std::string("cannot open the queue: ") + strerror(errno);
      return false;
    }
    struct stat before;
    bool ok = fstat(fd, &before) == 0;
    if (!ok) *error = std::string("cannot stat the queue: ") + strerror(errno);
    ok = ok && WriteAll(fd, lines, error);
    // A failed write may have left part of a line: the reader would stop at
    // it, so the file goes back to its last whole line.
    if (!ok && ftruncate(fd, before.st_size) != 0) *error += std::string(", cut back failed: ") + strerror(errno);
    close(fd);
    errno = 0;
    return ok;
  } catch (const Error& e) {
    *error = "cannot lock the queue: " + e.reason;
    errno = 0;
    return false;
  }
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
