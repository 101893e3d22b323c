#include "platform/linux/config_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/file_util.h"
#include "platform/platform.h"

namespace corvlumex {
namespace platform {

bool MakeDirs(const std::string& dir) {
  if (dir.empty() || IsDirExist(dir, true)) return !dir.empty();
  const std::string parent = Dirname(dir);
  if (!parent.empty() && parent != dir && !MakeDirs(parent)) return false;
  if (mkdir(dir.c_str(), 0755) == 0 || errno == EEXIST) {
    errno = 0;
    return true;
  }
  return false;
}

bool WriteConfigFile(const std::string& path, const std::string& content, mode_t mode) {
  if (!MakeDirs(Dirname(path)) || !WriteFileAtomically(path, content, mode)) {
    CORV_PLATFORM_ERROR(kPlatformErrConfig, "cannot write " + path + ": " + strerror(errno));
    return false;
  }
  return true;
}

bool AppendConfigLine(const std::string& path, const std::string& line) {
  const std::string text = line + "\n";
  const int fd = MakeDirs(Dirname(path)) ? open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644) : -1;
  const bool ok = fd >= 0 && write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
  if (fd >= 0) close(fd);
  if (!ok) CORV_PLATFORM_ERROR(kPlatformErrConfig, "cannot append to " + path + ": " + strerror(errno));
  return ok;
}

}  // namespace platform
}  // namespace corvlumex
