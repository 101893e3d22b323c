#include "fileindex/queue/op_arena.h"

#include <sys/mman.h>

#include <cstring>
#include <new>

// Under the address sanitizer the arena marks what is not handed out, and
// every object once freed, as unusable: reading a freed node is caught as
// it would be on the heap.
#if defined(__SANITIZE_ADDRESS__)
#define CORV_ARENA_ASAN 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define CORV_ARENA_ASAN 1
#endif
#endif
#ifdef CORV_ARENA_ASAN
#include <sanitizer/asan_interface.h>
#define CORV_POISON(address, size) ASAN_POISON_MEMORY_REGION(address, size)
#define CORV_UNPOISON(address, size) ASAN_UNPOISON_MEMORY_REGION(address, size)
#else
#define CORV_POISON(address, size) ((void)(address), (void)(size))
#define CORV_UNPOISON(address, size) ((void)(address), (void)(size))
#endif

namespace corvlumex {
namespace fileindex {
namespace {

// Blocks are aligned to their size, so the arena of any object is found
// from its address. Pages of a block that are never written cost nothing,
// so a short queue's tree uses little more than the pages it fills; a
// large tree's later blocks ask for huge pages, which take one page fault
// instead of 512.
constexpr size_t kBlockSize = size_t{2} << 20;
// Longer names (no file system allows them, but a queue line may carry
// anything) get memory of their own rather than most of a block.
constexpr size_t kLongName = 4096;

}  // namespace

struct OPArena::Block {
  OPArena* arena;
  Block* older;
};

OPArena* OPArena::Open() { return new OPArena(); }

OPArena*& OPArena::Current() {
  static thread_local OPArena* current = nullptr;
  return current;
}

OPArena::~OPArena() {
  while (block_ != nullptr) {
    Block* older = block_->older;
    CORV_UNPOISON(block_, kBlockSize);
    munmap(block_, kBlockSize);
    block_ = older;
  }
}

void OPArena::AddBlock() {
  // Map twice the size and keep the aligned block inside it.
  void* mapped = mmap(nullptr, 2 * kBlockSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (mapped == MAP_FAILED) throw std::bad_alloc();
  const uintptr_t start = reinterpret_cast<uintptr_t>(mapped);
  const uintptr_t aligned = (start + kBlockSize - 1) & ~(kBlockSize - 1);
  if (aligned > start) munmap(mapped, aligned - start);
  const uintptr_t tail = start + 2 * kBlockSize - (aligned + kBlockSize);
  if (tail > 0) munmap(reinterpret_cast<void*>(aligned + kBlockSize), tail);
  if (block_ != nullptr) madvise(reinterpret_cast<void*>(aligned), kBlockSize, MADV_HUGEPAGE);
  Block* block = reinterpret_cast<Block*>(aligned);
  block->arena = this;
  block->older = block_;
  block_ = block;
  low_ = reinterpret_cast<char*>(block + 1);
  high_ = reinterpret_cast<char*>(aligned + kBlockSize);
  CORV_POISON(low_, high_ - low_);
}

void* OPArena::Allocate(size_t size, size_t align) {
  if (size > kBlockSize / 8) throw std::bad_alloc();  // only small records live here
  for (;;) {
    const uintptr_t at = (reinterpret_cast<uintptr_t>(low_) + align - 1) & ~(align - 1);
    if (low_ != nullptr && at + size <= reinterpret_cast<uintptr_t>(high_)) {
      low_ = reinterpret_cast<char*>(at + size);
      ++made_;
      CORV_UNPOISON(reinterpret_cast<void*>(at), size);
      return reinterpret_cast<void*>(at);
    }
    AddBlock();
  }
}

OPArena* OPArena::Of(const void* object) {
  return reinterpret_cast<const Block*>(reinterpret_cast<uintptr_t>(object) & ~(kBlockSize - 1))->arena;
}

void OPArena::Free(void* object, size_t size) {
  OPArena* arena = Of(object);
  CORV_POISON(object, size);
  arena->Unref(1);
}

std::string_view OPArena::CopyName(std::string_view text) {
  if (text.empty()) return std::string_view();
  if (text.size() > kLongName) {
    long_names_.emplace_back(new char[text.size()]);
    memcpy(long_names_.back().get(), text.data(), text.size());
    return std::string_view(long_names_.back().get(), text.size());
  }
  // Placed where the next object goes, so a node made right after its name
  // has it next door.
  if (low_ == nullptr || static_cast<size_t>(high_ - low_) < text.size()) AddBlock();
  char* name = low_;
  low_ += text.size();
  CORV_UNPOISON(name, text.size());
  memcpy(name, text.data(), text.size());
  return std::string_view(name, text.size());
}

void OPArena::Unref(uint64_t count) {
  if (count_.fetch_sub(count, std::memory_order_acq_rel) == count) delete this;
}

void OPArena::Close() {
  // Turns the bias into the number of objects made; unsigned arithmetic
  // wraps, so adding (made - bias) is exact.
  const uint64_t add = made_ - kOpenBias;
  if (count_.fetch_add(add, std::memory_order_acq_rel) + add == 0) delete this;
}

}  // namespace fileindex
}  // namespace corvlumex
