#include "programs/corvnotifyd/notifier.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/file_util.h"
#include "common/log.h"
#include "fileindex/paths/path_rules.h"
#include "platform/linux/config_files.h"
#include "programs/corvnotifyd/admin_notice.h"
#include "programs/corvnotifyd/event_line.h"
#include "programs/corvnotifyd/loss_advice.h"

namespace corvlumex {
namespace notifyd {
namespace {

// How long the first half of a rename waits for its second half.
constexpr std::chrono::milliseconds kRenamePairWait(10);
// Longest idle wait of the event thread.
constexpr std::chrono::milliseconds kIdleWait(10000);

constexpr uint32_t kConfigDirEvents =
    IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;

int OpenInotify() {
  const int fd = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
  CORV_CHECK_THROW(fd < 0, kErrorSystem,
                   std::string("inotify_init1 failed: ") + strerror(errno) +
                       " (at the fs.inotify.max_user_instances limit?)");
  return fd;
}

}  // namespace

Notifier::Notifier(NotifierOptions options)
    : options_(std::move(options)),
      inotify_fd_(OpenInotify()),
      // Fixed for this instance when it was made: the length that overflows.
      queued_events_in_force_(ReadInotifyLimit("max_queued_events")),
      raw_(options_.max_raw_bytes),
      tree_(inotify_fd_),
      writer_(options_.max_pending_bytes,
              [this](const std::string& queue) { OnLoss(queue, LossKind::kQueueUnwritable, std::string()); }),
      translator_(&tree_, EventTranslator::Callbacks{
                              [this](const std::string& queue) -> std::string& { return writer_.Buffer(queue); },
                              [this](const std::string& queue, LossKind kind, const std::string& detail) {
                                OnLoss(queue, kind, detail);
                              },
                              [this](bool watch_lost) {
                                config_dirty_ = true;
                                config_watch_lost_ = config_watch_lost_ || watch_lost;
                              }}) {
  tree_.set_watch_limit(options_.watch_limit);
}

Notifier::~Notifier() {
  reader_.reset();
  close(inotify_fd_);
}

void Notifier::WatchConfigDir() {
  CORV_CHECK_THROW(!platform::MakeDirs(options_.config_dir), kErrorSystem,
                   "cannot create the configuration folder " + options_.config_dir);
  const int wd = inotify_add_watch(inotify_fd_, options_.config_dir.c_str(), kConfigDirEvents);
  CORV_CHECK_THROW(wd < 0, kErrorSystem,
                   "cannot watch the configuration folder " + options_.config_dir + ": " + strerror(errno));
  translator_.set_config_wd(wd);
}

void Notifier::Start() {
  WatchConfigDir();
  config_dirty_ = true;
  ReloadConfig();
  // Every folder is watched now: the kernel queues each change from here on.
  WriteStartMarkers();
  reader_ = std::make_unique<InotifyReader>(inotify_fd_, &raw_, options_.pause_file);
  reader_->Start();
}

void Notifier::WriteStartMarkers() {
  // Nobody saw the changes made while no notifier ran (stopped, killed,
  // crashed, not yet started): each watched share is checked against the
  // disk. The marker is written after the watches are set, so the check
  // (which reads the disk after it reads the marker) sees every change made
  // before them, and the lines cover every change made after them.
  std::set<std::string> queues;
  for (const WatchRoot& root : tree_.roots()) queues.insert(root.queue);
  for (const std::string& queue : queues) {
    FormatQueueLine(writer_.Buffer(queue), kEventQueueCrash, true, MarkerPath(queue));
  }
  writer_.Flush(Clock::now(), true);
  if (queues.empty()) return;
  CORV_LOG("started: changes made while no notifier ran were not seen, so each watched share is checked against the "
           "disk (a crash marker in the queue of %zu share%s)",
           queues.size(), queues.size() == 1 ? "" : "s");
}

void Notifier::Stop() {
  if (reader_) reader_->Stop();
}

void Notifier::ReloadConfig() {
  config_dirty_ = false;
  if (config_watch_lost_) {
    config_watch_lost_ = false;
    try {
      WatchConfigDir();
    } catch (const Error& e) {
      CORV_LOG("configuration folder %s is gone and cannot be watched again: %s", options_.config_dir.c_str(),
               e.reason.c_str());
    }
  }
  MonitorConfig loaded = LoadMonitorConfig(options_.config_dir, config_);
  if (loaded == config_ && !tree_.roots().empty()) return;
  config_ = std::move(loaded);
  std::vector<WatchRoot> roots;
  for (const auto& [file, queue] : config_) {
    for (const WatchRootConfig& root : queue.roots) {
      roots.push_back(WatchRoot{root.path, queue.queue, root.mask, root.ignore});
    }
  }
  CORV_LOG("monitor configuration: %zu queues, %zu folders", config_.size(), roots.size());
  translator_.ApplyRoots(std::move(roots));
}

void Notifier::OnLoss(const std::string& queue, LossKind kind, const std::string& detail) {
  CrashBackoff& backoff = backoff_.try_emplace(queue, options_.backoff_base, options_.backoff_max).first->second;
  const Clock::time_point now = Clock::now();
  const bool was_pending = backoff.Pending();
  backoff.OnLoss(now);
  loss_kinds_[queue].insert(kind);
  // The watch limit applies to each new watch: the one in force is the one
  // that refused this watch.
  if (kind == LossKind::kNoWatches) user_watches_at_loss_ = ReadInotifyLimit("max_user_watches");
  if (!was_pending && !backoff.Due(now)) {
    CORV_LOG("events of queue %s lost again inside its back-off window: its next crash marker is written in %lld s",
             queue.c_str(),
             static_cast<long long>(std::chrono::duration_cast<std::chrono::seconds>(*backoff.NextDue() - now).count()));
  }
  if (!detail.empty()) CORV_LOG("no inotify watch left for %s (queue %s)", detail.c_str(), queue.c_str());
  TellAdministrators(kind);
}

void Notifier::TellAdministrators(LossKind kind) {
  if (kind == LossKind::kQueueUnwritable || !told_.insert(kind).second) return;
  const char* notice = kind == LossKind::kKernelOverflow ? kNoticeInotifyOverflow : kNoticeInotifyWatchLimit;
  CORV_LOG("telling the administrators: %s (%s)", notice, Advice(kind).c_str());
  SendAdminNotice(notice);
}

std::string Notifier::Advice(LossKind kind) const {
  switch (kind) {
    case LossKind::kKernelOverflow:
      return LossAdvice(kind, queued_events_in_force_, ReadInotifyLimit("max_queued_events"));
    case LossKind::kNoWatches:
      return LossAdvice(kind, user_watches_at_loss_, ReadInotifyLimit("max_user_watches"));
    case LossKind::kQueueUnwritable:
      break;
  }
  return LossAdvice(kind, -1, -1);
}

std::string Notifier::MarkerPath(const std::string& queue) const {
  for (const WatchRoot& root : tree_.roots()) {
    if (root.queue != queue) continue;
    try {
      std::string share_name;
      std::string share_path;
      fileindex::GetShareNamePathByFullPath(share_name, share_path, root.path);
      return share_path;
    } catch (const Error&) {
      return root.path;  // not in a known share: its first folder stands for it
    }
  }
  return Dirname(Dirname(queue));
}

void Notifier::WriteDueMarkers(Clock::time_point now, bool shutting_down) {
  for (auto& [queue, backoff] : backoff_) {
    if (!(backoff.Due(now) || (shutting_down && backoff.Pending()))) continue;
    // After a loss, folders made meanwhile may be unwatched: watch them
    // before the marker, so the reindex it asks for misses nothing later.
    const bool complete = shutting_down || translator_.Rewatch(queue);
    const unsigned losses = backoff.losses();
    std::string reasons;
    for (LossKind kind : loss_kinds_[queue]) reasons += "; " + Advice(kind);
    loss_kinds_.erase(queue);
    FormatQueueLine(writer_.Buffer(queue), kEventQueueCrash, true, MarkerPath(queue));
    backoff.MarkerWritten(now);
    CORV_LOG("events of queue %s were lost (%u time%s): crash marker written, the share is reindexed whole; "
             "next marker no sooner than in %lld s%s",
             queue.c_str(), losses, losses == 1 ? "" : "s",
             static_cast<long long>(std::chrono::duration_cast<std::chrono::seconds>(backoff.interval()).count()),
             reasons.c_str());
    if (!complete) {
      backoff.OnLoss(now);
      loss_kinds_[queue].insert(LossKind::kNoWatches);
    }
  }
}

std::chrono::milliseconds Notifier::NextWakeUp(Clock::time_point now) const {
  Clock::time_point next = now + kIdleWait;
  if (translator_.HasPendingMove()) next = std::min(next, pending_move_deadline_);
  for (const auto& [queue, backoff] : backoff_) {
    if (const auto due = backoff.NextDue()) next = std::min(next, *due);
  }
  next = std::min(next, writer_.NextRetry());
  if (translator_.AnyRootMissing()) next = std::min(next, next_root_retry_);
  if (next <= now) return std::chrono::milliseconds(0);
  return std::chrono::duration_cast<std::chrono::milliseconds>(next - now) + std::chrono::milliseconds(1);
}

void Notifier::Run() {
  std::deque<std::string> chunks;
  for (;;) {
    const bool open = raw_.Take(&chunks, NextWakeUp(Clock::now()));
    for (const std::string& chunk : chunks) translator_.ProcessChunk(chunk);
    Clock::time_point now = Clock::now();
    // Only the very last record can be a rename half still waiting.
    if (!chunks.empty() && translator_.HasPendingMove()) pending_move_deadline_ = now + kRenamePairWait;
    if (chunks.empty() && translator_.HasPendingMove() && now >= pending_move_deadline_) {
      translator_.ResolvePendingMove();
    }
    chunks.clear();
    if (!open) break;
    if (config_dirty_) ReloadConfig();
    const bool retry_roots = translator_.AnyRootMissing() && now >= next_root_retry_;
    translator_.CheckRoots(retry_roots);
    if (retry_roots) next_root_retry_ = now + options_.missing_root_retry;
    WriteDueMarkers(now, false);
    writer_.Flush(now, false);
  }
  // Stopping: every event read so far is written, and every owed marker.
  translator_.ResolvePendingMove();
  translator_.CheckRoots(false);
  const Clock::time_point now = Clock::now();
  WriteDueMarkers(now, true);
  writer_.Flush(now, true);
  if (writer_.HasPending()) CORV_LOG("stopping with lines that could not be written (see above)");
}

}  // namespace notifyd
}  // namespace corvlumex
