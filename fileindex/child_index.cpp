#include "fileindex/child_index.h"

#include <functional>

#include "fileindex/optree.h"

namespace vellis::fileindex {
namespace {

// Slots tag the unused top 16 bits of a user-space pointer.
static_assert(sizeof(uintptr_t) == 8, "the child index tags 64-bit pointers");
constexpr int kTagShift = 48;
constexpr uintptr_t kPointerMask = (uintptr_t{1} << kTagShift) - 1;
constexpr size_t kFirstSlots = 32;

OPNode* Untag(uintptr_t slot) { return reinterpret_cast<OPNode*>(slot & kPointerMask); }

}  // namespace

uint32_t ChildIndex::Hash(std::string_view name) {
  uint64_t h = std::hash<std::string_view>()(name);
  h ^= h >> 33;
  h *= 0xff51afd7ed558ccdULL;
  h ^= h >> 33;
  return static_cast<uint32_t>(h);
}

// 16 bits of the hash, mixed apart from the low bits that pick the slot.
uintptr_t ChildIndex::Tag(uint32_t hash) {
  return static_cast<uintptr_t>((hash * 0x9E3779B1u) >> 16) << kTagShift;
}

OPNode* ChildIndex::Find(std::string_view name, uint32_t hash) const {
  if (slots_.empty()) return nullptr;
  const size_t mask = slots_.size() - 1;
  const uintptr_t tag = Tag(hash);
  for (size_t i = hash & mask;; i = (i + 1) & mask) {
    const uintptr_t slot = slots_[i];
    if (slot == 0) return nullptr;
    if ((slot & ~kPointerMask) == tag && Untag(slot)->name == name) return Untag(slot);
  }
}

void ChildIndex::Insert(OPNode* child, uint32_t hash) {
  // Linear probing stays short below three quarters full.
  if ((used_ + 1) * 4 > slots_.size() * 3) {
    std::vector<uintptr_t> old(slots_.empty() ? kFirstSlots : slots_.size() * 2, 0);
    old.swap(slots_);
    used_ = 0;
    for (uintptr_t slot : old) {
      if (slot != 0) Insert(Untag(slot), Hash(Untag(slot)->name));
    }
  }
  const size_t mask = slots_.size() - 1;
  size_t i = hash & mask;
  while (slots_[i] != 0) i = (i + 1) & mask;
  slots_[i] = Tag(hash) | (reinterpret_cast<uintptr_t>(child) & kPointerMask);
  ++used_;
}

}  // namespace vellis::fileindex
