// When a queue lost events (the kernel's queue overflowed, or no watch was
// left for a folder) the share must be reindexed whole: a crash marker line
// goes into its queue. Losses that keep coming must not turn into a storm of
// full reindexes, so each queue gets at most one marker per back-off window,
// and the window doubles while the losses go on. A loss inside a window is
// never forgotten: its marker is written when the window ends.
#pragma once

#include <chrono>
#include <optional>

namespace corvlumex {
namespace notifyd {

class CrashBackoff {
 public:
  using Clock = std::chrono::steady_clock;

  CrashBackoff(Clock::duration base, Clock::duration max);

  // Events of the queue were lost.
  void OnLoss(Clock::time_point now);
  // A marker is owed and its window allows it now.
  bool Due(Clock::time_point now) const;
  // A marker is owed (due now or later).
  bool Pending() const { return pending_; }
  // When the owed marker becomes due; empty when none is owed.
  std::optional<Clock::time_point> NextDue() const;
  // The owed marker was written: a new window opens, twice as long as the
  // last one when the losses continued into it, the base length after a
  // quiet spell at least as long as the last window.
  void MarkerWritten(Clock::time_point now);

  Clock::duration interval() const { return interval_; }
  // Losses seen since the last marker (for the log line).
  unsigned losses() const { return losses_; }

 private:
  const Clock::duration base_;
  const Clock::duration max_;
  Clock::duration interval_;
  std::optional<Clock::time_point> window_end_;
  bool pending_ = false;
  unsigned losses_ = 0;
};

}  // namespace notifyd
}  // namespace corvlumex
