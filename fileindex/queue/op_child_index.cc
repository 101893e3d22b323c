#include "fileindex/queue/op_child_index.h"

#include <functional>

#include "fileindex/queue/optree.h"

namespace corvlumex {
namespace fileindex {
namespace {

size_t Hash(std::string_view name) { return std::hash<std::string_view>()(name); }

// Eight more bits of the hash, kept beside each slot, so a probe only reads
// a child (a likely cache miss) when its name probably matches.
uint8_t Tag(size_t hash) { return static_cast<uint8_t>(hash >> 56); }

}  // namespace

size_t ChildIndex::Capacity(size_t child_count) {
  size_t capacity = 8;
  while (capacity < child_count + child_count / 2) capacity *= 2;
  return capacity;
}

OPNode* ChildIndex::Find(std::string_view name, size_t child_count) const {
  const size_t capacity = Capacity(child_count);
  const size_t mask = capacity - 1;
  OPNode* const* children = reinterpret_cast<OPNode* const*>(slots_.get());
  const uint8_t* tags = slots_.get() + capacity * sizeof(OPNode*);
  const size_t hash = Hash(name);
  const uint8_t tag = Tag(hash);
  for (size_t slot = hash & mask;; slot = (slot + 1) & mask) {
    OPNode* child = children[slot];
    if (child == nullptr) return nullptr;
    if (tags[slot] == tag && child->name_ == name) return child;
  }
}

void ChildIndex::Added(const std::vector<std::shared_ptr<OPNode>>& children) {
  const size_t count = children.size();
  if (count < kMinChildren) return;
  const size_t capacity = Capacity(count);
  if (count > kMinChildren && capacity == Capacity(count - 1)) {
    Place(children.back().get(), capacity);
    return;
  }
  // First use or growth: rebuild from the list.
  slots_.reset(new uint8_t[capacity * (sizeof(OPNode*) + 1)]());
  for (const std::shared_ptr<OPNode>& child : children) Place(child.get(), capacity);
}

void ChildIndex::Place(OPNode* child, size_t capacity) {
  const size_t mask = capacity - 1;
  OPNode** children = reinterpret_cast<OPNode**>(slots_.get());
  uint8_t* tags = slots_.get() + capacity * sizeof(OPNode*);
  const size_t hash = Hash(child->name_);
  size_t slot = hash & mask;
  while (children[slot] != nullptr) slot = (slot + 1) & mask;
  children[slot] = child;
  tags[slot] = Tag(hash);
}

}  // namespace fileindex
}  // namespace corvlumex
