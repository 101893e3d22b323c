// File questions of the Linux platform: permissions, mount points, copies.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "common/file_util.h"
#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace platform {

int LinuxPlatform::AclPermGet(const std::string& path) {
  struct stat st;
  if (stat(path.c_str(), &st) != 0) return -1;
  // faccessat with AT_EACCESS asks the kernel for the effective identity, so
  // POSIX ACLs and supplementary groups count.
  int granted = 0;
  for (int bit : {R_OK, W_OK, X_OK}) {
    if (faccessat(AT_FDCWD, path.c_str(), bit, AT_EACCESS) == 0) granted |= bit;
  }
  errno = 0;
  return granted;
}

int LinuxPlatform::DirIsMountPoint(const std::string& path) {
  struct stat self, parent;
  if (stat(path.c_str(), &self) != 0 || !S_ISDIR(self.st_mode)) return -1;
  if (stat((path + "/..").c_str(), &parent) != 0) return -1;
  // A different device, or the same inode as its parent (the root), marks a mount point.
  if (self.st_dev != parent.st_dev) return 1;
  return self.st_ino == parent.st_ino ? 1 : 0;
}

namespace {

int CopyContent(const std::string& src, const std::string& dst, const CopyArgs& args) {
  const int in = open(src.c_str(), O_RDONLY | O_CLOEXEC);
  if (in < 0) return -1;
  struct stat st;
  if (fstat(in, &st) != 0 || !S_ISREG(st.st_mode)) {
    close(in);
    return -1;
  }
  const std::string temp = dst + ".copy-tmp";
  const int out = open(temp.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, st.st_mode & 07777);
  if (out < 0) {
    close(in);
    return -1;
  }
  bool ok = true;
  char buffer[65536];
  for (;;) {
    const ssize_t n = read(in, buffer, sizeof(buffer));
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) ok = false;
    if (n <= 0) break;
    for (ssize_t done = 0; ok && done < n;) {
      const ssize_t w = write(out, buffer + done, static_cast<size_t>(n - done));
      if (w < 0 && errno == EINTR) continue;
      if (w <= 0) ok = false;
      else done += w;
    }
    if (!ok) break;
  }
  if (ok && args.keep_attributes) {
    if (fchown(out, st.st_uid, st.st_gid) != 0) errno = 0;  // only root may give files away
    const struct timespec times[2] = {st.st_atim, st.st_mtim};
    futimens(out, times);
  }
  ok = fsync(out) == 0 && ok;
  ok = close(out) == 0 && ok;
  close(in);
  ok = ok && rename(temp.c_str(), dst.c_str()) == 0;
  if (!ok) {
    unlink(temp.c_str());
    return -1;
  }
  return 0;
}

}  // namespace

int LinuxPlatform::FileCopy(const std::string& src, const std::string& dst, const CopyArgs& args, int) {
  if (args.move) {
    if (rename(src.c_str(), dst.c_str()) == 0) return 0;
    if (errno != EXDEV) return -1;
    // Across volumes a move is a copy followed by removal of the source.
    if (CopyContent(src, dst, args) != 0) return -1;
    return unlink(src.c_str()) == 0 ? 0 : -1;
  }
  return CopyContent(src, dst, args);
}

}  // namespace platform
}  // namespace corvlumex
