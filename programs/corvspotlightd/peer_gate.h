// Who may search: a connection is let in when the peer's socket belongs to
// one of the allowed users (root, the service user), or when every process
// holding it may act as one of them (Samba's Spotlight server, which opens
// its connection as the SMB user but keeps root to return to; see
// socket_holders.h). Anyone else is refused: the searches are unfiltered.
//
// The second check reads /proc, so its "yes" is remembered for the socket
// (by the kernel's socket cookie, which is never reused): the keep-alive
// requests of one connection pay for it once.
#pragma once

#include <sys/types.h>

#include <mutex>
#include <set>
#include <string>
#include <unordered_set>

#include "programs/corvspotlightd/peer_check.h"

namespace corvlumex {
namespace spotlightd {

class PeerGate {
 public:
  explicit PeerGate(std::set<uid_t> allowed_users) : allowed_users_(std::move(allowed_users)) {}

  // True when the peer may search; a refusal is logged with the reason.
  bool Allowed(const TcpConnection& connection);

 private:
  std::set<uid_t> allowed_users_;
  std::mutex mutex_;
  std::unordered_set<uint64_t> admitted_sockets_;
};

}  // namespace spotlightd
}  // namespace corvlumex
