// Signed-in sessions, held in memory only (a restart signs everyone out).
// A session is found by its random id (the cookie); it ends after
// `idle` without a request, after `lifetime` in any case, or on sign-out.
// Each carries its own CSRF token, which every changing request must repeat
// in a header: a page of another site can make the browser send the cookie,
// but cannot read the token. Time is passed in so tests need not wait.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <map>
#include <mutex>
#include <optional>
#include <string>

namespace corvlumex {
namespace web {

struct Session {
  std::string id;
  std::string csrf_token;
  std::string user;
  uid_t uid = 0;
  bool admin = false;
  std::chrono::steady_clock::time_point created, last_seen;
};

// 32 bytes from the kernel's random source, as 64 hex digits.
std::string RandomToken();

class SessionStore {
 public:
  using Clock = std::chrono::steady_clock;
  SessionStore(Clock::duration idle, Clock::duration lifetime) : idle_(idle), lifetime_(lifetime) {}

  Session Create(const std::string& user, uid_t uid, bool admin, Clock::time_point now);
  // The live session of `id` (its last use moved to `now`); nothing for an
  // unknown, expired or ended one.
  std::optional<Session> Find(const std::string& id, Clock::time_point now);
  void End(const std::string& id);
  size_t Count() const;

 private:
  void DropExpired(Clock::time_point now);

  const Clock::duration idle_, lifetime_;
  mutable std::mutex mutex_;
  std::map<std::string, Session> sessions_;
};

}  // namespace web
}  // namespace corvlumex
