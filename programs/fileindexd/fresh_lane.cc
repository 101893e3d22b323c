#include "programs/fileindexd/fresh_lane.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <map>
#include <vector>

#include "common/error.h"
#include "common/file_util.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/queue/event.h"

namespace corvlumex {
namespace fileindexd {
namespace {

// Events that name one file whose state the disk tells.
constexpr uint32_t kFileEvents =
    fileindex::kEventModify | fileindex::kEventAttr | fileindex::kEventCreate | fileindex::kEventDelete;
// Read at most this much of the live queue in one look; the rest waits for the next.
constexpr size_t kMaxLookBytes = 4 << 20;
constexpr int kMaxRefreshes = 3;

}  // namespace

FreshLane::FreshLane(const std::string& share, const std::string& queue_path, OpApplier& applier,
                     FreshLaneOptions options)
    : share_(share), queue_path_(queue_path), applier_(applier), options_(options) {}

FreshLane::~FreshLane() { Stop(); }

void FreshLane::Start() {
  thread_ = std::thread([this] { Run(); });
}

void FreshLane::Stop() {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    stopping_ = true;
  }
  stop_signal_.notify_all();
  if (thread_.joinable()) thread_.join();
}

void FreshLane::Run() {
  std::unique_lock<std::mutex> lock(mutex_);
  while (!stop_signal_.wait_for(lock, options_.poll, [this] { return stopping_; })) {
    lock.unlock();
    try {
      Look();
    } catch (const Error&) {
      // The search daemon's trouble is the batch's to report and retry; the
      // lines stay in the queue for it.
    } catch (const BatchInterrupted&) {
    } catch (const std::exception& error) {
      CORV_LOG("fresh files of share %s: %s", share_.c_str(), error.what());
    }
    lock.lock();
  }
}

bool FreshLane::Due(const std::string& path) {
  struct stat st;
  long long mtime_ns = -1, size = -1;
  if (lstat(path.c_str(), &st) == 0) {
    mtime_ns = static_cast<long long>(st.st_mtim.tv_sec) * 1000000000LL + st.st_mtim.tv_nsec;
    size = st.st_size;
  }
  errno = 0;
  Refreshed& seen = refreshed_[path];
  if (seen.times >= kMaxRefreshes || (seen.times > 0 && seen.mtime_ns == mtime_ns && seen.size == size)) {
    return false;
  }
  seen = Refreshed{seen.times + 1, mtime_ns, size};
  return true;
}

size_t FreshLane::Look() {
  const int fd = open(queue_path_.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) {
    errno = 0;
    return 0;  // nothing appended yet
  }
  struct stat st;
  std::string text;
  if (fstat(fd, &st) == 0) {
    if (st.st_ino != inode_ || st.st_size < offset_) {
      inode_ = st.st_ino;  // a new live queue: from its start
      offset_ = 0;
    }
    text.resize(std::min<size_t>(kMaxLookBytes, static_cast<size_t>(st.st_size - offset_)));
    const ssize_t n = text.empty() ? 0 : pread(fd, text.data(), text.size(), offset_);
    text.resize(n > 0 ? static_cast<size_t>(n) : 0);
  }
  close(fd);
  // Only whole lines: the notifier may be writing the last one.
  const size_t end = text.rfind('\n');
  if (end == std::string::npos) return 0;
  offset_ += static_cast<off_t>(end + 1);

  std::map<std::string, std::vector<std::string>> by_folder;
  size_t start = 0;
  while (start <= end) {
    const size_t stop = text.find('\n', start);
    const std::string line = text.substr(start, stop - start);
    start = stop + 1;
    try {
      const fileindex::Event event(line);
      if (event.is_dir || (event.event & ~kFileEvents) != 0 || (event.event & kFileEvents) == 0) continue;
      by_folder[Dirname(event.path)].push_back(event.path);
    } catch (const Error&) {
      // A malformed line is the in-order pass's to log.
    }
  }
  size_t refreshed = 0;
  for (const auto& [folder, paths] : by_folder) {
    if (paths.size() > options_.small_group) continue;
    for (const std::string& path : paths) {
      if (!Due(path)) continue;
      applier_.Refresh(path);
      ++refreshed;
    }
  }
  if (refreshed > 0) fileindex::elastic::IndexCommit(share_);
  return refreshed;
}

}  // namespace fileindexd
}  // namespace corvlumex
