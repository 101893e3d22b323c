// Who is at the other end of a loopback TCP connection. TCP carries no
// credentials, so the kernel is asked (sock_diag, NETLINK_SOCK_DIAG) for the
// owner of the socket at the other end: the one whose own address and port
// are the connection's remote ones and whose peer is our end. Both ends live
// in this network namespace, which is all a loopback connection can reach.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>

namespace corvlumex {
namespace spotlightd {

struct TcpConnection {
  std::string local_address;  // ours, dotted IPv4 or IPv6 text
  int local_port = 0;
  std::string remote_address;  // the peer's
  int remote_port = 0;
};

struct PeerSocket {
  uid_t owner = 0;      // the user the socket was made as
  uint64_t inode = 0;   // its inode, to find the processes holding it
  uint64_t cookie = 0;  // the kernel's id of the socket, never reused while the system runs
};

// The peer's socket; nothing when the kernel knows no such socket (the peer
// is gone, or it is not on this machine) or cannot be asked.
std::optional<PeerSocket> FindPeerSocket(const TcpConnection& connection);

}  // namespace spotlightd
}  // namespace corvlumex
