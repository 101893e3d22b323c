#include "programs/fileindexd/settle_tracker.h"

#include <json/json.h>

#include <algorithm>

#include "common/file_util.h"
#include "common/json_util.h"
#include "common/log.h"

namespace corvlumex {
namespace fileindexd {

SettleTracker::SettleTracker(const std::string& state_path, SettleOptions options)
    : state_path_(state_path), options_(options) {}

bool SettleTracker::Admit(const std::string& path, Clock::time_point now) {
  Prune(now);
  auto it = entries_.find(path);
  if (it == entries_.end()) {
    entries_[path] = Entry{now, options_.initial, 1, false, now};
    return true;
  }
  Entry& entry = it->second;
  if (entry.deferred) return false;  // already waiting; its turn comes
  if (now - entry.last_extracted >= entry.interval) {
    entry.last_extracted = now;
    entry.burst = 1;
    return true;
  }
  if (entry.burst < 2) {
    entry.last_extracted = now;
    ++entry.burst;
    return true;
  }
  // Changed again too soon: wait out the interval, and make the next one longer.
  entry.deferred = true;
  entry.due = entry.last_extracted + entry.interval;
  entry.interval = std::min(options_.ceiling, entry.interval * 2);
  dirty_ = true;
  return false;
}

void SettleTracker::Forget(const std::string& path) {
  auto it = entries_.find(path);
  if (it == entries_.end()) return;
  if (it->second.deferred) dirty_ = true;
  entries_.erase(it);
}

std::vector<std::string> SettleTracker::DueNow(Clock::time_point now) const {
  std::vector<std::string> due;
  for (const auto& [path, entry] : entries_) {
    if (entry.deferred && entry.due <= now) due.push_back(path);
  }
  return due;
}

void SettleTracker::Confirm(const std::vector<std::string>& paths, Clock::time_point now) {
  for (const std::string& path : paths) {
    auto it = entries_.find(path);
    if (it == entries_.end() || !it->second.deferred) continue;
    it->second.deferred = false;
    it->second.last_extracted = now;
    it->second.burst = 2;  // still noisy: its next change within the interval waits
    dirty_ = true;
  }
}

SettleTracker::Clock::time_point SettleTracker::NextDue() const {
  Clock::time_point next = Clock::time_point::max();
  for (const auto& [path, entry] : entries_) {
    if (entry.deferred) next = std::min(next, entry.due);
  }
  return next;
}

size_t SettleTracker::DeferredCount() const {
  return std::count_if(entries_.begin(), entries_.end(), [](const auto& item) { return item.second.deferred; });
}

void SettleTracker::Prune(Clock::time_point now) {
  // Files quiet for twice their interval are forgotten, so a file changed
  // once an hour is never delayed and the map stays small.
  for (auto it = entries_.begin(); it != entries_.end();) {
    const Entry& entry = it->second;
    if (!entry.deferred && now - entry.last_extracted >= 2 * entry.interval) {
      it = entries_.erase(it);
    } else {
      ++it;
    }
  }
}

bool SettleTracker::Save() {
  if (!dirty_) return true;
  Json::Value paths(Json::arrayValue);
  for (const auto& [path, entry] : entries_) {
    if (entry.deferred) paths.append(path);
  }
  bool ok = true;
  if (paths.empty()) {
    ok = !IsFileExist(state_path_) || Unlink(state_path_);
  } else {
    ok = JsonToFile(paths, state_path_);
  }
  if (!ok) {
    CORV_LOG("cannot save the deferred files to %s", state_path_.c_str());
    return false;
  }
  dirty_ = false;
  return true;
}

void SettleTracker::Load() {
  if (!IsFileExist(state_path_)) return;
  Json::Value paths;
  if (!JsonFromFile(paths, state_path_) || !paths.isArray()) {
    CORV_LOG("ignoring the unreadable list of deferred files %s", state_path_.c_str());
    return;
  }
  const Clock::time_point now = Clock::now();
  for (const Json::Value& path : paths) {
    if (!path.isString()) continue;
    entries_[path.asString()] = Entry{now - options_.initial, options_.initial, 2, true, now};
  }
}

}  // namespace fileindexd
}  // namespace corvlumex
