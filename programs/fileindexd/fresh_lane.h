// Keeps a single new file from waiting behind a bulk batch. While a share's
// worker applies a large taken-over queue, this lane follows the lines the
// notifier appends to the live queue meanwhile and, for the files of folders
// that got only a few of them (a file saved here, not a copy of thousands
// there), stores or deletes the file by what the disk has and commits, so it
// is searchable within about a poll interval.
//
// It only looks: the live queue is neither taken over nor changed, so its
// lines are applied again, in order, when their turn comes (a lost race or a
// crash here costs one extraction, never a change). Renames, folder events,
// reindexes and crash marks are left to that in-order pass. A path is
// refreshed again only when it changed since, and at most three times per
// lane (its create, its first write and one more), so a noisy file keeps its
// settle interval.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <thread>
#include <unordered_map>

#include "programs/fileindexd/op_applier.h"

namespace corvlumex {
namespace fileindexd {

struct FreshLaneOptions {
  std::chrono::milliseconds poll{200};
  // A folder with more new lines than this in one look is bulk work.
  size_t small_group = 8;
};

class FreshLane {
 public:
  // `applier` must not be used by another thread while the lane runs.
  FreshLane(const std::string& share, const std::string& queue_path, OpApplier& applier, FreshLaneOptions options);
  // Stops the thread.
  ~FreshLane();
  FreshLane(const FreshLane&) = delete;
  FreshLane& operator=(const FreshLane&) = delete;

  void Start();
  void Stop();
  // One look at the lines appended since the last one: refreshes the files
  // of small groups and commits. Returns how many files it refreshed.
  size_t Look();

 private:
  void Run();
  // True when `path` is to be refreshed now (and that is noted).
  bool Due(const std::string& path);

  std::string share_;
  std::string queue_path_;
  OpApplier& applier_;
  FreshLaneOptions options_;
  ino_t inode_ = 0;
  off_t offset_ = 0;
  struct Refreshed {
    int times = 0;
    long long mtime_ns = -1;
    long long size = -1;
  };
  std::unordered_map<std::string, Refreshed> refreshed_;
  std::mutex mutex_;
  std::condition_variable stop_signal_;
  bool stopping_ = false;
  std::thread thread_;
};

}  // namespace fileindexd
}  // namespace corvlumex
