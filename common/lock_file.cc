#include "common/lock_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>

#include "common/error.h"
#include "common/log.h"
#include "common/sys.h"

namespace corvlumex {
namespace {
constexpr int kLockAttempts = 64;
constexpr long kLockBaseDelayUs = 100000;

bool LocksTheNamedFile(int fd, const std::string& path) {
  struct stat held, named;
  return fstat(fd, &held) == 0 && stat(path.c_str(), &named) == 0 && held.st_dev == named.st_dev &&
         held.st_ino == named.st_ino;
}
}  // namespace

LockFile::LockFile(const std::string& path, bool exclusive) : fd_(-1), path_(path) {
  for (int attempt = 1;; ++attempt) {
    CORV_CHECK_THROW_TEXT(0 > (fd_ = open(path_.c_str(), O_RDONLY | O_CREAT | O_CLOEXEC, 0644)),
                          "0 > (fd_ = open(path_.c_str(), O_RDONLY | O_CREAT, 0644))", kErrorLockFile,
                          "open failed, path=" + path_ + ", reason=" + strerror(errno));
    if (flock(fd_, (exclusive ? LOCK_EX : LOCK_SH) | LOCK_NB) == 0) {
      if (LocksTheNamedFile(fd_, path_)) return;
      // Renamed or removed between our open and our lock (a queue file being
      // taken over): the next opener of the path gets another file, so this
      // lock would exclude nobody. Try again on what the path names now.
      close(fd_);
      fd_ = -1;
      if (attempt == kLockAttempts) throw Error(kErrorLockFile, "Exceed max retry, path=" + path_);
      continue;
    }
    const int flock_errno = errno;
    close(fd_);
    fd_ = -1;
    if (flock_errno != EINTR && flock_errno != EAGAIN) throw Error(kErrorLockFile, strerror(flock_errno));
    // rand() spreads competing processes apart; the last attempt sleeps too.
    SleepFor(std::chrono::microseconds(kLockBaseDelayUs * (rand() % 10)));
    if (attempt == kLockAttempts) throw Error(kErrorLockFile, "Exceed max retry, path=" + path_);
  }
}

LockFile::~LockFile() {
  if (fd_ < 0) return;
  flock(fd_, LOCK_UN);
  close(fd_);
}

}  // namespace corvlumex
