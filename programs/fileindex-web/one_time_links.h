// One-time sign-in links for a sandbox, where the person who started the
// system has no password to type: a random token that signs one user in
// once, within a few minutes. Outside a sandbox the daemon never issues one.
#pragma once

#include <chrono>
#include <map>
#include <mutex>
#include <optional>
#include <string>

namespace corvlumex {
namespace web {

class OneTimeLinks {
 public:
  using Clock = std::chrono::steady_clock;
  static constexpr std::chrono::minutes kValidFor{15};

  std::string Issue(const std::string& user, Clock::time_point now);
  // The user of `token` when it is known and fresh; it is used up either way.
  std::optional<std::string> Redeem(const std::string& token, Clock::time_point now);

 private:
  struct Link {
    std::string user;
    Clock::time_point expires;
  };
  std::mutex mutex_;
  std::map<std::string, Link> links_;
};

}  // namespace web
}  // namespace corvlumex
