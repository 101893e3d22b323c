// Folders resolved recently, by full path. Events come in runs on the files
// of a few folders; finding the folder here saves walking a deep path from
// the root one component (and several cache misses) at a time. Nodes are
// never removed or renamed while their tree lives, so an entry never goes
// stale; a slot is simply overwritten by the next folder hashed to it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

class OPNode;

class FolderCache {
 public:
  FolderCache();
  ~FolderCache();
  FolderCache(const FolderCache&) = delete;
  FolderCache& operator=(const FolderCache&) = delete;
  static size_t Hash(std::string_view folder_path);
  // The node of `folder_path` (whose Hash() is `hash`) when cached, else null.
  OPNode* Find(std::string_view folder_path, size_t hash) const;
  void Put(std::string_view folder_path, size_t hash, OPNode* node);
  void Clear();

 private:
  // The path is kept in the slot itself: a lookup that hits reads one
  // place. Longer folder paths are simply not cached.
  struct Entry {
    size_t hash;
    OPNode* node;
    uint32_t length;
    char path[236];
  };
  static constexpr size_t kFirstSlots = 64;
  static constexpr size_t kMaxSlots = 16384;

  std::unique_ptr<Entry[]> entries_;
  size_t slots_ = 0;  // a power of two once used
  size_t puts_ = 0;
};

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
