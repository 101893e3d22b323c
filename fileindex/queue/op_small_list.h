// A list with the interface of a std::vector (the parts a node needs) that
// keeps its first element in place. Most nodes of an operation tree carry
// exactly one OP; a vector would give each of them a heap block of its own
// (and a cache miss to reach it) for that one entry.
#pragma once

#include <cstddef>
#include <cstdint>
#include <new>
#include <utility>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

template <typename T>
class SmallList {
 public:
  using value_type = T;
  using iterator = T*;
  using const_iterator = const T*;

  SmallList() noexcept {}
  SmallList(const SmallList& other) {
    for (const T& item : other) push_back(item);
  }
  SmallList& operator=(const SmallList& other) {
    if (this != &other) {
      SmallList copy(other);
      swap(copy);
    }
    return *this;
  }
  ~SmallList() {
    clear();
    if (capacity_ > 1) ::operator delete(many_);
  }

  size_t size() const { return size_; }
  bool empty() const { return size_ == 0; }
  size_t capacity() const { return capacity_; }
  T* data() { return capacity_ == 1 ? reinterpret_cast<T*>(&one_) : many_; }
  const T* data() const { return capacity_ == 1 ? reinterpret_cast<const T*>(&one_) : many_; }
  T& operator[](size_t i) { return data()[i]; }
  const T& operator[](size_t i) const { return data()[i]; }
  T& back() { return data()[size_ - 1]; }
  const T& back() const { return data()[size_ - 1]; }
  iterator begin() { return data(); }
  iterator end() { return data() + size_; }
  const_iterator begin() const { return data(); }
  const_iterator end() const { return data() + size_; }

  void push_back(const T& item) { emplace_back(item); }
  void push_back(T&& item) { emplace_back(std::move(item)); }
  template <typename... Args>
  T& emplace_back(Args&&... args) {
    if (size_ == capacity_) {
      // Built before the move: `args` may refer to an element of this list.
      T item(std::forward<Args>(args)...);
      Grow();
      return *new (data() + size_++) T(std::move(item));
    }
    return *new (data() + size_++) T(std::forward<Args>(args)...);
  }
  // Shrinks to `count` elements, or grows with default-made ones.
  void resize(size_t count) {
    while (size_ > count) data()[--size_].~T();
    while (size_ < count) emplace_back();
  }
  void clear() { resize(0); }
  void swap(SmallList& other) {
    SmallList held(std::move(*this));
    *this = std::move(other);
    other = std::move(held);
  }
  SmallList(SmallList&& other) noexcept { TakeFrom(other); }
  SmallList& operator=(SmallList&& other) noexcept {
    if (this != &other) {
      this->~SmallList();
      new (this) SmallList();
      TakeFrom(other);
    }
    return *this;
  }

 private:
  void Grow() {
    const uint32_t capacity = capacity_ == 1 ? 4 : capacity_ * 2;
    T* grown = static_cast<T*>(::operator new(sizeof(T) * capacity));
    T* old = data();
    for (uint32_t i = 0; i < size_; ++i) {
      new (grown + i) T(std::move(old[i]));
      old[i].~T();
    }
    if (capacity_ > 1) ::operator delete(many_);
    many_ = grown;
    capacity_ = capacity;
  }
  void TakeFrom(SmallList& other) noexcept {
    if (other.capacity_ > 1) {
      many_ = other.many_;
      capacity_ = other.capacity_;
      size_ = other.size_;
      other.capacity_ = 1;
      other.size_ = 0;
      return;
    }
    if (other.size_ == 1) {
      new (&one_) T(std::move(*other.data()));
      other.data()->~T();
      size_ = 1;
      other.size_ = 0;
    }
  }

  // With capacity 1 the element sits in `one_`; beyond, in `many_`.
  union {
    alignas(T) unsigned char one_[sizeof(T)];
    T* many_;
  };
  uint32_t size_ = 0;
  uint32_t capacity_ = 1;
};

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
