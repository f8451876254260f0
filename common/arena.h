// A bump allocator for many small objects that die together, and a standard
// allocator on top of it for std::allocate_shared.
//
// An arena hands out memory from large blocks and frees the blocks all at
// once, when the last reference to it is dropped. Its creator holds one
// reference, and every object allocated through ArenaAllocator holds one
// until it is deallocated, so an object that outlives its creator (a shared
// pointer kept by a caller) keeps the arena's memory alive.
//
// Thread safety: Allocate is not thread-safe (one thread allocates); Ref and
// Unref are, so the last holder may release the arena from any thread.
#pragma once

#include <atomic>
#include <cstddef>
#include <vector>

namespace vellis {

class Arena {
 public:
  // A new, empty arena with one reference, the caller's.
  static Arena* New();

  Arena(const Arena&) = delete;
  Arena& operator=(const Arena&) = delete;

  // `bytes` of uninitialised memory aligned to `align` (a power of two no
  // larger than alignof(std::max_align_t)), valid until the arena is freed.
  // Throws std::bad_alloc when the system has no memory left.
  void* Allocate(size_t bytes, size_t align);

  void Ref() { refs_.fetch_add(1, std::memory_order_relaxed); }
  // Drops one reference; the last one frees the arena and all its memory.
  void Unref();

  // Bytes taken from the system so far.
  size_t BlockBytes() const { return block_bytes_; }

 private:
  Arena() = default;
  ~Arena();

  std::atomic<size_t> refs_{1};
  std::vector<char*> blocks_;
  char* next_ = nullptr;   // first free byte of the newest block
  size_t left_ = 0;        // free bytes behind next_
  size_t block_bytes_ = 0;
};

// Allocates from an arena and references it per live allocation. Meant for
// std::allocate_shared, which allocates exactly once per object.
template <typename T>
class ArenaAllocator {
 public:
  using value_type = T;

  explicit ArenaAllocator(Arena* arena) : arena_(arena) {}
  template <typename U>
  ArenaAllocator(const ArenaAllocator<U>& other) : arena_(other.arena()) {}  // NOLINT

  T* allocate(size_t n) {
    void* p = arena_->Allocate(n * sizeof(T), alignof(T));
    arena_->Ref();
    return static_cast<T*>(p);
  }
  // The memory itself is reclaimed with the arena.
  void deallocate(T*, size_t) { arena_->Unref(); }

  Arena* arena() const { return arena_; }

  template <typename U>
  bool operator==(const ArenaAllocator<U>& other) const {
    return arena_ == other.arena();
  }
  template <typename U>
  bool operator!=(const ArenaAllocator<U>& other) const {
    return arena_ != other.arena();
  }

 private:
  Arena* arena_;
};

}  // namespace vellis
