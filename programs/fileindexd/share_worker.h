// One share's worker: a thread that waits for the share's queue, takes it
// over, applies its operations, commits the index and only then deletes the
// taken-over queue, so that a crash at any moment means the work is done
// again, never lost. It also runs the full reindex a share is marked for,
// and the extractions its settle tracker deferred.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "fileindex/queue/optree.h"
#include "programs/fileindexd/fresh_lane.h"
#include "programs/fileindexd/op_applier.h"
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
  // While the search daemon refuses connections (stopped, restarting), it is
  // asked this often whether it is back, whatever the back-off says.
  std::chrono::milliseconds reconnect_probe{250};
  // A batch is committed, and how far it got saved, after this much work.
  std::chrono::milliseconds slice{1000};
  FreshLaneOptions fresh;
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
  // Waits out `backoff`, or less when the search daemon, which was not
  // reachable, accepts connections again.
  void WaitToRetry(const Error& error, std::chrono::milliseconds backoff);
  // Commits; Error 913 when the search daemon that took the commit is not the
  // one that answered at `daemon` (a restart lost the writes in between).
  void CommitSince(pid_t daemon);
  // Waits while the search daemon is down or still opening the share's index
  // (after its restart), so that no request of a round meets its busy answer.
  void WaitUntilIndexReady();
  // Makes a round's applier stop at a pause and walk with the configured threads.
  void PrepareApplier(OpApplier& applier);
  // Applies the taken-over queue's operations from `first` on, committing
  // and saving how far it got after each slice of work.
  void ApplyInSlices(OpApplier& applier, const std::vector<std::shared_ptr<fileindex::OP>>& ops, size_t first,
                     const class BatchMark& mark);
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
  // A taken-over queue was left by an earlier run (a crash or a stop in the
  // middle of it): once it is applied, the share is checked against the disk.
  bool recovering_ = false;
  std::thread thread_;
};

}  // namespace fileindexd
}  // namespace corvlumex
