// Slows password guessing down: after a few failed sign-ins for one account
// name, or from one client address, the next attempt must wait, twice as
// long after each further failure (up to a ceiling). A success clears the
// account's count. The wait is enforced by refusing early attempts (429 with
// the seconds left), not by holding a server thread asleep. Time passed in.
#pragma once

#include <chrono>
#include <map>
#include <mutex>
#include <string>

namespace corvlumex {
namespace web {

class SignInThrottle {
 public:
  using Clock = std::chrono::steady_clock;
  static constexpr int kFreeFailures = 3;
  static constexpr std::chrono::seconds kFirstWait{4};
  static constexpr std::chrono::seconds kLongestWait{300};

  // Seconds to wait before `user` may try again from `address` (0: now).
  long long WaitSeconds(const std::string& user, const std::string& address, Clock::time_point now) const;
  void Failed(const std::string& user, const std::string& address, Clock::time_point now);
  void Succeeded(const std::string& user);

 private:
  struct Record {
    int failures = 0;
    Clock::time_point next_allowed{};
  };
  static constexpr size_t kPruneAbove = 10000;
  static void Count(Record& record, Clock::time_point now, int free_failures);
  static void Prune(std::map<std::string, Record>& records, Clock::time_point now);
  static long long Left(const Record& record, Clock::time_point now);

  mutable std::mutex mutex_;
  std::map<std::string, Record> by_user_, by_address_;
};

}  // namespace web
}  // namespace corvlumex
