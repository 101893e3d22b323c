#include "fileindex/op_child_index.h"

#include <functional>

#include "fileindex/optree.h"

namespace corvlumex {
namespace fileindex {

ChildIndex::ChildIndex(const std::vector<std::shared_ptr<OPNode>>& children) {
  Rebuild(children.size() * 2, children);
}

size_t ChildIndex::Hash(std::string_view name) { return std::hash<std::string_view>()(name); }

int64_t ChildIndex::Find(std::string_view name, const std::vector<std::shared_ptr<OPNode>>& children) const {
  const size_t mask = slots_.size() - 1;
  for (size_t slot = Hash(name) & mask;; slot = (slot + 1) & mask) {
    const uint32_t entry = slots_[slot];
    if (entry == 0) return -1;
    if (children[entry - 1]->name_ == name) return entry - 1;
  }
}

void ChildIndex::Add(size_t position, const std::vector<std::shared_ptr<OPNode>>& children) {
  // Keep the table at most half full so probes stay short.
  if ((used_ + 1) * 2 > slots_.size()) {
    Rebuild((used_ + 1) * 2, children);
    return;
  }
  Place(position, children[position]->name_);
}

void ChildIndex::Rebuild(size_t capacity, const std::vector<std::shared_ptr<OPNode>>& children) {
  size_t size = 16;
  while (size < capacity) size *= 2;
  slots_.assign(size, 0);
  used_ = 0;
  for (size_t position = 0; position < children.size(); ++position) Place(position, children[position]->name_);
}

void ChildIndex::Place(size_t position, std::string_view name) {
  const size_t mask = slots_.size() - 1;
  size_t slot = Hash(name) & mask;
  while (slots_[slot] != 0) slot = (slot + 1) & mask;
  slots_[slot] = static_cast<uint32_t>(position + 1);
  ++used_;
}

}  // namespace fileindex
}  // namespace corvlumex
