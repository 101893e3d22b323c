#include "programs/fileindex-web/download.h"

#include <fcntl.h>
#include <grp.h>
#include <limits.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/path_below.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/state/folder_mgr.h"
#include "platform/linux/extract/worker_protocol.h"
#include "programs/fileindex-web/api_error.h"
#include "programs/fileindex-web/path_checks.h"
#include "sdk/share.h"

namespace corvlumex {
namespace web {
namespace {

const char kNotIndexed[] = "the file is not in an indexed folder";

std::string RealPath(const std::string& path) {
  char buffer[PATH_MAX];
  if (realpath(path.c_str(), buffer) == nullptr) {
    errno = 0;
    return "";
  }
  return buffer;
}

// Runs in the child: becomes the user, opens, sends the descriptor (or
// exits with the open's errno). Only system calls, as after fork() in a
// threaded process.
[[noreturn]] void OpenAsUserChild(int channel, const std::string& path, const Account& account) {
  if (setgroups(account.groups.size(), account.groups.data()) != 0 ||
      setresgid(account.gid, account.gid, account.gid) != 0 || setresuid(account.uid, account.uid, account.uid) != 0) {
    _exit(EPERM);
  }
  const int fd = open(path.c_str(), O_RDONLY | O_NOCTTY | O_NONBLOCK);
  if (fd < 0) _exit(errno);
  _exit(platform::extract::SendDescriptor(channel, fd) ? 0 : EIO);
}

// The descriptor the child opened, or -1 with `error` set to its errno.
int OpenAsUser(const std::string& path, const Account& account, int* error) {
  if (geteuid() != 0) {
    // Without root the daemon can open only as itself (a sandbox run by one user).
    if (account.uid != geteuid()) {
      *error = EACCES;
      return -1;
    }
    const int fd = open(path.c_str(), O_RDONLY | O_NOCTTY | O_NONBLOCK | O_CLOEXEC);
    *error = fd < 0 ? errno : 0;
    errno = 0;
    return fd;
  }
  int channel[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, channel) != 0) throw Error(kErrorSystem, "socketpair failed");
  const pid_t child = fork();
  if (child == 0) {
    close(channel[0]);
    OpenAsUserChild(channel[1], path, account);
  }
  close(channel[1]);
  if (child < 0) {
    close(channel[0]);
    throw Error(kErrorSystem, "fork failed");
  }
  const int fd = platform::extract::ReceiveDescriptor(channel[0]);
  close(channel[0]);
  int status = 0;
  while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
  }
  errno = 0;
  *error = fd >= 0 ? 0 : (WIFEXITED(status) && WEXITSTATUS(status) != 0 ? WEXITSTATUS(status) : EACCES);
  return fd;
}

}  // namespace

OpenedFile OpenForDownload(const std::string& path, const Account& account) {
  if (!IsCleanAbsolutePath(path)) {
    throw ApiError(400, "the download path must be a full path without \".\" or \"..\"", "download a file from a search result");
  }
  const fileindex::FolderMgr folders;
  std::string share_name, share_path;
  try {
    fileindex::GetShareNamePathByFullPath(share_name, share_path, path);
  } catch (const Error&) {
    throw ApiError(404, kNotIndexed, "download a file from a search result");
  }
  if (share_name.empty() || !folders.IsFullPathIndexed(path)) throw ApiError(404, kNotIndexed, "download a file from a search result");
  const std::string share_dir = RealPath(sdk::SDKShare(share_name).GetPath());
  if (share_dir.empty()) throw ApiError(404, "the share's folder is missing", "ask an administrator");

  int error = 0;
  const int fd = OpenAsUser(path, account, &error);
  if (fd < 0) {
    if (error == ENOENT || error == ENOTDIR) throw ApiError(404, "no such file: " + path, "search again: the file may have moved");
    throw ApiError(403, "you may not read " + path, "ask the file's owner for access");
  }
  OpenedFile opened;
  opened.fd = fd;
  opened.real_path = RealPath("/proc/self/fd/" + std::to_string(fd));
  struct stat info;
  const bool regular = fstat(fd, &info) == 0 && S_ISREG(info.st_mode);
  const bool inside = IsPathStrictlyBelow(opened.real_path, share_dir);
  if (!regular || !inside) {
    close(fd);
    throw ApiError(403, inside ? path + " is not a file" : path + " leads outside its share",
                   "download a regular file from a search result");
  }
  // The descriptor was opened non-blocking so a FIFO could not hold the child.
  fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) & ~O_NONBLOCK);
  opened.size = info.st_size;
  return opened;
}

}  // namespace web
}  // namespace corvlumex
