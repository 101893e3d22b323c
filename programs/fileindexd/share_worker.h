// One share's worker: a thread that waits for the share's queue, takes it
// over, applies its operations, commits the index and only then deletes the
// taken-over queue, so that a crash at any moment means the work is done
// again, never lost. It also runs the full reindex a share is marked for,
// and the extractions its settle tracker deferred.
#pragma once

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include "common/error.h"
#include "programs/fileindexd/pause_state.h"
#include "programs/fileindexd/progress.h"
#include "programs/fileindexd/queue_watch.h"
#include "programs/fileindexd/settle_tracker.h"
#include "programs/fileindexd/suggestion_schedule.h"

namespace corvlumex {
namespace fileindexd {

struct WorkerOptions {
  std::chrono::milliseconds fallback_poll{250};  // when the queue's folder cannot be watched
  std::chrono::milliseconds retry_first{1000};    // back-off after a failed batch, doubling
  std::chrono::milliseconds retry_max{60000};
  SettleOptions settle;
  unsigned walk_threads = 2;  // threads storing the files a folder walk finds
  std::chrono::milliseconds suggestion_interval{std::chrono::minutes(5)};  // see suggestion_schedule.h
};

class ShareWorker {
 public:
  ShareWorker(const std::string& share, WorkerOptions options, PauseState& pause, ProgressBoard& progress);
  // Stops and joins the thread.
  ~ShareWorker();

  void Start();
  void Wake() { watch_->Wake(); }
  // Asks the thread to stop after the file it is working on, and joins it.
  void Stop();
  // The thread ended by itself (a full volume).
  bool Finished() const { return finished_; }

 private:
  void Run();
  // One round: the pending full reindex, then the queue, then due deferred
  // files. True when there was work.
  bool RunOnce();
  void CheckInterrupt() const;
  void OnFailure(const Error& error, std::chrono::milliseconds& backoff);
  // A failure because the share's volume is full (the share is then marked
  // for a full reindex).
  bool IsVolumeFull(const Error& error) const;
  // Rebuilds the share's name suggestions; a failure is logged, not fatal.
  void RebuildSuggestions();

  std::string share_;
  WorkerOptions options_;
  PauseState& pause_;
  ProgressBoard& progress_;
  std::string queue_path_;
  std::unique_ptr<QueueWatch> watch_;
  std::unique_ptr<SettleTracker> settle_;
  SuggestionSchedule suggestions_;
  std::atomic<bool> stopping_{false};
  std::atomic<bool> finished_{false};
  std::thread thread_;
};

}  // namespace fileindexd
}  // namespace corvlumex
