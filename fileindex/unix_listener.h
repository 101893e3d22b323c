// The listening side of a daemon's Unix socket: binding, the socket file's
// permissions, and who is on the other end of each connection. Every daemon
// that serves local users (corvelasticd, fileindexd) listens through this
// one class, so they share the same guarantees:
//
// - nobody can connect before the socket file has its final owner group and
//   mode (it is bound with a umask that lets only the owner in);
// - a socket file left by a crash (nobody answers on it) is replaced, but a
//   live one is never taken over, and a path that is not a socket at all is
//   never removed;
// - every accepted connection comes with its peer's credentials, and one
//   whose credentials cannot be read is closed unanswered, so a daemon always
//   knows who is asking before it answers.
//
// What a daemon does with a connection stays in that daemon.
#pragma once

#include <sys/types.h>

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// The connected process, as the kernel saw it at connect time (SO_PEERCRED).
struct PeerCredentials {
  pid_t pid = 0;
  uid_t uid = static_cast<uid_t>(-1);
  gid_t gid = static_cast<gid_t>(-1);
};

struct UnixListenerOptions {
  mode_t mode = 0666;                          // of the socket file: who may connect
  gid_t group = static_cast<gid_t>(-1);        // owner group of the socket file; -1 keeps the process's
  int backlog = 128;
};

class UnixListener {
 public:
  // Binds and listens on `path`. Throws Error (kErrorSystem) whose reason
  // names the path and what went wrong: path too long, not a socket,
  // another process answering on it, or a failed bind, chown, chmod or
  // listen.
  UnixListener(std::string path, UnixListenerOptions options);
  // Closes the socket and removes its file.
  ~UnixListener();
  UnixListener(const UnixListener&) = delete;
  UnixListener& operator=(const UnixListener&) = delete;

  // The listening descriptor, non-blocking, for poll/epoll.
  int fd() const { return fd_; }
  const std::string& path() const { return path_; }

  // The next waiting connection (close-on-exec) with its peer in `peer`.
  // -1 when none is waiting, accept failed (errno says why: EAGAIN when
  // another thread took it, EMFILE when out of descriptors, ...) or the
  // peer's credentials could not be read (the connection is then closed).
  int Accept(PeerCredentials* peer);

 private:
  std::string path_;
  int fd_ = -1;
};

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
