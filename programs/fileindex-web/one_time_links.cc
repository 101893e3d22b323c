#include "programs/fileindex-web/one_time_links.h"

#include "programs/fileindex-web/session_store.h"

namespace corvlumex {
namespace web {

std::string OneTimeLinks::Issue(const std::string& user, Clock::time_point now) {
  const std::string token = RandomToken();
  std::lock_guard<std::mutex> lock(mutex_);
  links_[token] = Link{user, now + kValidFor};
  return token;
}

std::optional<std::string> OneTimeLinks::Redeem(const std::string& token, Clock::time_point now) {
  std::lock_guard<std::mutex> lock(mutex_);
  const auto found = links_.find(token);
  if (found == links_.end()) return std::nullopt;
  const Link link = found->second;
  links_.erase(found);
  if (now > link.expires) return std::nullopt;
  return link.user;
}

}  // namespace web
}  // namespace corvlumex
