// The folders under inotify watch: which watch descriptor stands for which
// folder, and which configured folders (roots) each one belongs to. Only the
// event thread touches it.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace corvlumex {
namespace notifyd {

// A configured folder in effect, with the queue its events go to.
struct WatchRoot {
  std::string path;
  std::string queue;
  uint32_t mask = 0;
  std::vector<std::string> ignore;
  bool Ignores(std::string_view name) const;
  // True when `path` is this folder or lies below it without passing
  // through an ignored name.
  bool Covers(const std::string& path) const;
};

struct WatchedDir {
  int wd = -1;
  std::string path;
  std::vector<int> roots;  // indices into WatchTree::roots()
};

enum class AddResult { kAdded, kGone, kNoWatches, kFailed };

class WatchTree {
 public:
  // The events asked of the kernel for every folder.
  static const uint32_t kInotifyMask;

  explicit WatchTree(int inotify_fd);

  // Replaces the configured folders. Folders no root covers any more lose
  // their watch; the others get their roots recomputed.
  void SetRoots(std::vector<WatchRoot> roots);
  const std::vector<WatchRoot>& roots() const { return roots_; }

  const WatchedDir* Find(int wd) const;
  const WatchedDir* FindPath(const std::string& path) const;
  // Roots covering `path` (which need not be watched).
  std::vector<int> RootsOf(const std::string& path) const;

  // Watches one folder (not its contents). A folder no root covers is not
  // watched (kGone).
  AddResult Add(const std::string& path, const WatchedDir** dir);
  // The kernel dropped the watch (the folder is gone).
  void Forget(int wd);
  // Stops watching `path` and everything below it.
  void RemoveSubtree(const std::string& path);
  // A watched folder was renamed: its watches follow it. Folders that land
  // outside every root lose their watch.
  void MoveSubtree(const std::string& from, const std::string& to);

  // Watches `path` and every folder below it (ignored names excepted).
  // `found` is called for each entry seen, after its folder is watched, with
  // the entry's full path, whether it is a folder, and its parent. Returns
  // false when the kernel ran out of watches on the way; `no_watch_path` then
  // names the first folder that could not be watched.
  using FoundFn = std::function<void(const std::string& path, bool is_dir, const WatchedDir& parent)>;
  bool Walk(const std::string& path, const FoundFn& found, std::string* no_watch_path);

  size_t size() const { return by_wd_.size(); }
  // Test hook: pretend the kernel allows only this many watches (0: no limit).
  void set_watch_limit(size_t limit) { watch_limit_ = limit; }

 private:
  void Erase(int wd);

  int fd_;
  size_t watch_limit_ = 0;
  std::vector<WatchRoot> roots_;
  std::unordered_map<int, WatchedDir> by_wd_;
  std::map<std::string, int> by_path_;  // ordered, so a subtree is one range
};

}  // namespace notifyd
}  // namespace corvlumex
