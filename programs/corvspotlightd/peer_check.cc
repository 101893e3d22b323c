#include "programs/corvspotlightd/peer_check.h"

#include <arpa/inet.h>
#include <linux/inet_diag.h>
#include <linux/netlink.h>
#include <linux/sock_diag.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace corvlumex {
namespace spotlightd {
namespace {

// Fills a socket id's address from text; the family of the text decides.
bool SetAddress(const std::string& text, int family, __be32* words) {
  return inet_pton(family, text.c_str(), words) == 1;
}

class NetlinkSocket {
 public:
  NetlinkSocket() : fd_(socket(AF_NETLINK, SOCK_DGRAM | SOCK_CLOEXEC, NETLINK_SOCK_DIAG)) {}
  ~NetlinkSocket() {
    if (fd_ >= 0) close(fd_);
  }
  NetlinkSocket(const NetlinkSocket&) = delete;
  NetlinkSocket& operator=(const NetlinkSocket&) = delete;
  int fd() const { return fd_; }

 private:
  int fd_;
};

}  // namespace

std::optional<PeerSocket> FindPeerSocket(const TcpConnection& connection) {
  struct {
    nlmsghdr header;
    inet_diag_req_v2 request;
  } message;
  memset(&message, 0, sizeof(message));
  inet_diag_req_v2& request = message.request;
  request.sdiag_protocol = IPPROTO_TCP;
  request.idiag_states = ~0U;
  // The peer's socket: its own end is our remote one.
  request.id.idiag_sport = htons(static_cast<uint16_t>(connection.remote_port));
  request.id.idiag_dport = htons(static_cast<uint16_t>(connection.local_port));
  request.id.idiag_cookie[0] = INET_DIAG_NOCOOKIE;
  request.id.idiag_cookie[1] = INET_DIAG_NOCOOKIE;
  request.sdiag_family = connection.remote_address.find(':') == std::string::npos ? AF_INET : AF_INET6;
  if (!SetAddress(connection.remote_address, request.sdiag_family, request.id.idiag_src) ||
      !SetAddress(connection.local_address, request.sdiag_family, request.id.idiag_dst)) {
    return std::nullopt;
  }
  message.header.nlmsg_len = sizeof(message);
  message.header.nlmsg_type = SOCK_DIAG_BY_FAMILY;
  message.header.nlmsg_flags = NLM_F_REQUEST;  // one exact socket, no dump

  NetlinkSocket netlink;
  if (netlink.fd() < 0) return std::nullopt;
  sockaddr_nl kernel;
  memset(&kernel, 0, sizeof(kernel));
  kernel.nl_family = AF_NETLINK;
  if (sendto(netlink.fd(), &message, sizeof(message), 0, reinterpret_cast<sockaddr*>(&kernel), sizeof(kernel)) < 0) {
    return std::nullopt;
  }
  alignas(nlmsghdr) char buffer[8192];
  ssize_t length;
  do {
    length = recv(netlink.fd(), buffer, sizeof(buffer), 0);
  } while (length < 0 && errno == EINTR);
  if (length <= 0) return std::nullopt;
  for (nlmsghdr* header = reinterpret_cast<nlmsghdr*>(buffer); NLMSG_OK(header, static_cast<size_t>(length));
       header = NLMSG_NEXT(header, length)) {
    if (header->nlmsg_type != SOCK_DIAG_BY_FAMILY) return std::nullopt;  // NLMSG_ERROR: no such socket
    if (header->nlmsg_len < NLMSG_LENGTH(sizeof(inet_diag_msg))) return std::nullopt;
    const inet_diag_msg* answer = static_cast<const inet_diag_msg*>(NLMSG_DATA(header));
    PeerSocket peer;
    peer.owner = static_cast<uid_t>(answer->idiag_uid);
    peer.inode = answer->idiag_inode;
    peer.cookie = static_cast<uint64_t>(answer->id.idiag_cookie[0]) |
                  (static_cast<uint64_t>(answer->id.idiag_cookie[1]) << 32);
    return peer;
  }
  return std::nullopt;
}

}  // namespace spotlightd
}  // namespace corvlumex
