// Whether indexing as a whole is paused, and until when: -1 running, 0
// paused until resumed, T paused until T (seconds since the epoch). Once the
// clock passes T indexing runs again without any command.
#pragma once

#include <mutex>

namespace corvlumex {
namespace fileindexd {

class PauseState {
 public:
  void Set(long long resume_time) {
    std::lock_guard<std::mutex> lock(mutex_);
    resume_time_ = resume_time;
  }
  long long Get() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return resume_time_;
  }
  // True while paused at `now`; `*until` gets the resume time (0: no end).
  bool IsPaused(long long now, long long* until = nullptr) const {
    std::lock_guard<std::mutex> lock(mutex_);
    if (until != nullptr) *until = resume_time_;
    return resume_time_ == 0 || resume_time_ > now;
  }

 private:
  mutable std::mutex mutex_;
  long long resume_time_ = -1;
};

}  // namespace fileindexd
}  // namespace corvlumex
