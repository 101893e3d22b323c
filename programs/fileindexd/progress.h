// What each share's worker is doing, for the "status" command: its state,
// the files done and still to do in the current batch, the rate and the
// time left at that rate, and totals since the daemon started.
#pragma once

#include <json/json.h>

#include <chrono>
#include <deque>
#include <map>
#include <mutex>
#include <set>
#include <string>

namespace corvlumex {
namespace fileindexd {

// States of a share's worker as "status" reports them.
constexpr char kStateIdle[] = "idle";            // nothing queued
constexpr char kStateIndexing[] = "indexing";    // applying a batch
constexpr char kStatePaused[] = "paused";        // indexing is paused
constexpr char kStateRetrying[] = "retrying";    // the last batch failed; it is tried again
constexpr char kStateNoSpace[] = "no_space";     // stopped: the volume is full
constexpr char kStateStopped[] = "stopped";      // the worker was stopped

class ProgressBoard {
 public:
  using Clock = std::chrono::steady_clock;

  void SetState(const std::string& share, const std::string& state, const std::string& detail = "");
  // A new batch of `todo` files starts.
  void StartBatch(const std::string& share, uint64_t todo);
  // More files to do in this batch (a folder walk found them).
  void AddTodo(const std::string& share, uint64_t count);
  void Done(const std::string& share, uint64_t count = 1);
  // Indexing `path` failed. "total_failed" counts files, not attempts: a
  // file that fails again on every retry counts once. The latest
  // kKeptFailures of each share are kept (path, reason, when) for the
  // administrators' list.
  void Failed(const std::string& share, const std::string& path, const std::string& reason = "");
  static constexpr size_t kKeptFailures = 100;
  // One file was extracted and stored (a full upsert or an attribute update).
  void Extracted(const std::string& share);
  void EndBatch(const std::string& share);
  void SetDeferred(const std::string& share, size_t deferred);
  void Remove(const std::string& share);

  // {"<share>": {"state", "detail", "done", "todo", "rate", "eta_seconds",
  //  "total_done", "total_failed", "total_extracted", "deferred",
  //  "last_commit_age_seconds", "failed_files": [{"path", "reason", "time"}]}}.
  Json::Value Snapshot() const;

 private:
  struct Share {
    std::string state = kStateIdle;
    std::string detail;
    uint64_t done = 0, todo = 0;
    uint64_t total_done = 0, total_extracted = 0;
    std::set<std::string> failed;
    size_t deferred = 0;
    Clock::time_point batch_start{};
    Clock::time_point last_commit{};
    bool committed = false;
    struct Failure {
      std::string path, reason;
      long long time = 0;  // seconds since 1970
    };
    std::deque<Failure> failures;  // oldest first
  };
  mutable std::mutex mutex_;
  std::map<std::string, Share> shares_;
};

}  // namespace fileindexd
}  // namespace corvlumex
