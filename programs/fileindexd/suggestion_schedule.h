// When a share's search suggestions (the words of file names that
// "suggest" completes) are rebuilt: rebuilding reads the whole index, so
// while work goes on it happens at most once per interval, and once more
// when the worker runs out of work, so the last files of a round are in.
// Time is passed in, so the rule is tested without waiting.
#pragma once

#include <chrono>

namespace corvlumex {
namespace fileindexd {

class SuggestionSchedule {
 public:
  using Clock = std::chrono::steady_clock;
  explicit SuggestionSchedule(Clock::duration interval = std::chrono::minutes(5)) : interval_(interval) {}

  // Work was committed at `now`; true when the suggestions are due now.
  bool DueAfterWork(Clock::time_point now);
  // The worker has nothing more to do; true when work was committed since
  // the last rebuild.
  bool DueAtRest() const { return pending_; }
  // The suggestions were rebuilt (or the attempt failed and was logged) at `now`.
  void Rebuilt(Clock::time_point now);

 private:
  Clock::duration interval_;
  bool pending_ = false;
  bool ever_ = false;
  Clock::time_point last_{};
};

}  // namespace fileindexd
}  // namespace corvlumex
