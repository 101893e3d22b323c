// Turns raw inotify records into queue lines, and keeps the watch tree in
// step with the folders it reports: new folders are watched (and read, so
// nothing made in them before the watch is missed), folders moved out or
// deleted lose their watches, renames are paired by their cookie.
#pragma once

#include <sys/inotify.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "programs/corvnotifyd/watch_tree.h"

namespace corvlumex {
namespace notifyd {

enum class LossKind {
  kKernelOverflow,   // the kernel's event queue overflowed
  kNoWatches,        // the kernel has no watch left for a folder
  kQueueUnwritable,  // lines were dropped after the queue stayed unwritable
};

class EventTranslator {
 public:
  struct Callbacks {
    // The buffer that collects the lines of a queue.
    std::function<std::string&(const std::string& queue)> buffer;
    // Events of a queue were lost; `detail` names the folder when known.
    std::function<void(const std::string& queue, LossKind kind, const std::string& detail)> lost;
    // Something changed in the configuration folder (or its watch was lost).
    std::function<void(bool watch_lost)> config_changed;
  };

  EventTranslator(WatchTree* tree, Callbacks callbacks);

  void set_config_wd(int wd) { config_wd_ = wd; }

  // Installs a new set of configured folders and watches the new ones
  // (without lines: adding a folder to the index reindexes it anyway).
  void ApplyRoots(std::vector<WatchRoot> roots);

  // Every record of one read() result, in order.
  void ProcessChunk(const std::string& chunk);
  void Process(const struct inotify_event& event, std::string_view name);

  // A rename's first half waits for its second; when none comes, the entry
  // left the watched tree.
  bool HasPendingMove() const { return pending_move_.has_value(); }
  void ResolvePendingMove();

  // Notices configured folders that vanished (a delete line for each) and,
  // with `retry_missing`, watches those that appeared (a create line each).
  void CheckRoots(bool retry_missing);
  bool AnyRootMissing() const;

  // Watches again whatever is missing under the folders of `queue` (after
  // lost events some new folders may have gone unnoticed). False when the
  // kernel ran out of watches again.
  bool Rewatch(const std::string& queue);

 private:
  struct Target {
    const std::string* queue;
    uint32_t mask;
  };
  struct PendingMove {
    uint32_t cookie;
    std::string path;
    std::string name;
    bool is_dir;
    std::vector<int> roots;
  };

  void Targets(const std::vector<int>& roots, std::string_view name, std::vector<Target>* out) const;
  void Emit(const std::vector<Target>& targets, uint32_t event, bool is_dir, const std::string& path,
            const std::string& path_old = std::string());
  void ProcessSelf(const WatchedDir& dir, uint32_t mask);
  void Rename(const PendingMove& from, const WatchedDir& to_dir, std::string_view name, const std::string& path,
              bool is_dir);
  // Watches a folder that just appeared and reports a create for everything
  // found in it, to the queues of `only` (all queues of its roots when null).
  void WatchNewFolder(const std::string& path, const std::vector<const std::string*>* only);
  void LostForRoots(const std::vector<int>& roots, LossKind kind, const std::string& detail);

  WatchTree* tree_;
  Callbacks callbacks_;
  int config_wd_ = -1;
  std::optional<PendingMove> pending_move_;
  std::vector<char> root_present_;
};

}  // namespace notifyd
}  // namespace corvlumex
