#include "programs/fileindex-web/sign_in_throttle.h"

#include <algorithm>

namespace corvlumex {
namespace web {

void SignInThrottle::Count(Record& record, Clock::time_point now, int free_failures) {
  ++record.failures;
  if (record.failures < free_failures) return;
  const int doublings = std::min(record.failures - free_failures, 16);
  const auto wait = std::min<Clock::duration>(kFirstWait * (1LL << doublings), kLongestWait);
  record.next_allowed = now + wait;
}

long long SignInThrottle::Left(const Record& record, Clock::time_point now) {
  if (record.next_allowed <= now) return 0;
  return std::chrono::ceil<std::chrono::seconds>(record.next_allowed - now).count();
}

long long SignInThrottle::WaitSeconds(const std::string& user, const std::string& address, Clock::time_point now) const {
  std::lock_guard<std::mutex> lock(mutex_);
  long long wait = 0;
  if (const auto found = by_user_.find(user); found != by_user_.end()) wait = Left(found->second, now);
  if (const auto found = by_address_.find(address); found != by_address_.end()) wait = std::max(wait, Left(found->second, now));
  return wait;
}

// Names and addresses that no longer have to wait are forgotten once the
// tables grow, so guessing many names cannot fill the daemon's memory.
void SignInThrottle::Prune(std::map<std::string, Record>& records, Clock::time_point now) {
  if (records.size() < kPruneAbove) return;
  for (auto it = records.begin(); it != records.end();) it = it->second.next_allowed <= now ? records.erase(it) : std::next(it);
}

void SignInThrottle::Failed(const std::string& user, const std::string& address, Clock::time_point now) {
  std::lock_guard<std::mutex> lock(mutex_);
  Prune(by_user_, now);
  Prune(by_address_, now);
  Count(by_user_[user], now, kFreeFailures);
  // An address is allowed more failures: several people may sit behind one.
  Count(by_address_[address], now, kFreeFailures * 3);
}

void SignInThrottle::Succeeded(const std::string& user) {
  std::lock_guard<std::mutex> lock(mutex_);
  by_user_.erase(user);
}

}  // namespace web
}  // namespace corvlumex
