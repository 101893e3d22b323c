#include "platform/linux/mount_table.h"

#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <cerrno>
#include <fstream>
#include <sstream>

namespace corvlumex {
namespace platform {

std::string UnescapeMountField(const std::string& field) {
  std::string out;
  for (size_t i = 0; i < field.size(); ++i) {
    if (field[i] == '\\' && i + 3 < field.size()) {
      const std::string digits = field.substr(i + 1, 3);
      if (digits.find_first_not_of("01234567") == std::string::npos) {
        out.push_back(static_cast<char>(std::stoi(digits, nullptr, 8)));
        i += 3;
        continue;
      }
    }
    out.push_back(field[i]);
  }
  return out;
}

bool FindMountOf(const std::string& path, MountEntry* entry) {
  struct stat st;
  if (stat(path.c_str(), &st) != 0) {
    errno = 0;
    return false;
  }
  const std::string device = std::to_string(major(st.st_dev)) + ":" + std::to_string(minor(st.st_dev));
  std::ifstream table("/proc/self/mountinfo");
  std::string line;
  bool found = false;
  // Bind mounts repeat a device; the last line of a device is the mount on top.
  while (std::getline(table, line)) {
    std::istringstream fields(line);
    std::string id, parent, dev, root, mount_point, word;
    if (!(fields >> id >> parent >> dev >> root >> mount_point) || dev != device) continue;
    while (fields >> word && word != "-") {
    }
    MountEntry candidate;
    candidate.mount_point = UnescapeMountField(mount_point);
    if (!(fields >> candidate.type)) continue;
    fields >> candidate.source;
    candidate.source = UnescapeMountField(candidate.source);
    *entry = candidate;
    found = true;
  }
  return found;
}

}  // namespace platform
}  // namespace corvlumex
