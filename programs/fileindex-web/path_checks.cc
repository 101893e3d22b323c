#include "programs/fileindex-web/path_checks.h"

namespace corvlumex {
namespace web {

bool IsCleanAbsolutePath(const std::string& path) {
  if (path.size() < 2 || path[0] != '/' || path.find('\0') != std::string::npos) return false;
  size_t start = 1;
  while (start <= path.size()) {
    const size_t end = std::min(path.find('/', start), path.size());
    const std::string part = path.substr(start, end - start);
    if (part.empty() || part == "." || part == "..") return false;
    start = end + 1;
  }
  return true;
}

}  // namespace web
}  // namespace corvlumex
