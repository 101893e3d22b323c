// The notifier's event thread and what it owns: the configuration, the watch
// tree, the translation of events into lines, the queue writer and the crash
// markers. The inotify reader runs beside it on a thread of its own.
#pragma once

#include <chrono>
#include <cstddef>
#include <deque>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <unordered_map>

#include "programs/corvnotifyd/crash_backoff.h"
#include "programs/corvnotifyd/event_translator.h"
#include "programs/corvnotifyd/inotify_reader.h"
#include "programs/corvnotifyd/monitor_config.h"
#include "programs/corvnotifyd/queue_writer.h"
#include "programs/corvnotifyd/raw_event_queue.h"
#include "programs/corvnotifyd/watch_tree.h"

namespace corvlumex {
namespace notifyd {

struct NotifierOptions {
  std::string config_dir;
  // Back-off of crash markers per queue: first window, longest window.
  std::chrono::milliseconds backoff_base{std::chrono::seconds(10)};
  std::chrono::milliseconds backoff_max{std::chrono::hours(1)};
  // How often configured folders that do not exist are looked for.
  std::chrono::milliseconds missing_root_retry{std::chrono::seconds(10)};
  // Raw events held in memory before they count as lost.
  size_t max_raw_bytes = 512u << 20;
  // Lines of one unwritable queue held in memory before they are dropped.
  size_t max_pending_bytes = 64u << 20;
  // Test hooks (see InotifyReader and WatchTree).
  std::string pause_file;
  size_t watch_limit = 0;
};

class Notifier {
 public:
  explicit Notifier(NotifierOptions options);
  ~Notifier();

  // Loads the configuration, watches its folders and starts the reader.
  // Throws Error when inotify or the configuration folder is unusable.
  void Start();
  // Runs the event thread until Stop(); returns once every line is written.
  void Run();
  // Asks Run() to finish: the reader hands over what the kernel holds, the
  // event thread writes it out, then Run() returns. Safe from any thread.
  void Stop();

 private:
  using Clock = std::chrono::steady_clock;

  void WatchConfigDir();
  void ReloadConfig();
  void OnLoss(const std::string& queue, LossKind kind, const std::string& detail);
  void WriteStartMarkers();
  void WriteDueMarkers(Clock::time_point now, bool shutting_down);
  // The log line's advice for a loss, quoting the kernel limit in force.
  std::string Advice(LossKind kind) const;
  std::string MarkerPath(const std::string& queue) const;
  void TellAdministrators(LossKind kind);
  std::chrono::milliseconds NextWakeUp(Clock::time_point now) const;

  NotifierOptions options_;
  int inotify_fd_ = -1;
  long queued_events_in_force_ = -1;  // fs.inotify.max_queued_events of this instance
  long user_watches_at_loss_ = -1;    // fs.inotify.max_user_watches when a watch was refused
  RawEventQueue raw_;
  WatchTree tree_;
  QueueWriter writer_;
  EventTranslator translator_;
  std::unique_ptr<InotifyReader> reader_;
  MonitorConfig config_;
  bool config_dirty_ = false;
  bool config_watch_lost_ = false;
  std::unordered_map<std::string, CrashBackoff> backoff_;
  std::unordered_map<std::string, std::set<LossKind>> loss_kinds_;
  std::set<LossKind> told_;
  Clock::time_point next_root_retry_{};
  Clock::time_point pending_move_deadline_{};
};

}  // namespace notifyd
}  // namespace corvlumex
