// Hash index from a child's name to its position in its parent's children_,
// so a folder with hundreds of thousands of entries is searched in constant
// time while children_ keeps the order of creation.
#pragma once

#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

namespace corvlumex {
namespace fileindex {

class OPNode;

class ChildIndex {
 public:
  // Below this many children a linear scan is cheaper than hashing.
  static constexpr size_t kMinChildren = 8;

  explicit ChildIndex(const std::vector<std::shared_ptr<OPNode>>& children);

  // Position of the child named `name`, or -1.
  int64_t Find(std::string_view name, const std::vector<std::shared_ptr<OPNode>>& children) const;
  // Records children[position], which must be new.
  void Add(size_t position, const std::vector<std::shared_ptr<OPNode>>& children);

 private:
  static size_t Hash(std::string_view name);
  void Rebuild(size_t capacity, const std::vector<std::shared_ptr<OPNode>>& children);
  void Place(size_t position, std::string_view name);

  // Open addressing with linear probing; a slot holds position + 1, 0 is free.
  std::vector<uint32_t> slots_;
  size_t used_ = 0;
};

}  // namespace fileindex
}  // namespace corvlumex
