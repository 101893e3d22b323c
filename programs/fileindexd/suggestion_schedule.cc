#include "programs/fileindexd/suggestion_schedule.h"

namespace corvlumex {
namespace fileindexd {

bool SuggestionSchedule::DueAfterWork(Clock::time_point now) {
  pending_ = true;
  // The first work of a fresh worker waits one interval too: a round that
  // ends sooner is served at rest, once.
  if (!ever_) {
    ever_ = true;
    last_ = now;
    return false;
  }
  return now - last_ >= interval_;
}

void SuggestionSchedule::Rebuilt(Clock::time_point now) {
  pending_ = false;
  ever_ = true;
  last_ = now;
}

}  // namespace fileindexd
}  // namespace corvlumex
