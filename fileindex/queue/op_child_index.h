// Hash index from a child's name to the child, so a folder with hundreds of
// thousands of entries is searched in constant time while its children_
// list keeps the order of creation. The table's size follows from the
// number of children, so it needs no bookkeeping of its own beyond one
// pointer per node.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

class OPNode;

class ChildIndex {
 public:
  // Below this many children a short scan is as cheap as hashing.
  static constexpr size_t kMinChildren = 4;

  // The child named `name`, or null. Only for lists of kMinChildren or more.
  OPNode* Find(std::string_view name, size_t child_count) const;
  // Records children.back(), just appended.
  void Added(const std::vector<std::shared_ptr<OPNode>>& children);

 private:
  // A power of two at least 1.5 times the number of children: probes stay
  // short (a free slot ends every miss) and the table small.
  static size_t Capacity(size_t child_count);
  void Place(OPNode* child, size_t capacity);

  // Capacity child pointers (null is free; open addressing, linear
  // probing) followed by one hash tag byte per slot, in one block.
  std::unique_ptr<uint8_t[]> slots_;
};

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
