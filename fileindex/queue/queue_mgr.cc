#include "fileindex/queue/queue_mgr.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>

#include "common/error.h"
#include "common/file_util.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/path_below.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/optree.h"
#include "fileindex/state/folder_mgr.h"

namespace corvlumex {
namespace fileindex {
namespace {

bool WriteWhole(int fd, const std::string& text) {
  size_t done = 0;
  while (done < text.size()) {
    const ssize_t n = write(fd, text.data() + done, text.size() - done);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    done += static_cast<size_t>(n);
  }
  return true;
}

}  // namespace

QueueMgr::QueueMgr(const std::string& queue_path) : queue_path_(queue_path), queue_path_tmp_(queue_path + ".tmp") {}

QueueMgr::~QueueMgr() = default;

void QueueMgr::PrepareTmpQueue() {
  if (!IsFileExist(queue_path_)) return;
  const LockFile lock(queue_path_, true);
  // A take-over that was not finished is processed first; the live queue
  // keeps growing meanwhile. The two files are never joined.
  if (IsFileExist(queue_path_tmp_)) return;
  CORV_CHECK_THROW_TEXT(0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str()),
                        "0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())", kErrorSystem,
                        std::string("rename failed, reason=") + strerror(errno));
}

std::shared_ptr<OPTree> QueueMgr::GetOPTree() const {
  if (!op_tree_) op_tree_ = std::make_shared<OPTree>(queue_path_);
  return op_tree_;
}

std::shared_ptr<OPTree> QueueMgr::GetOPTreeTmp() const {
  if (!op_tree_tmp_) op_tree_tmp_ = std::make_shared<OPTree>(queue_path_tmp_);
  return op_tree_tmp_;
}

int QueueMgr::DeleteTmp() { return unlink(queue_path_tmp_.c_str()); }

unsigned QueueMgr::ProcessOP(std::function<void(std::shared_ptr<OP>)> fn, bool use_tmp) {
  if (!use_tmp) return IsFileExist(queue_path_) ? GetOPTree()->ProcessOP(fn) : 0;
  PrepareTmpQueue();
  return IsFileExist(queue_path_tmp_) ? GetOPTreeTmp()->ProcessOP(fn) : 0;
}

bool QueueMgr::FindQueue(const std::function<bool(std::shared_ptr<Event>)>& predicate, const std::string& path) {
  if (!IsFileExist(path)) return false;
  std::ifstream input_stream(path);
  // Taken over or deleted since the check: the same as not there. Scans run
  // beside the daemon's take-overs without a lock, so this does happen.
  if (!input_stream && errno == ENOENT) return false;
  CORV_CHECK_THROW(!input_stream, kErrorSystem, std::string("Failed to open queue, reason=") + strerror(errno));
  std::string line;
  while (std::getline(input_stream, line)) {
    std::shared_ptr<Event> event;
    try {
      event = std::make_shared<Event>(line);
    } catch (const Error&) {
      // A last line without its "\n" may still be being appended: it is not
      // there yet. Any other malformed line fails the scan.
      if (input_stream.eof()) return false;
      throw;
    }
    if (predicate(event)) return true;
  }
  return false;
}

bool QueueMgr::IsFullPathProcessing(const std::string& full_path) {
  // Loaded for its checks only: an unreadable folder file fails the call.
  const FolderMgr folder_mgr;
  const auto mentions = [&full_path](std::shared_ptr<Event> event) {
    return IsPathAtOrBelow(event->path, full_path) || IsPathAtOrBelow(event->path_old, full_path);
  };
  return FindQueue(mentions, queue_path_) || FindQueue(mentions, queue_path_tmp_);
}

bool QueueMgr::IsFullPathHasReindex(const std::string& full_path) {
  // The opposite direction: the reindexed folder is an ancestor of the path.
  const auto covers = [&full_path](std::shared_ptr<Event> event) {
    return event->event == kEventReindex && IsPathAtOrBelow(full_path, event->path);
  };
  return FindQueue(covers, queue_path_) || FindQueue(covers, queue_path_tmp_);
}

bool QueueMgr::HasLostEvents() {
  const auto lost = [](std::shared_ptr<Event> event) { return (event->event & kEventQueueCrash) != 0; };
  return FindQueue(lost, queue_path_) || FindQueue(lost, queue_path_tmp_);
}

namespace {

// Appends `lines` in one write; the caller holds the queue's lock. On failure
// the file is cut back to its former length, so no half line is left.
bool AppendLocked(const std::string& queue_path, const std::string& lines, std::string* error) {
  const int fd = open(queue_path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
  if (fd < 0) {
    *error = std::string("cannot open the queue: ") + strerror(errno);
    errno = 0;
    return false;
  }
  struct stat before;
  bool ok = fstat(fd, &before) == 0;
  if (!ok) *error = std::string("cannot stat the queue: ") + strerror(errno);
  if (ok && !WriteWhole(fd, lines)) {
    ok = false;
    *error = std::string("write failed: ") + (errno != 0 ? strerror(errno) : "nothing written");
    // Part of a line would make the reader fail on it: back to the last whole line.
    if (ftruncate(fd, before.st_size) != 0) *error += std::string(", cut back failed: ") + strerror(errno);
  }
  close(fd);
  errno = 0;
  return ok;
}

// Without a folder for the queue there is nothing to lock or append to
// (and the lock would be refused with a logged failure).
bool QueueFolderExists(const std::string& queue_path, std::string* error) {
  const std::string folder = Dirname(queue_path);
  if (folder.empty() || IsDirExist(folder, true)) return true;
  *error = "the folder " + folder + " of the queue does not exist";
  return false;
}

}  // namespace

bool AppendQueueLines(const std::string& queue_path, const std::string& lines, std::string* error) {
  if (!QueueFolderExists(queue_path, error)) return false;
  try {
    // The lock makes the append and a take-over (rename) exclusive: a line
    // is either in the file that is taken over or in the next live queue.
    const LockFile lock(queue_path, true);
    return AppendLocked(queue_path, lines, error);
  } catch (const Error& lock_error) {
    *error = "cannot lock the queue: " + lock_error.reason;
    errno = 0;
    return false;
  }
}

bool AppendQueueLine(const std::string& queue_path, const std::string& line) {
  std::string ignored;
  if (!QueueFolderExists(queue_path, &ignored)) return false;
  // A queue that cannot be opened (even for its lock) loses the line quietly;
  // a lock that stays held past every retry is an error the caller sees,
  // since the line could be written a moment later.
  {
    const int fd = open(queue_path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
    if (fd < 0) {
      errno = 0;
      return false;
    }
    close(fd);
  }
  const LockFile lock(queue_path, true);
  return AppendLocked(queue_path, line + "\n", &ignored);
}

}  // namespace fileindex
}  // namespace corvlumex
