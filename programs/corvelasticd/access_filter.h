// Who is asking, and which files that user may read. Searches never return
// a document whose file the asking user could not read: the check runs on
// the file system with the user's own identity (file-system user and group
// ids and supplementary groups of the checking thread), so modes, ownership
// and POSIX ACLs all count.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "fileindex/unix_listener.h"

namespace corvlumex {
namespace elasticd {

struct PeerIdentity {
  uid_t uid = static_cast<uid_t>(-1);
  gid_t gid = static_cast<gid_t>(-1);
  pid_t pid = 0;
  std::vector<gid_t> groups;  // supplementary groups
};

// The connected process's identity: its credentials as the listener read
// them, with its supplementary groups (SO_PEERGROUPS, else the account
// database's groups of the user).
PeerIdentity ReadPeerIdentity(int fd, const fileindex::PeerCredentials& credentials);

// The identity of the user `name` as the system's account database gives it:
// uid, primary gid and every group the user belongs to (getgrouplist), so a
// search on the user's behalf sees what a login of that user would. Returns
// false for an unknown user.
bool IdentityOfUser(const std::string& name, PeerIdentity* identity);

class AccessFilter {
 public:
  explicit AccessFilter(const PeerIdentity& peer) : peer_(peer) {}

  // Root reads everything: no check is made.
  bool SeesAll() const { return peer_.uid == 0; }
  // For each path: may the user read it (and search every folder above it)?
  // When the daemon cannot take the user's identity (it does not run as
  // root and the user is another one) the answer is no for every path.
  std::vector<bool> Readable(const std::vector<std::string>& paths) const;

 private:
  PeerIdentity peer_;
};

}  // namespace elasticd
}  // namespace corvlumex
