#include "programs/corvnotifyd/crash_backoff.h"

#include <algorithm>

namespace corvlumex {
namespace notifyd {

CrashBackoff::CrashBackoff(Clock::duration base, Clock::duration max) : base_(base), max_(max), interval_(base) {}

void CrashBackoff::OnLoss(Clock::time_point) {
  pending_ = true;
  ++losses_;
}

bool CrashBackoff::Due(Clock::time_point now) const { return pending_ && (!window_end_ || now >= *window_end_); }

std::optional<CrashBackoff::Clock::time_point> CrashBackoff::NextDue() const {
  if (!pending_) return std::nullopt;
  if (!window_end_) return Clock::time_point::min();
  return *window_end_;
}

void CrashBackoff::MarkerWritten(Clock::time_point now) {
  if (window_end_ && now - *window_end_ < interval_) {
    interval_ = std::min<Clock::duration>(interval_ * 2, max_);
  } else {
    interval_ = base_;
  }
  window_end_ = now + interval_;
  pending_ = false;
  losses_ = 0;
}

}  // namespace notifyd
}  // namespace corvlumex
