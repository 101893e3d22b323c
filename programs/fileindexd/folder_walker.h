// Lists what a folder holds on disk, depth first, without following links
// and without crossing into other file systems (a mount inside a share is
// its own business). Excluded names (IndexRules::IsExcludedName) are not
// entered at all.
#pragma once

#include <functional>
#include <string>
#include <vector>

namespace corvlumex {
namespace fileindexd {

struct DiskEntry {
  std::string path;
  bool is_dir = false;
};

// `root` itself first (when it exists), then everything below it. Entries
// that vanish during the walk are simply not listed. Empty when `root` does
// not exist. A folder for which `skip_dir` says true is listed but not
// entered.
std::vector<DiskEntry> WalkFolder(const std::string& root,
                                  const std::function<bool(const std::string&)>& skip_dir = nullptr);

}  // namespace fileindexd
}  // namespace corvlumex
