#include "programs/corvelasticd/access_filter.h"

#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

#include "common/log.h"

namespace corvlumex {
namespace elasticd {
namespace {

bool CanRead(const std::string& path) {
  // AT_EACCESS makes the kernel check with the thread's file-system ids and
  // groups, the ones switched below, rather than the real ids.
  const bool ok = faccessat(AT_FDCWD, path.c_str(), R_OK, AT_EACCESS) == 0;
  errno = 0;
  return ok;
}

// Switches the calling thread's file-system identity (these system calls
// act on one thread only; the C library's setgroups would change every
// thread) and restores it when destroyed.
class ThreadFsIdentity {
 public:
  explicit ThreadFsIdentity(const PeerIdentity& peer) {
    const int count = getgroups(0, nullptr);
    if (count > 0) {
      saved_groups_.resize(static_cast<size_t>(count));
      saved_groups_.resize(static_cast<size_t>(getgroups(count, saved_groups_.data())));
    }
    saved_gid_ = getegid();
    if (syscall(SYS_setgroups, peer.groups.size(), peer.groups.data()) != 0) return;
    syscall(SYS_setfsgid, peer.gid);
    syscall(SYS_setfsuid, peer.uid);
    // The calls report the previous id; asking with an invalid id reads the current one.
    active_ = static_cast<uid_t>(syscall(SYS_setfsuid, -1)) == peer.uid &&
              static_cast<gid_t>(syscall(SYS_setfsgid, -1)) == peer.gid;
  }
  ~ThreadFsIdentity() {
    syscall(SYS_setfsuid, geteuid());
    syscall(SYS_setfsgid, saved_gid_);
    syscall(SYS_setgroups, saved_groups_.size(), saved_groups_.data());
    errno = 0;
  }
  ThreadFsIdentity(const ThreadFsIdentity&) = delete;
  ThreadFsIdentity& operator=(const ThreadFsIdentity&) = delete;
  bool active() const { return active_; }

 private:
  bool active_ = false;
  gid_t saved_gid_ = 0;
  std::vector<gid_t> saved_groups_;
};

std::vector<gid_t> GroupsOfName(const char* name, gid_t gid) {
  int count = 64;
  std::vector<gid_t> groups(static_cast<size_t>(count));
  if (getgrouplist(name, gid, groups.data(), &count) < 0) {
    groups.resize(static_cast<size_t>(count));
    if (getgrouplist(name, gid, groups.data(), &count) < 0) return {};
  }
  groups.resize(static_cast<size_t>(count));
  return groups;
}

std::vector<gid_t> GroupsOfUser(uid_t uid, gid_t gid) {
  struct passwd entry;
  struct passwd* found = nullptr;
  std::vector<char> buffer(16384);
  if (getpwuid_r(uid, &entry, buffer.data(), buffer.size(), &found) != 0 || found == nullptr) return {};
  return GroupsOfName(entry.pw_name, gid);
}

}  // namespace

PeerIdentity ReadPeerIdentity(int fd, const fileindex::PeerCredentials& credentials) {
  PeerIdentity peer;
  peer.uid = credentials.uid;
  peer.gid = credentials.gid;
  peer.pid = credentials.pid;
  std::vector<gid_t> groups(256);
  socklen_t length = static_cast<socklen_t>(groups.size() * sizeof(gid_t));
  if (getsockopt(fd, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &length) == 0) {
    groups.resize(length / sizeof(gid_t));
    peer.groups = groups;
  } else {
    errno = 0;
    peer.groups = GroupsOfUser(peer.uid, peer.gid);
  }
  return peer;
}

bool IdentityOfUser(const std::string& name, PeerIdentity* identity) {
  struct passwd entry;
  struct passwd* found = nullptr;
  std::vector<char> buffer(16384);
  if (name.empty() || getpwnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found) != 0 || found == nullptr) {
    errno = 0;
    return false;
  }
  identity->uid = entry.pw_uid;
  identity->gid = entry.pw_gid;
  identity->pid = 0;
  identity->groups = GroupsOfName(entry.pw_name, entry.pw_gid);
  return true;
}

std::vector<bool> AccessFilter::Readable(const std::vector<std::string>& paths) const {
  std::vector<bool> readable(paths.size(), false);
  if (SeesAll()) return std::vector<bool>(paths.size(), true);
  if (peer_.uid == static_cast<uid_t>(-1)) return readable;
  if (geteuid() != 0) {
    // Without root the daemon can only check as itself.
    if (peer_.uid != geteuid()) return readable;
    for (size_t i = 0; i < paths.size(); ++i) readable[i] = CanRead(paths[i]);
    return readable;
  }
  const ThreadFsIdentity identity(peer_);
  if (!identity.active()) return readable;
  for (size_t i = 0; i < paths.size(); ++i) readable[i] = CanRead(paths[i]);
  return readable;
}

}  // namespace elasticd
}  // namespace corvlumex
