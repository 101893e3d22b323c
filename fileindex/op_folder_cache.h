// Folders resolved recently, by full path. Events come in runs on the files
// of a few folders; finding the folder here saves walking a deep path from
// the root one component (and several cache misses) at a time. Nodes are
// never removed or renamed while their tree lives, so an entry never goes
// stale; a slot is simply overwritten by the next folder hashed to it.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace corvlumex {
namespace fileindex {

class OPNode;

class FolderCache {
 public:
  FolderCache();
  FolderCache(const FolderCache&) = delete;
  FolderCache& operator=(const FolderCache&) = delete;
  // The node of `folder_path` when it is cached, else null.
  OPNode* Find(std::string_view folder_path) const;
  void Put(std::string_view folder_path, OPNode* node);
  void Clear();

 private:
  struct Entry {
    std::string path;
    OPNode* node = nullptr;
  };
  static constexpr size_t kFirstSlots = 64;
  static constexpr size_t kMaxSlots = 16384;
  size_t Slot(std::string_view folder_path) const;

  std::vector<Entry> entries_;  // a power of two in size once used
  size_t puts_ = 0;
};

}  // namespace fileindex
}  // namespace corvlumex
