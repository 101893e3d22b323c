#include "programs/fileindexd/progress.h"

#include <time.h>

namespace corvlumex {
namespace fileindexd {

void ProgressBoard::SetState(const std::string& share, const std::string& state, const std::string& detail) {
  std::lock_guard<std::mutex> lock(mutex_);
  shares_[share].state = state;
  shares_[share].detail = detail;
}

void ProgressBoard::StartBatch(const std::string& share, uint64_t todo) {
  std::lock_guard<std::mutex> lock(mutex_);
  Share& entry = shares_[share];
  entry.state = kStateIndexing;
  entry.detail.clear();
  entry.done = 0;
  entry.todo = todo;
  entry.batch_start = Clock::now();
}

void ProgressBoard::AddTodo(const std::string& share, uint64_t count) {
  std::lock_guard<std::mutex> lock(mutex_);
  shares_[share].todo += count;
}

void ProgressBoard::Done(const std::string& share, uint64_t count) {
  std::lock_guard<std::mutex> lock(mutex_);
  Share& entry = shares_[share];
  entry.done += count;
  entry.total_done += count;
  if (entry.todo < entry.done) entry.todo = entry.done;
}

void ProgressBoard::Failed(const std::string& share, const std::string& path, const std::string& reason) {
  std::lock_guard<std::mutex> lock(mutex_);
  Share& entry = shares_[share];
  entry.failed.insert(path);
  entry.failures.push_back({path, reason, static_cast<long long>(time(nullptr))});
  if (entry.failures.size() > kKeptFailures) entry.failures.pop_front();
}

void ProgressBoard::Extracted(const std::string& share) {
  std::lock_guard<std::mutex> lock(mutex_);
  ++shares_[share].total_extracted;
}

void ProgressBoard::EndBatch(const std::string& share) {
  std::lock_guard<std::mutex> lock(mutex_);
  Share& entry = shares_[share];
  entry.state = kStateIdle;
  entry.detail.clear();
  entry.done = entry.todo = 0;
  entry.last_commit = Clock::now();
  entry.committed = true;
}

void ProgressBoard::SetDeferred(const std::string& share, size_t deferred) {
  std::lock_guard<std::mutex> lock(mutex_);
  shares_[share].deferred = deferred;
}

void ProgressBoard::Remove(const std::string& share) {
  std::lock_guard<std::mutex> lock(mutex_);
  shares_.erase(share);
}

Json::Value ProgressBoard::Snapshot() const {
  std::lock_guard<std::mutex> lock(mutex_);
  const Clock::time_point now = Clock::now();
  Json::Value out(Json::objectValue);
  for (const auto& [name, entry] : shares_) {
    Json::Value share(Json::objectValue);
    share["state"] = entry.state;
    share["detail"] = entry.detail;
    share["done"] = static_cast<Json::UInt64>(entry.done);
    share["todo"] = static_cast<Json::UInt64>(entry.todo);
    share["total_done"] = static_cast<Json::UInt64>(entry.total_done);
    share["total_failed"] = static_cast<Json::UInt64>(entry.failed.size());
    share["total_extracted"] = static_cast<Json::UInt64>(entry.total_extracted);
    share["deferred"] = static_cast<Json::UInt64>(entry.deferred);
    double rate = 0;
    if (entry.state == kStateIndexing) {
      const double seconds = std::chrono::duration<double>(now - entry.batch_start).count();
      if (seconds > 0.2 && entry.done > 0) rate = entry.done / seconds;
    }
    share["rate"] = rate;
    // Time left at the batch's rate so far; -1 while it cannot be told.
    share["eta_seconds"] = rate > 0 ? static_cast<double>(entry.todo - entry.done) / rate : -1.0;
    share["last_commit_age_seconds"] =
        entry.committed ? std::chrono::duration<double>(now - entry.last_commit).count() : -1.0;
    share["failed_files"] = Json::Value(Json::arrayValue);
    for (const auto& failure : entry.failures) {
      Json::Value item(Json::objectValue);
      item["path"] = failure.path;
      item["reason"] = failure.reason;
      item["time"] = static_cast<Json::Int64>(failure.time);
      share["failed_files"].append(item);
    }
    out[name] = share;
  }
  return out;
}

}  // namespace fileindexd
}  // namespace corvlumex
