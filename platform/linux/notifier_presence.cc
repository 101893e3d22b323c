#include "platform/linux/notifier_presence.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "common/sys.h"

namespace corvlumex {
namespace platform {
namespace {

// The whole file, from offset 0 to its end and beyond.
struct flock WholeFile(short type) {
  struct flock lock = {};
  lock.l_type = type;
  lock.l_whence = SEEK_SET;
  return lock;
}

}  // namespace

std::string NotifierConfigDir() { return SysPath("/etc/corvlumex/monitor.d"); }

bool HoldNotifierPresence(int config_dir_fd) {
  struct flock lock = WholeFile(F_RDLCK);
  return fcntl(config_dir_fd, F_OFD_SETLK, &lock) == 0;
}

NotifierState ProbeNotifier(const std::string& config_dir) {
  const int fd = open(config_dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) {
    const bool missing = errno == ENOENT;
    errno = 0;
    return missing ? NotifierState::kNotRunning : NotifierState::kUnknown;
  }
  // Which lock would stand in the way of a write lock: the notifier's read
  // lock, or none. Nothing is taken.
  struct flock lock = WholeFile(F_WRLCK);
  const int result = fcntl(fd, F_OFD_GETLK, &lock);
  close(fd);
  if (result != 0) {
    errno = 0;
    return NotifierState::kUnknown;
  }
  return lock.l_type == F_UNLCK ? NotifierState::kNotRunning : NotifierState::kRunning;
}

}  // namespace platform
}  // namespace corvlumex
