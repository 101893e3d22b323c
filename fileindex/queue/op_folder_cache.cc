#include "fileindex/queue/op_folder_cache.h"

#include <cstring>
#include <functional>

namespace corvlumex {
namespace fileindex {

FolderCache::FolderCache() = default;
FolderCache::~FolderCache() = default;

size_t FolderCache::Hash(std::string_view folder_path) { return std::hash<std::string_view>()(folder_path); }

OPNode* FolderCache::Find(std::string_view folder_path, size_t hash) const {
  if (slots_ == 0) return nullptr;
  const Entry& entry = entries_[hash & (slots_ - 1)];
  if (entry.node == nullptr || entry.hash != hash || entry.length != folder_path.size()) return nullptr;
  return memcmp(entry.path, folder_path.data(), folder_path.size()) == 0 ? entry.node : nullptr;
}

void FolderCache::Put(std::string_view folder_path, size_t hash, OPNode* node) {
  if (folder_path.size() > sizeof(Entry::path)) return;
  // Small at first, since most queues are short; larger (starting empty
  // again, it is only a cache) once many folders pass through.
  if (slots_ == 0 || (++puts_ > slots_ * 2 && slots_ < kMaxSlots)) {
    slots_ = slots_ == 0 ? kFirstSlots : (slots_ * 8 < kMaxSlots ? slots_ * 8 : kMaxSlots);
    entries_.reset(new Entry[slots_]);
    for (size_t i = 0; i < slots_; ++i) entries_[i].node = nullptr;
    puts_ = 0;
  }
  Entry& entry = entries_[hash & (slots_ - 1)];
  entry.hash = hash;
  entry.node = node;
  entry.length = static_cast<uint32_t>(folder_path.size());
  memcpy(entry.path, folder_path.data(), folder_path.size());
}

void FolderCache::Clear() {
  entries_.reset();
  slots_ = 0;
  puts_ = 0;
}

}  // namespace fileindex
}  // namespace corvlumex
