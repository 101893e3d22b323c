#include "common/path_below.h"

namespace corvlumex {

namespace {

// The folder's own trailing "/" already separates it from what is below.
bool EndsWithSeparator(const std::string& folder) { return !folder.empty() && folder.back() == '/'; }

}  // namespace

bool IsPathStrictlyBelow(const std::string& path, const std::string& folder) {
  if (path.size() <= folder.size() || path.compare(0, folder.size(), folder) != 0) return false;
  return EndsWithSeparator(folder) || path[folder.size()] == '/';
}

std::string PrefixOfPathsBelow(const std::string& folder) { return EndsWithSeparator(folder) ? folder : folder + "/"; }

bool IsPathAtOrBelow(const std::string& path, const std::string& folder) {
  return path == folder || IsPathStrictlyBelow(path, folder);
}

}  // namespace corvlumex
