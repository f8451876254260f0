// Memory for large, randomly accessed tables, backed by huge pages where
// the system offers them.
//
// A table of many megabytes that is probed at random (a hash index, an arena
// of tree nodes) misses the TLB on nearly every access with 4 KiB pages;
// with 2 MiB pages the same table needs a few entries. Where transparent huge
// pages are off, or for small sizes, this is plain malloc.
#pragma once

#include <cstddef>

namespace vellis {

// Blocks of at least this size are aligned and advised for huge pages.
constexpr size_t kHugePageBytes = 2u << 20;

// `bytes` of uninitialised memory, aligned for any object; null when the
// system has no memory left. Release with FreeLarge.
void* AllocateLarge(size_t bytes);
void FreeLarge(void* p);

// A standard allocator over AllocateLarge, for containers such as
// std::vector whose buffer grows large.
template <typename T>
struct LargeAllocator {
  using value_type = T;
  LargeAllocator() = default;
  template <typename U>
  LargeAllocator(const LargeAllocator<U>&) {}  // NOLINT: converting, as allocators are
  T* allocate(size_t n);
  void deallocate(T* p, size_t) { FreeLarge(p); }
  template <typename U>
  bool operator==(const LargeAllocator<U>&) const {
    return true;
  }
  template <typename U>
  bool operator!=(const LargeAllocator<U>&) const {
    return false;
  }
};

}  // namespace vellis

#include <new>

template <typename T>
T* vellis::LargeAllocator<T>::allocate(size_t n) {
  if (n > static_cast<size_t>(-1) / sizeof(T)) throw std::bad_array_new_length();
  void* p = AllocateLarge(n * sizeof(T));
  if (p == nullptr) throw std::bad_alloc();
  return static_cast<T*>(p);
}
