#include "programs/corvnotifyd/watch_tree.h"
#include "common/path_below.h"

#include <dirent.h>
#include <sys/inotify.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <memory>

namespace corvlumex {
namespace notifyd {
namespace {

// Modify is taken on close after writing, so a long copy is one event.
// IN_EXCL_UNLINK: a deleted file that is still open reports nothing more.
constexpr uint32_t kWatchEvents = IN_CREATE | IN_DELETE | IN_CLOSE_WRITE | IN_ATTRIB | IN_MOVED_FROM |
                                  IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF;

std::string Rebase(const std::string& path, const std::string& from, const std::string& to) {
  return to + path.substr(from.size());
}

}  // namespace

const uint32_t WatchTree::kInotifyMask = kWatchEvents | IN_ONLYDIR | IN_DONT_FOLLOW | IN_EXCL_UNLINK;

bool WatchRoot::Ignores(std::string_view name) const {
  return std::find(ignore.begin(), ignore.end(), name) != ignore.end();
}

bool WatchRoot::Covers(const std::string& candidate) const {
  if (candidate == path) return true;
  if (!IsPathStrictlyBelow(candidate, path)) return false;
  size_t start = path == "/" ? 1 : path.size() + 1;
  while (start <= candidate.size()) {
    size_t end = candidate.find('/', start);
    if (end == std::string::npos) end = candidate.size();
    if (Ignores(std::string_view(candidate).substr(start, end - start))) return false;
    start = end + 1;
  }
  return true;
}

WatchTree::WatchTree(int inotify_fd) : fd_(inotify_fd) {}

void WatchTree::SetRoots(std::vector<WatchRoot> roots) {
  roots_ = std::move(roots);
  std::vector<int> orphans;
  for (auto& [wd, dir] : by_wd_) {
    dir.roots = RootsOf(dir.path);
    if (dir.roots.empty()) orphans.push_back(wd);
  }
  for (int wd : orphans) {
    inotify_rm_watch(fd_, wd);
    Erase(wd);
  }
}

const WatchedDir* WatchTree::Find(int wd) const {
  const auto it = by_wd_.find(wd);
  return it == by_wd_.end() ? nullptr : &it->second;
}

const WatchedDir* WatchTree::FindPath(const std::string& path) const {
  const auto it = by_path_.find(path);
  return it == by_path_.end() ? nullptr : Find(it->second);
}

std::vector<int> WatchTree::RootsOf(const std::string& path) const {
  std::vector<int> result;
  for (size_t i = 0; i < roots_.size(); ++i) {
    if (roots_[i].Covers(path)) result.push_back(static_cast<int>(i));
  }
  return result;
}

AddResult WatchTree::Add(const std::string& path, const WatchedDir** added) {
  std::vector<int> roots = RootsOf(path);
  if (roots.empty()) return AddResult::kGone;
  if (watch_limit_ != 0 && by_wd_.size() >= watch_limit_ && by_path_.count(path) == 0) {
    errno = ENOSPC;
    return AddResult::kNoWatches;
  }
  const int wd = inotify_add_watch(fd_, path.c_str(), kInotifyMask);
  if (wd < 0) {
    if (errno == ENOSPC) return AddResult::kNoWatches;
    // Gone, replaced by a file, or a link: nothing to watch there.
    if (errno == ENOENT || errno == ENOTDIR || errno == ELOOP) return AddResult::kGone;
    return AddResult::kFailed;
  }
  auto existing = by_wd_.find(wd);
  if (existing != by_wd_.end() && existing->second.path != path) {
    // The same folder under a new name (renamed before we heard of it).
    by_path_.erase(existing->second.path);
  }
  const auto stale = by_path_.find(path);
  if (stale != by_path_.end() && stale->second != wd) by_wd_.erase(stale->second);
  WatchedDir& dir = by_wd_[wd];
  dir.wd = wd;
  dir.path = path;
  dir.roots = std::move(roots);
  by_path_[path] = wd;
  if (added != nullptr) *added = &dir;
  return AddResult::kAdded;
}

void WatchTree::Erase(int wd) {
  const auto it = by_wd_.find(wd);
  if (it == by_wd_.end()) return;
  const auto path_it = by_path_.find(it->second.path);
  if (path_it != by_path_.end() && path_it->second == wd) by_path_.erase(path_it);
  by_wd_.erase(it);
}

void WatchTree::Forget(int wd) { Erase(wd); }

void WatchTree::RemoveSubtree(const std::string& path) {
  std::vector<int> doomed;
  const auto self = by_path_.find(path);
  if (self != by_path_.end()) doomed.push_back(self->second);
  const std::string prefix = PrefixOfPathsBelow(path);
  for (auto it = by_path_.lower_bound(prefix); it != by_path_.end() && IsPathStrictlyBelow(it->first, path); ++it) {
    doomed.push_back(it->second);
  }
  for (int wd : doomed) {
    inotify_rm_watch(fd_, wd);
    Erase(wd);
  }
}

void WatchTree::MoveSubtree(const std::string& from, const std::string& to) {
  std::vector<int> moved;
  const auto self = by_path_.find(from);
  if (self != by_path_.end()) moved.push_back(self->second);
  const std::string prefix = PrefixOfPathsBelow(from);
  for (auto it = by_path_.lower_bound(prefix); it != by_path_.end() && IsPathStrictlyBelow(it->first, from); ++it) {
    moved.push_back(it->second);
  }
  for (int wd : moved) by_path_.erase(by_wd_[wd].path);
  for (int wd : moved) {
    WatchedDir& dir = by_wd_[wd];
    dir.path = Rebase(dir.path, from, to);
    dir.roots = RootsOf(dir.path);
    if (dir.roots.empty()) {
      inotify_rm_watch(fd_, wd);
      by_wd_.erase(wd);
      continue;
    }
    // A folder already known under the new name was replaced by this one.
    const auto clash = by_path_.find(dir.path);
    if (clash != by_path_.end() && clash->second != wd) by_wd_.erase(clash->second);
    by_path_[dir.path] = wd;
  }
}

bool WatchTree::Walk(const std::string& path, const FoundFn& found, std::string* no_watch_path) {
  bool complete = true;
  std::vector<std::string> pending{path};
  while (!pending.empty()) {
    const std::string dir_path = std::move(pending.back());
    pending.pop_back();
    const WatchedDir* dir = nullptr;
    const AddResult result = Add(dir_path, &dir);
    if (result == AddResult::kNoWatches) {
      if (complete && no_watch_path != nullptr) *no_watch_path = dir_path;
      complete = false;
      continue;
    }
    if (result != AddResult::kAdded) continue;
    // The folder is watched before it is read: whatever appears from now on
    // is reported by the kernel, whatever was there already is seen here.
    const WatchedDir parent = *dir;
    std::unique_ptr<DIR, int (*)(DIR*)> handle(opendir(dir_path.c_str()), closedir);
    if (!handle) continue;
    const std::string base = dir_path == "/" ? "" : dir_path;
    while (const struct dirent* entry = readdir(handle.get())) {
      const std::string_view name = entry->d_name;
      if (name == "." || name == "..") continue;
      std::string child = base + "/";
      child += name;
      bool is_dir = entry->d_type == DT_DIR;
      if (entry->d_type == DT_UNKNOWN) {
        struct stat st;
        is_dir = lstat(child.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
      }
      bool ignored_everywhere = true;
      for (int root : parent.roots) ignored_everywhere = ignored_everywhere && roots_[root].Ignores(name);
      if (ignored_everywhere) continue;
      if (found) found(child, is_dir, parent);
      if (is_dir) pending.push_back(std::move(child));
    }
  }
  errno = 0;
  return complete;
}

}  // namespace notifyd
}  // namespace corvlumex
