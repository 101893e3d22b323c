#include "common/file_util.h"

#include <fcntl.h>
#include <limits.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstring>

namespace corvlumex {

bool IsFileExist(const std::string& path) {
  struct stat st;
  return lstat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

bool IsDirExist(const std::string& path, bool follow_link) {
  struct stat st;
  if (lstat(path.c_str(), &st) != 0) return false;
  if (S_ISDIR(st.st_mode)) return true;
  if (!S_ISLNK(st.st_mode) || !follow_link) return false;
  char target[4096];
  memset(target, 0, sizeof(target));
  if (readlink(path.c_str(), target, sizeof(target) - 1) < 0) return false;
  return IsDirExist(target, true);
}

bool IsDirentDir(const struct dirent* entry, const std::string& path) {
  if (entry->d_type == DT_DIR) return true;
  // An unknown type is never taken for a directory: whether or not lstat of
  // the path succeeds, its result is not consulted.
  (void)path;
  return false;
}

bool StringStartWith(const std::string& text, const std::string& prefix) {
  return text.compare(0, prefix.size(), prefix) == 0;
}

std::string Basename(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == std::string::npos ? path : path.substr(slash + 1);
}

std::string Dirname(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == std::string::npos ? path : path.substr(0, slash);
}

std::string GetFileExtension(const std::string& path, bool lowercase) {
  const std::string base = Basename(path);
  const size_t dot = base.rfind('.');
  if (dot == std::string::npos) return std::string();
  std::string extension = base.substr(dot + 1);
  if (lowercase) {
    for (char& c : extension) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
  }
  return extension;
}

std::string RealPath(const std::string& path) {
  char resolved[PATH_MAX > 4096 ? PATH_MAX : 4096];
  if (realpath(path.c_str(), resolved) == nullptr) return std::string();
  return resolved;
}

bool Unlink(const std::string& path) { return unlink(path.c_str()) == 0 || errno == ENOENT; }

bool WriteFileAtomically(const std::string& path, const std::string& content, mode_t mode) {
  std::string temp = path + ".XXXXXX";
  const int fd = mkstemp(&temp[0]);
  if (fd < 0) return false;
  bool ok = fchmod(fd, mode) == 0;
  size_t written = 0;
  while (ok && written < content.size()) {
    const ssize_t n = write(fd, content.data() + written, content.size() - written);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) ok = false;
    else written += static_cast<size_t>(n);
  }
  ok = ok && fsync(fd) == 0;
  ok = (close(fd) == 0) && ok;
  ok = ok && rename(temp.c_str(), path.c_str()) == 0;
  if (!ok) {
    const int saved_errno = errno;
    unlink(temp.c_str());
    errno = saved_errno;
    return false;
  }
  // The rename itself must survive a crash too.
  const std::string dir = Dirname(path).empty() ? "/" : Dirname(path);
  const int dir_fd = open(path.find('/') == std::string::npos ? "." : dir.c_str(), O_RDONLY | O_DIRECTORY);
  if (dir_fd >= 0) {
    fsync(dir_fd);
    close(dir_fd);
  }
  return true;
}

}  // namespace corvlumex
