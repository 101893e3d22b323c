#include "programs/corvnotifyd/event_translator.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/file_util.h"
#include "common/log.h"
#include "programs/corvnotifyd/event_line.h"

namespace corvlumex {
namespace notifyd {
namespace {

std::string Join(const std::string& dir, std::string_view name) {
  std::string path = dir == "/" ? std::string() : dir;
  path += '/';
  path += name;
  return path;
}

bool Contains(const std::vector<const std::string*>& queues, const std::string& queue) {
  return std::any_of(queues.begin(), queues.end(), [&](const std::string* q) { return *q == queue; });
}

}  // namespace

EventTranslator::EventTranslator(WatchTree* tree, Callbacks callbacks)
    : tree_(tree), callbacks_(std::move(callbacks)) {}

void EventTranslator::Targets(const std::vector<int>& roots, std::string_view name,
                              std::vector<Target>* out) const {
  out->clear();
  for (int index : roots) {
    const WatchRoot& root = tree_->roots()[index];
    if (!name.empty() && root.Ignores(name)) continue;
    auto same = std::find_if(out->begin(), out->end(), [&](const Target& t) { return *t.queue == root.queue; });
    if (same != out->end()) {
      same->mask |= root.mask;
    } else {
      out->push_back({&root.queue, root.mask});
    }
  }
}

void EventTranslator::Emit(const std::vector<Target>& targets, uint32_t event, bool is_dir,
                           const std::string& path, const std::string& path_old) {
  for (const Target& target : targets) {
    if ((target.mask & event) == 0) continue;
    FormatQueueLine(callbacks_.buffer(*target.queue), event, is_dir, path, path_old);
  }
}

void EventTranslator::LostForRoots(const std::vector<int>& roots, LossKind kind, const std::string& detail) {
  std::vector<Target> targets;
  Targets(roots, std::string_view(), &targets);
  for (const Target& target : targets) callbacks_.lost(*target.queue, kind, detail);
}

void EventTranslator::ApplyRoots(std::vector<WatchRoot> roots) {
  // A waiting rename half refers to the old roots.
  ResolvePendingMove();
  tree_->SetRoots(std::move(roots));
  root_present_.assign(tree_->roots().size(), 0);
  for (size_t i = 0; i < tree_->roots().size(); ++i) {
    const WatchRoot& root = tree_->roots()[i];
    if (tree_->FindPath(root.path) == nullptr) {
      std::string no_watch;
      if (!tree_->Walk(root.path, nullptr, &no_watch)) {
        LostForRoots(tree_->RootsOf(no_watch), LossKind::kNoWatches, no_watch);
      }
    }
    root_present_[i] = tree_->FindPath(root.path) != nullptr;
    if (!root_present_[i]) {
      CORV_LOG("folder %s of queue %s cannot be watched yet (missing?); it is watched once it appears",
               root.path.c_str(), root.queue.c_str());
    }
  }
}

void EventTranslator::ProcessChunk(const std::string& chunk) {
  size_t offset = 0;
  while (offset + sizeof(struct inotify_event) <= chunk.size()) {
    struct inotify_event event;
    memcpy(&event, chunk.data() + offset, sizeof(event));
    const char* name = chunk.data() + offset + sizeof(event);
    const size_t room = std::min<size_t>(event.len, chunk.size() - offset - sizeof(event));
    Process(event, std::string_view(name, strnlen(name, room)));
    offset += sizeof(event) + event.len;
  }
}

void EventTranslator::Process(const struct inotify_event& event, std::string_view name) {
  if (event.mask & IN_Q_OVERFLOW) {
    ResolvePendingMove();
    // Which folders lost events is unknown: every queue did.
    std::vector<int> all(tree_->roots().size());
    for (size_t i = 0; i < all.size(); ++i) all[i] = static_cast<int>(i);
    LostForRoots(all, LossKind::kKernelOverflow, std::string());
    // The configuration may have changed unseen too.
    callbacks_.config_changed(false);
    return;
  }
  if (event.wd == config_wd_ && config_wd_ >= 0) {
    const bool lost = (event.mask & IN_IGNORED) != 0;
    if (lost) config_wd_ = -1;
    callbacks_.config_changed(lost);
    return;
  }
  if (pending_move_ && !((event.mask & IN_MOVED_TO) && event.cookie == pending_move_->cookie)) {
    ResolvePendingMove();
  }
  const WatchedDir* found = tree_->Find(event.wd);
  if (found == nullptr) return;  // its watch is already gone
  if (event.mask & IN_IGNORED) {
    tree_->Forget(event.wd);
    return;
  }
  if (name.empty()) {
    ProcessSelf(*found, event.mask);
    return;
  }
  // The tree may change below (new watches): work on a copy.
  const WatchedDir dir = *found;
  const std::string path = Join(dir.path, name);
  const bool is_dir = (event.mask & IN_ISDIR) != 0;
  std::vector<Target> targets;
  Targets(dir.roots, name, &targets);
  if (event.mask & IN_MOVED_FROM) {
    pending_move_ = PendingMove{event.cookie, path, std::string(name), is_dir, dir.roots};
    return;
  }
  if (event.mask & IN_MOVED_TO) {
    if (pending_move_) {
      const PendingMove from = std::move(*pending_move_);
      pending_move_.reset();
      Rename(from, dir, name, path, is_dir);
      return;
    }
    // Moved in from outside the watched tree: new here.
    if (targets.empty()) return;
    Emit(targets, kEventCreate, is_dir, path);
    if (is_dir) WatchNewFolder(path, nullptr);
    return;
  }
  if (targets.empty()) return;  // an ignored name
  if (event.mask & IN_CREATE) {
    Emit(targets, kEventCreate, is_dir, path);
    if (is_dir) WatchNewFolder(path, nullptr);
  } else if (event.mask & IN_DELETE) {
    // A deleted folder's own watches end with the kernel's IN_IGNORED.
    Emit(targets, kEventDelete, is_dir, path);
  } else if (event.mask & IN_CLOSE_WRITE) {
    if (!is_dir) Emit(targets, kEventModify, false, path);
  } else if (event.mask & IN_ATTRIB) {
    Emit(targets, kEventAttr, is_dir, path);
  }
}

void EventTranslator::ProcessSelf(const WatchedDir& dir, uint32_t mask) {
  // A folder's own changes are reported by its parent's watch, except for a
  // configured folder, whose parent is not watched.
  std::vector<int> here;
  for (int index : dir.roots) {
    if (tree_->roots()[index].path == dir.path) here.push_back(index);
  }
  if (here.empty()) return;
  if (mask & IN_ATTRIB) {
    std::vector<Target> targets;
    Targets(here, std::string_view(), &targets);
    Emit(targets, kEventAttr, true, dir.path);
  }
  // Moved away, its watch would follow it outside: drop it. The delete line
  // comes from CheckRoots, which sees the folder gone.
  if (mask & IN_MOVE_SELF) tree_->RemoveSubtree(dir.path);
}

void EventTranslator::ResolvePendingMove() {
  if (!pending_move_) return;
  const PendingMove from = std::move(*pending_move_);
  pending_move_.reset();
  std::vector<Target> targets;
  Targets(from.roots, from.name, &targets);
  Emit(targets, kEventDelete, from.is_dir, from.path);
  // Moved out of the watched tree: its watches would report from elsewhere.
  if (from.is_dir) tree_->RemoveSubtree(from.path);
}

void EventTranslator::Rename(const PendingMove& from, const WatchedDir& to_dir, std::string_view name,
                             const std::string& path, bool is_dir) {
  std::vector<Target> old_targets;
  std::vector<Target> new_targets;
  Targets(from.roots, from.name, &old_targets);
  Targets(to_dir.roots, name, &new_targets);
  std::vector<const std::string*> arrived;  // queues for which the entry is new
  for (const Target& target : new_targets) {
    const auto old = std::find_if(old_targets.begin(), old_targets.end(),
                                  [&](const Target& t) { return *t.queue == *target.queue; });
    if (old == old_targets.end()) {
      arrived.push_back(target.queue);
      Emit({target}, kEventCreate, is_dir, path);
    } else if (target.mask & kEventRename) {
      Emit({target}, kEventRename, is_dir, path, from.path);
    } else {
      // A folder that does not ask for renames still hears of both names.
      Emit({*old}, kEventDelete, is_dir, from.path);
      Emit({target}, kEventCreate, is_dir, path);
    }
  }
  for (const Target& target : old_targets) {
    if (!std::any_of(new_targets.begin(), new_targets.end(),
                     [&](const Target& t) { return *t.queue == *target.queue; })) {
      Emit({target}, kEventDelete, is_dir, from.path);
    }
  }
  if (!is_dir) return;
  if (tree_->FindPath(from.path) != nullptr) {
    tree_->MoveSubtree(from.path, path);
    if (!arrived.empty()) WatchNewFolder(path, &arrived);
  } else {
    // Never watched under its old name (renamed before its watch was added,
    // or coming from an ignored name): new to every queue.
    WatchNewFolder(path, nullptr);
  }
}

void EventTranslator::WatchNewFolder(const std::string& path, const std::vector<const std::string*>* only) {
  std::vector<Target> targets;
  const auto found = [&](const std::string& child, bool child_is_dir, const WatchedDir& parent) {
    Targets(parent.roots, Basename(child), &targets);
    if (only != nullptr) {
      targets.erase(std::remove_if(targets.begin(), targets.end(),
                                   [&](const Target& t) { return !Contains(*only, *t.queue); }),
                    targets.end());
    }
    Emit(targets, kEventCreate, child_is_dir, child);
  };
  std::string no_watch;
  if (!tree_->Walk(path, found, &no_watch)) {
    LostForRoots(tree_->RootsOf(no_watch), LossKind::kNoWatches, no_watch);
  }
}

void EventTranslator::CheckRoots(bool retry_missing) {
  for (size_t i = 0; i < tree_->roots().size(); ++i) {
    const WatchRoot& root = tree_->roots()[i];
    const bool watched = tree_->FindPath(root.path) != nullptr;
    std::vector<Target> targets;
    Targets({static_cast<int>(i)}, std::string_view(), &targets);
    if (root_present_[i] && !watched) {
      CORV_LOG("watched folder %s is gone; it is watched again once it reappears", root.path.c_str());
      Emit(targets, kEventDelete, true, root.path);
      root_present_[i] = 0;
    } else if (!root_present_[i] && retry_missing) {
      std::string no_watch;
      if (!tree_->Walk(root.path, nullptr, &no_watch)) {
        LostForRoots(tree_->RootsOf(no_watch), LossKind::kNoWatches, no_watch);
      }
      if (tree_->FindPath(root.path) == nullptr) continue;
      CORV_LOG("watched folder %s appeared", root.path.c_str());
      // Watched first, announced after: the indexer reads it after this line.
      Emit(targets, kEventCreate, true, root.path);
      root_present_[i] = 1;
    }
  }
}

bool EventTranslator::AnyRootMissing() const {
  return std::find(root_present_.begin(), root_present_.end(), 0) != root_present_.end();
}

bool EventTranslator::Rewatch(const std::string& queue) {
  bool complete = true;
  for (const WatchRoot& root : tree_->roots()) {
    if (root.queue != queue) continue;
    std::string no_watch;
    complete = tree_->Walk(root.path, nullptr, &no_watch) && complete;
  }
  return complete;
}

}  // namespace notifyd
}  // namespace corvlumex
