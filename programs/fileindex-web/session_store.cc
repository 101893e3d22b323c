#include "programs/fileindex-web/session_store.h"

#include <sys/random.h>

#include <cstdio>
#include <stdexcept>

namespace corvlumex {
namespace web {

std::string RandomToken() {
  unsigned char bytes[32];
  size_t filled = 0;
  while (filled < sizeof(bytes)) {
    const ssize_t got = getrandom(bytes + filled, sizeof(bytes) - filled, 0);
    if (got < 0) throw std::runtime_error("getrandom failed");
    filled += static_cast<size_t>(got);
  }
  std::string hex;
  char digits[3];
  for (unsigned char byte : bytes) {
    snprintf(digits, sizeof(digits), "%02x", byte);
    hex += digits;
  }
  return hex;
}

Session SessionStore::Create(const std::string& user, uid_t uid, bool admin, Clock::time_point now) {
  Session session;
  session.id = RandomToken();
  session.csrf_token = RandomToken();
  session.user = user;
  session.uid = uid;
  session.admin = admin;
  session.created = session.last_seen = now;
  std::lock_guard<std::mutex> lock(mutex_);
  DropExpired(now);
  sessions_[session.id] = session;
  return session;
}

std::optional<Session> SessionStore::Find(const std::string& id, Clock::time_point now) {
  std::lock_guard<std::mutex> lock(mutex_);
  const auto found = sessions_.find(id);
  if (found == sessions_.end()) return std::nullopt;
  Session& session = found->second;
  if (now - session.last_seen > idle_ || now - session.created > lifetime_) {
    sessions_.erase(found);
    return std::nullopt;
  }
  session.last_seen = now;
  return session;
}

void SessionStore::End(const std::string& id) {
  std::lock_guard<std::mutex> lock(mutex_);
  sessions_.erase(id);
}

size_t SessionStore::Count() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return sessions_.size();
}

void SessionStore::DropExpired(Clock::time_point now) {
  for (auto it = sessions_.begin(); it != sessions_.end();) {
    const bool expired = now - it->second.last_seen > idle_ || now - it->second.created > lifetime_;
    it = expired ? sessions_.erase(it) : std::next(it);
  }
}

}  // namespace web
}  // namespace corvlumex
