#include "fileindex/op_child_index.h"

#include <functional>

#include "fileindex/optree.h"

namespace corvlumex {
namespace fileindex {
namespace {

size_t Hash(std::string_view name) { return std::hash<std::string_view>()(name); }

}  // namespace

size_t ChildIndex::Capacity(size_t child_count) {
  size_t capacity = 8;
  while (capacity < child_count * 2) capacity *= 2;
  return capacity;
}

OPNode* ChildIndex::Find(std::string_view name, size_t child_count) const {
  const size_t mask = Capacity(child_count) - 1;
  for (size_t slot = Hash(name) & mask;; slot = (slot + 1) & mask) {
    OPNode* child = slots_[slot];
    if (child == nullptr || child->name_ == name) return child;
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
  slots_.reset(new OPNode*[capacity]());
  for (const std::shared_ptr<OPNode>& child : children) Place(child.get(), capacity);
}

void ChildIndex::Place(OPNode* child, size_t capacity) {
  const size_t mask = capacity - 1;
  size_t slot = Hash(child->name_) & mask;
  while (slots_[slot] != nullptr) slot = (slot + 1) & mask;
  slots_[slot] = child;
}

}  // namespace fileindex
}  // namespace corvlumex
