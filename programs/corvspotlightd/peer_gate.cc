#include "programs/corvspotlightd/peer_gate.h"

#include <algorithm>

#include "common/log.h"
#include "programs/corvspotlightd/socket_holders.h"

namespace corvlumex {
namespace spotlightd {
namespace {

// Remembered admissions; past this many the list starts again (a closed
// socket's cookie never comes back, so forgetting only costs a new check).
constexpr size_t kMaxRemembered = 4096;

}  // namespace

bool PeerGate::Allowed(const TcpConnection& connection) {
  const std::optional<PeerSocket> peer = FindPeerSocket(connection);
  if (!peer) {
    CORV_LOG("refused a search from %s:%d: its socket is unknown to the kernel", connection.remote_address.c_str(),
             connection.remote_port);
    return false;
  }
  if (allowed_users_.count(peer->owner) > 0) return true;
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (admitted_sockets_.count(peer->cookie) > 0) return true;
  }
  const std::vector<pid_t> holders = ProcessesHoldingSocket(peer->inode);
  const bool allowed = !holders.empty() && std::all_of(holders.begin(), holders.end(), [this](pid_t pid) {
    return ProcessMayActAs(pid, allowed_users_);
  });
  if (!allowed) {
    CORV_LOG("refused a search from %s:%d: user id %u", connection.remote_address.c_str(), connection.remote_port,
             static_cast<unsigned>(peer->owner));
    return false;
  }
  const std::lock_guard<std::mutex> lock(mutex_);
  if (admitted_sockets_.size() >= kMaxRemembered) admitted_sockets_.clear();
  admitted_sockets_.insert(peer->cookie);
  return true;
}

}  // namespace spotlightd
}  // namespace corvlumex
