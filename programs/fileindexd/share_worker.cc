#include "programs/fileindexd/share_worker.h"

#include <time.h>

#include <algorithm>

#include "common/error.h"
#include "common/file_util.h"
#include "common/log.h"
#include "common/sys.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/daemon_codes.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/queue/custom_event.h"
#include "fileindex/queue/optree.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "programs/fileindexd/batch_mark.h"
#include "programs/fileindexd/fresh_lane.h"
#include "programs/fileindexd/index_rules.h"
#include "programs/fileindexd/op_applier.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindexd {
namespace {

// Saved beside the queue: the files whose extraction waits out their settle interval.
constexpr char kSettleSuffix[] = ".settle";

long long Now() { return static_cast<long long>(time(nullptr)); }

}  // namespace

ShareWorker::ShareWorker(const std::string& share, WorkerOptions options, PauseState& pause, ProgressBoard& progress)
    : share_(share), options_(options), pause_(pause), progress_(progress),
      suggestions_(options.suggestion_interval) {
  // An unknown share throws here (Error 800): no worker for it.
  queue_path_ = sdk::SDKShare(share).GetQueuePath();
  watch_ = std::make_unique<QueueWatch>(queue_path_, options_.fallback_poll);
  settle_ = std::make_unique<SettleTracker>(queue_path_ + kSettleSuffix, options_.settle);
}

ShareWorker::~ShareWorker() { Stop(); }

void ShareWorker::Start() {
  progress_.SetState(share_, kStateIdle);
  thread_ = std::thread([this] { Run(); });
}

void ShareWorker::Stop() {
  stopping_ = true;
  watch_->Wake();
  if (thread_.joinable()) thread_.join();
}

void ShareWorker::CheckInterrupt() const {
  if (stopping_ || pause_.IsPaused(Now())) throw BatchInterrupted{};
}

void ShareWorker::Run() {
  settle_->Load();
  recovering_ = IsFileExist(queue_path_ + ".tmp");
  std::chrono::milliseconds backoff{0};
  while (!stopping_) {
    watch_->Arm();
    long long until = -1;
    if (pause_.IsPaused(Now(), &until)) {
      progress_.SetState(share_, kStatePaused, until == 0 ? "" : "until " + std::to_string(until));
      const long long left = until == 0 ? 3600 : std::max(1LL, until - Now());
      watch_->Wait(std::chrono::seconds(std::min(left, 3600LL)));
      continue;
    }
    bool worked = false;
    try {
      worked = RunOnce();
      backoff = std::chrono::milliseconds(0);
    } catch (const BatchInterrupted&) {
      // Paused or stopped between two files: make what was done visible.
      // The taken-over queue stays and is applied again, whole, later.
      try {
        fileindex::elastic::IndexCommit(share_);
      } catch (const Error& error) {
        CORV_LOG("commit of share %s before pausing failed: %s", share_.c_str(), error.reason.c_str());
      }
      continue;
    } catch (const Error& error) {
      if (IsVolumeFull(error)) {
        // The index cannot be written: stop here, tell the administrators,
        // and leave the share marked for a full reindex, which the next
        // worker of this share runs once there is room again.
        CORV_LOG("indexing of share %s stopped: %s", share_.c_str(), error.reason.c_str());
        progress_.SetState(share_, kStateNoSpace, error.reason);
        fileindex::SendVXMNotify();
        finished_ = true;
        return;
      }
      OnFailure(error, backoff);
      continue;
    } catch (const std::exception& error) {
      OnFailure(Error(kErrorUnexpected, error.what()), backoff);
      continue;
    }
    if (worked) {
      if (suggestions_.DueAfterWork(SuggestionSchedule::Clock::now())) RebuildSuggestions();
      continue;
    }
    if (suggestions_.DueAtRest()) RebuildSuggestions();
    progress_.SetState(share_, kStateIdle);
    progress_.SetDeferred(share_, settle_->DeferredCount());
    const auto now = SettleTracker::Clock::now();
    const auto next_due = settle_->NextDue();
    // Woken by the queue's inotify watch; the timeout is only a safety net.
    std::chrono::milliseconds timeout = std::chrono::seconds(30);
    if (next_due != SettleTracker::Clock::time_point::max()) {
      timeout = std::min(timeout, std::max(std::chrono::milliseconds(1),
                                           std::chrono::duration_cast<std::chrono::milliseconds>(next_due - now)));
    }
    watch_->Wait(timeout);
  }
  progress_.SetState(share_, kStateStopped);
}

void ShareWorker::RebuildSuggestions() {
  try {
    fileindex::elastic::UpdateTermSuggestion(sdk::SDKShare(share_).GetDBName(),
                                             {kFieldSearchFileName});
  } catch (const Error& error) {
    // Suggestions are a convenience: the next round tries again.
    CORV_LOG("suggestions of share %s not rebuilt: code=%d, reason=%s", share_.c_str(), error.code,
             error.reason.c_str());
  }
  suggestions_.Rebuilt(SuggestionSchedule::Clock::now());
}

bool ShareWorker::IsVolumeFull(const Error& error) const {
  if (error.code == kErrorNoSpace) return true;  // IndexCommit marked the share already
  if (static_cast<int>(error.code) != elasticd::kCodeNoSpace) return false;
  try {
    if (sdk::SDKShare(share_).IsSpaceEnough()) return false;  // another volume's trouble: retry
    fileindex::StatusMgr().SetShareStatus(share_, fileindex::kShareStatusNeedReindex);
  } catch (const Error& again) {
    CORV_LOG("cannot mark share %s for a reindex: %s", share_.c_str(), again.reason.c_str());
  }
  return true;
}

void ShareWorker::OnFailure(const Error& error, std::chrono::milliseconds& backoff) {
  CORV_LOG("indexing of share %s failed, retrying: code=%d, reason=%s", share_.c_str(), error.code,
           error.reason.c_str());
  if (error.code == elasticd::kCodeIndexNotFound) {
    // The search daemon lost the share's index: make it again and rebuild it
    // whole, unless the share stopped being indexed meanwhile.
    try {
      if (fileindex::FolderMgr().IsShareIndexed(share_)) {
        fileindex::elastic::ShareIndexCreate(share_);
        fileindex::StatusMgr().SetShareStatus(share_, fileindex::kShareStatusNeedReindex);
      }
    } catch (const Error& again) {
      CORV_LOG("cannot recreate the index of share %s: %s", share_.c_str(), again.reason.c_str());
    }
  }
  backoff = std::min(options_.retry_max, std::max(options_.retry_first, backoff * 2));
  progress_.SetState(share_, kStateRetrying, "code " + std::to_string(error.code) + ": " + error.reason);
  WaitToRetry(error, backoff);
}

void ShareWorker::WaitToRetry(const Error& error, std::chrono::milliseconds backoff) {
  if (error.code != kErrorSearchRequest || fileindex::elastic::IsIndexReady(share_)) {
    watch_->Wait(backoff);
    return;
  }
  // The daemon is down or starting: asking costs nothing, so it is followed
  // closely and the batch goes on as soon as it can take it.
  const auto end = std::chrono::steady_clock::now() + backoff;
  while (!stopping_ && std::chrono::steady_clock::now() < end) {
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - std::chrono::steady_clock::now());
    SleepFor(std::min(options_.reconnect_probe, left));
    if (fileindex::elastic::IsIndexReady(share_)) return;
  }
}

void ShareWorker::WaitUntilIndexReady() {
  if (fileindex::elastic::IsIndexReady(share_)) return;
  CORV_LOG("share %s waits for the search daemon to take its index", share_.c_str());
  progress_.SetState(share_, kStateRetrying, "waiting for the search daemon");
  do {
    CheckInterrupt();
    SleepFor(options_.reconnect_probe);
  } while (!fileindex::elastic::IsIndexReady(share_));
}

bool ShareWorker::RunOnce() {
  const fileindex::FolderMgr folders;
  const unsigned int status = fileindex::StatusMgr().GetShareStatus(share_);
  if (!folders.IsShareIndexed(share_) || (status & fileindex::kShareStatusPauseMask) != 0) {
    return false;  // the daemon stops this worker when told; nothing to do meanwhile
  }
  WaitUntilIndexReady();
  bool worked = false;

  if (status & fileindex::kShareStatusNeedReindex) {
    const IndexRules rules(folders, sdk::SDKShare(share_).GetPath());
    OpApplier applier(share_, rules, progress_, *settle_);
    PrepareApplier(applier);
    progress_.StartBatch(share_, 1);
    const pid_t daemon = LastSearchDaemonPid();
    applier.FullReindex();
    progress_.Done(share_);
    CommitSince(daemon);
    fileindex::StatusMgr().UnsetShareStatus(share_, fileindex::kShareStatusNeedReindex);
    progress_.EndBatch(share_);
    worked = true;
  }

  fileindex::QueueMgr queue(queue_path_);
  std::vector<std::shared_ptr<fileindex::OP>> ops;
  queue.ProcessOP([&ops](std::shared_ptr<fileindex::OP> op) { ops.push_back(std::move(op)); }, true);
  const bool taken_over = IsFileExist(queue.GetQueuePathTmp());
  const auto now = SettleTracker::Clock::now();
  std::vector<std::string> due = settle_->DueNow(now);
  if (!taken_over && due.empty()) return worked;

  // The batch is judged by the folder settings read after the queue was
  // taken over: a settings change saves the folder file before it queues its
  // event, so an event in this batch never meets the settings it replaced
  // (the ones read at the top of this round may be older than the batch).
  const fileindex::FolderMgr batch_folders;
  const IndexRules batch_rules(batch_folders, sdk::SDKShare(share_).GetPath());
  OpApplier batch_applier(share_, batch_rules, progress_, *settle_);
  PrepareApplier(batch_applier);

  const BatchMark mark(queue.GetQueuePathTmp());
  const size_t first = taken_over ? std::min(mark.Load(), ops.size()) : 0;
  progress_.StartBatch(share_, ops.size() + due.size());
  if (first > 0) progress_.Done(share_, first);
  {
    // Fresh files of the live queue go ahead of the batch, on a lane of
    // their own (with its own reading of the folders: the rules are not
    // shared between threads).
    const fileindex::FolderMgr lane_folders;
    const IndexRules lane_rules(lane_folders, sdk::SDKShare(share_).GetPath());
    OpApplier lane_applier(share_, lane_rules, progress_, *settle_);
    FreshLane lane(share_, queue_path_, lane_applier, options_.fresh);
    lane.Start();
    ApplyInSlices(batch_applier, ops, first, mark);
  }
  const pid_t daemon = LastSearchDaemonPid();
  for (const std::string& path : due) {
    batch_applier.UpsertSettled(path);
    progress_.Done(share_);
  }
  CommitSince(daemon);
  settle_->Confirm(due, SettleTracker::Clock::now());
  // The deferred files must be on disk before the queue that named them goes.
  CORV_CHECK_THROW(!settle_->Save(), kErrorSaveJson, "Failed to save json: " + queue_path_ + kSettleSuffix);
  if (taken_over && recovering_) {
    // The previous run died in the middle of this batch: what it sent last
    // may have been half done (a rename of a large folder, finished by the
    // search daemon after the indexer was gone), so the whole share is
    // checked against the disk next; unchanged files are not extracted again.
    CORV_LOG("share %s: a batch was left unfinished by the last run; the share is checked against the disk",
             share_.c_str());
    fileindex::StatusMgr().SetShareStatus(share_, fileindex::kShareStatusNeedReindex);
  }
  recovering_ = false;
  if (taken_over) {
    mark.Clear();
    queue.DeleteTmp();
  }
  progress_.EndBatch(share_);
  progress_.SetDeferred(share_, settle_->DeferredCount());
  return true;
}

void ShareWorker::PrepareApplier(OpApplier& applier) {
  applier.SetInterruptCheck([this] { CheckInterrupt(); });
  applier.SetWalkThreads(options_.walk_threads);
}

void ShareWorker::ApplyInSlices(OpApplier& applier, const std::vector<std::shared_ptr<fileindex::OP>>& ops,
                                size_t first, const BatchMark& mark) {
  auto slice_end = std::chrono::steady_clock::now() + options_.slice;
  pid_t daemon = LastSearchDaemonPid();
  for (size_t i = first; i < ops.size(); ++i) {
    CheckInterrupt();
    applier.Apply(*ops[i]);
    if (i + 1 < ops.size() && std::chrono::steady_clock::now() < slice_end) continue;
    CommitSince(daemon);
    // What the deferred list gained in this slice must survive its skipping.
    if (settle_->Save()) mark.Save(i + 1);
    slice_end = std::chrono::steady_clock::now() + options_.slice;
    daemon = LastSearchDaemonPid();
  }
}

void ShareWorker::CommitSince(pid_t daemon) {
  fileindex::elastic::IndexCommit(share_);
  // A daemon restarted between two requests answers the next one as if
  // nothing happened, but the writes before were not committed and are gone.
  CORV_CHECK_THROW(LastSearchDaemonPid() != daemon, kErrorSearchRequest,
                   "corvelasticd restarted during the batch; it goes on from its last committed slice");
}

}  // namespace fileindexd
}  // namespace corvlumex
