#include "fileindex/op_folder_cache.h"

#include <functional>

namespace corvlumex {
namespace fileindex {

FolderCache::FolderCache() = default;

size_t FolderCache::Slot(std::string_view folder_path) const {
  return std::hash<std::string_view>()(folder_path) & (entries_.size() - 1);
}

OPNode* FolderCache::Find(std::string_view folder_path) const {
  if (entries_.empty()) return nullptr;
  const Entry& entry = entries_[Slot(folder_path)];
  return entry.node != nullptr && entry.path == folder_path ? entry.node : nullptr;
}

void FolderCache::Put(std::string_view folder_path, OPNode* node) {
  // Small at first, since most queues are short; larger (starting empty
  // again, it is only a cache) once many folders pass through.
  if (entries_.empty()) {
    entries_.resize(kFirstSlots);
  } else if (++puts_ > entries_.size() * 2 && entries_.size() < kMaxSlots) {
    entries_.assign(entries_.size() * 8 < kMaxSlots ? entries_.size() * 8 : kMaxSlots, Entry());
    puts_ = 0;
  }
  Entry& entry = entries_[Slot(folder_path)];
  entry.path.assign(folder_path.data(), folder_path.size());
  entry.node = node;
}

void FolderCache::Clear() {
  std::vector<Entry>().swap(entries_);
  puts_ = 0;
}

}  // namespace fileindex
}  // namespace corvlumex
