#include "fileindex/child_index.h"

#include <cstring>
#include <new>

#include "fileindex/optree.h"

namespace vellis::fileindex {
namespace {

// Slots tag the unused top 16 bits of a user-space pointer.
static_assert(sizeof(uintptr_t) == 8, "the child index tags 64-bit pointers");
constexpr int kTagShift = 48;
constexpr uintptr_t kPointerMask = (uintptr_t{1} << kTagShift) - 1;
constexpr uint32_t kFirstSlots = 8;

OPNode* Untag(uintptr_t slot) { return reinterpret_cast<OPNode*>(slot & kPointerMask); }

}  // namespace

uint32_t ChildIndex::Hash(std::string_view name) {
  uint64_t h = 0xcbf29ce484222325ULL;  // FNV-1a: names are short
  for (unsigned char c : name) h = (h ^ c) * 0x100000001b3ULL;
  h ^= h >> 33;
  h *= 0xff51afd7ed558ccdULL;
  h ^= h >> 33;
  return static_cast<uint32_t>(h);
}

// 16 bits of the hash, mixed apart from the low bits that pick the slot.
uintptr_t ChildIndex::Tag(uint32_t hash) {
  return static_cast<uintptr_t>((hash * 0x9E3779B1u) >> 16) << kTagShift;
}

std::unique_ptr<ChildIndex> ChildIndex::Make() { return Make(kFirstSlots); }

std::unique_ptr<ChildIndex> ChildIndex::Make(uint32_t capacity) {
  static_assert(sizeof(ChildIndex) % alignof(uintptr_t) == 0, "slots follow the object");
  void* mem = ::operator new(sizeof(ChildIndex) + capacity * sizeof(uintptr_t));
  std::unique_ptr<ChildIndex> index(new (mem) ChildIndex(capacity));
  memset(index->slots(), 0, capacity * sizeof(uintptr_t));
  return index;
}

OPNode* ChildIndex::Find(std::string_view name, uint32_t hash) const {
  const uintptr_t* s = slots();
  const uint32_t mask = capacity_ - 1;
  const uintptr_t tag = Tag(hash);
  for (uint32_t i = hash & mask;; i = (i + 1) & mask) {
    const uintptr_t slot = s[i];
    if (slot == 0) return nullptr;
    if ((slot & ~kPointerMask) == tag && Untag(slot)->name == name) return Untag(slot);
  }
}

void ChildIndex::Place(OPNode* child, uint32_t hash) {
  uintptr_t* s = slots();
  const uint32_t mask = capacity_ - 1;
  uint32_t i = hash & mask;
  while (s[i] != 0) i = (i + 1) & mask;
  s[i] = Tag(hash) | (reinterpret_cast<uintptr_t>(child) & kPointerMask);
  ++used_;
}

void ChildIndex::Insert(std::unique_ptr<ChildIndex>& index, OPNode* child, uint32_t hash) {
  // Linear probing stays short below three quarters full.
  if ((index->used_ + 1) * 4 > index->capacity_ * 3) {
    std::unique_ptr<ChildIndex> larger = Make(index->capacity_ * 2);
    larger->indexed = index->indexed;
    const uintptr_t* s = index->slots();
    for (uint32_t i = 0; i < index->capacity_; ++i) {
      if (s[i] != 0) larger->Place(Untag(s[i]), Hash(Untag(s[i])->name));
    }
    index = std::move(larger);
  }
  index->Place(child, hash);
}

}  // namespace vellis::fileindex
