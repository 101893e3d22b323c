#include "fileindex/unix_listener.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"

namespace corvlumex {
namespace fileindex {
namespace {

sockaddr_un Address(const std::string& path) {
  sockaddr_un address;
  memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
  return address;
}

// True when a process answers on the socket file.
bool SomeoneListens(const std::string& path) {
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return false;
  const sockaddr_un address = Address(path);
  const bool listening = connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
  close(fd);
  errno = 0;
  return listening;
}

[[noreturn]] void Fail(const std::string& reason) {
  errno = 0;
  throw Error(kErrorSystem, reason);
}

std::string Reason() { return strerror(errno); }

}  // namespace

UnixListener::UnixListener(std::string path, UnixListenerOptions options) : path_(std::move(path)) {
  if (path_.size() >= sizeof(sockaddr_un::sun_path)) Fail("socket path too long: " + path_);
  struct stat info;
  if (lstat(path_.c_str(), &info) == 0) {
    if (!S_ISSOCK(info.st_mode)) Fail(path_ + " exists and is not a socket");
    if (SomeoneListens(path_)) Fail("another daemon already answers on " + path_);
    unlink(path_.c_str());
  }
  errno = 0;
  // Non-blocking: every thread waiting on the socket may be told of a
  // connection another one takes.
  fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd_ < 0) Fail("socket: " + Reason());
  const sockaddr_un address = Address(path_);
  // Nobody may connect before the group and mode below are in place.
  const mode_t old_mask = umask(0177);
  const int bound = bind(fd_, reinterpret_cast<const sockaddr*>(&address), sizeof(address));
  umask(old_mask);
  std::string failure;
  if (bound != 0) {
    failure = "bind " + path_ + ": " + Reason();
  } else if (options.group != static_cast<gid_t>(-1) && chown(path_.c_str(), static_cast<uid_t>(-1), options.group) != 0) {
    failure = "chown " + path_ + ": " + Reason();
  } else if (chmod(path_.c_str(), options.mode) != 0) {
    failure = "chmod " + path_ + ": " + Reason();
  } else if (listen(fd_, options.backlog) != 0) {
    failure = "listen: " + Reason();
  }
  if (!failure.empty()) {
    close(fd_);
    if (bound == 0) unlink(path_.c_str());
    Fail(failure);
  }
  errno = 0;
}

UnixListener::~UnixListener() {
  close(fd_);
  unlink(path_.c_str());
}

int UnixListener::Accept(PeerCredentials* peer) {
  const int fd = accept4(fd_, nullptr, nullptr, SOCK_CLOEXEC);
  if (fd < 0) return -1;
  struct ucred credentials;
  socklen_t length = sizeof(credentials);
  if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0) {
    const int error = errno;
    close(fd);
    errno = error;
    return -1;
  }
  peer->pid = credentials.pid;
  peer->uid = credentials.uid;
  peer->gid = credentials.gid;
  return fd;
}

}  // namespace fileindex
}  // namespace corvlumex
