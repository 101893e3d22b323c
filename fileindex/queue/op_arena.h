// Memory for one operation tree: its nodes, its OPs and the nodes' names.
//
// A queue of a million lines becomes about a million small objects that are
// made one after the other, never freed while the tree lives (nodes and OPs
// stay in their lists even when cancelled) and all freed together. Taking
// them from large blocks instead of the general heap saves its per-object
// header and rounding and most of the time spent allocating; a name is
// stored once, packed, instead of in a string of its own.
//
// Lifetime: the tree holds the arena, and so does every object made in it
// until it is freed. An OP a caller still holds after the tree is gone thus
// keeps the whole arena's memory (not its other objects) until it is let
// go; callers hand OPs out and drop them with the tree.
//
// Threads: objects are made only by the thread that works on the tree, but
// a caller may let go of the OPs it was handed on any thread, so releasing
// is an atomic count and the last release frees the blocks.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

class OPArena {
 public:
  // A new arena, held by the caller until Close().
  static OPArena* Open();
  // The caller's hold ends; the memory goes once every object is freed.
  void Close();

  // Storage for one object of `size` bytes aligned to `align`; the arena
  // stays until the object is freed with Free().
  void* Allocate(size_t size, size_t align);
  // Frees an object of `size` bytes made by Allocate() of any arena.
  static void Free(void* object, size_t size);
  // The arena an object made by Allocate() lives in.
  static OPArena* Of(const void* object);

  // A copy of `text` that lives as long as the arena, placed right before
  // the object made next.
  std::string_view CopyName(std::string_view text);

  // The arena that ArenaAllocator takes memory from on this thread (see MakeInArena).
  static OPArena*& Current();

 private:
  struct Block;
  OPArena() = default;
  ~OPArena();
  void AddBlock();
  void Unref(uint64_t count);

  // While the arena is open its count is kOpenBias minus the objects freed;
  // Close() adds the objects made, so the count reaches zero exactly when
  // the last of them is freed, without an atomic step per allocation.
  static constexpr uint64_t kOpenBias = uint64_t{1} << 62;
  std::atomic<uint64_t> count_{kOpenBias};
  uint64_t made_ = 0;
  Block* block_ = nullptr;        // the one being filled; blocks chain to older ones
  char* low_ = nullptr;           // the next object or name is placed here
  char* high_ = nullptr;          // the end of the block
  std::vector<std::unique_ptr<char[]>> long_names_;  // names too long for a block
};

// A stateless allocator over OPArena::Current(), for std::allocate_shared:
// the shared control block and the object then sit in the arena without an
// allocator copy of their own; freeing finds the arena from the address.
template <typename T>
struct ArenaAllocator {
  using value_type = T;
  ArenaAllocator() = default;
  template <typename U>
  ArenaAllocator(const ArenaAllocator<U>&) {}  // NOLINT: rebinding is implicit
  T* allocate(size_t n) { return static_cast<T*>(OPArena::Current()->Allocate(n * sizeof(T), alignof(T))); }
  void deallocate(T* object, size_t n) { OPArena::Free(object, n * sizeof(T)); }
  template <typename U>
  bool operator==(const ArenaAllocator<U>&) const { return true; }
  template <typename U>
  bool operator!=(const ArenaAllocator<U>&) const { return false; }
};

// std::make_shared, with the memory taken from `arena`.
template <typename T, typename... Args>
std::shared_ptr<T> MakeInArena(OPArena* arena, Args&&... args) {
  OPArena*& current = OPArena::Current();
  OPArena* const outer = current;
  current = arena;
  struct Restore {
    OPArena*& current;
    OPArena* outer;
    ~Restore() { current = outer; }
  } restore{current, outer};
  return std::allocate_shared<T>(ArenaAllocator<T>(), std::forward<Args>(args)...);
}

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
