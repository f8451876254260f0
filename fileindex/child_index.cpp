#include "fileindex/child_index.h"

#include <cstring>
#include <new>

#include "fileindex/optree.h"

namespace vellis::fileindex {
namespace {

// Slots tag the top 16 bits of a 64-bit word holding a user-space pointer:
// unused by a 64-bit pointer, above a 32-bit one.
static_assert(sizeof(uintptr_t) == 4 || sizeof(uintptr_t) == 8, "a pointer fits below the tag");
constexpr int kTagShift = 48;
constexpr uint64_t kPointerMask = (uint64_t{1} << kTagShift) - 1;
constexpr uint32_t kFirstSlots = 8;

OPNode* Untag(uint64_t slot) {
  return reinterpret_cast<OPNode*>(static_cast<uintptr_t>(slot & kPointerMask));
}

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
ChildIndex::Slot ChildIndex::Tag(uint32_t hash) {
  return static_cast<Slot>((hash * 0x9E3779B1u) >> 16) << kTagShift;
}

std::unique_ptr<ChildIndex> ChildIndex::Make() { return Make(kFirstSlots); }

std::unique_ptr<ChildIndex> ChildIndex::Make(uint32_t capacity) {
  static_assert(sizeof(ChildIndex) % alignof(Slot) == 0, "slots follow the object");
  void* mem = ::operator new(sizeof(ChildIndex) + capacity * sizeof(Slot));
  std::unique_ptr<ChildIndex> index(new (mem) ChildIndex(capacity));
  memset(index->slots(), 0, capacity * sizeof(Slot));
  return index;
}

OPNode* ChildIndex::Find(std::string_view name, uint32_t hash) const {
  const Slot* s = slots();
  const uint32_t mask = capacity_ - 1;
  const Slot tag = Tag(hash);
  for (uint32_t i = hash & mask;; i = (i + 1) & mask) {
    const Slot slot = s[i];
    if (slot == 0) return nullptr;
    if ((slot & ~kPointerMask) == tag && Untag(slot)->name == name) return Untag(slot);
  }
}

void ChildIndex::Place(OPNode* child, uint32_t hash) {
  Slot* s = slots();
  const uint32_t mask = capacity_ - 1;
  uint32_t i = hash & mask;
  while (s[i] != 0) i = (i + 1) & mask;
  s[i] = Tag(hash) | (static_cast<Slot>(reinterpret_cast<uintptr_t>(child)) & kPointerMask);
  ++used_;
}

void ChildIndex::Insert(std::unique_ptr<ChildIndex>& index, OPNode* child, uint32_t hash) {
  // Linear probing stays short below three quarters full.
  if ((index->used_ + 1) * 4 > index->capacity_ * 3) {
    std::unique_ptr<ChildIndex> larger = Make(index->capacity_ * 2);
    larger->indexed = index->indexed;
    const Slot* s = index->slots();
    for (uint32_t i = 0; i < index->capacity_; ++i) {
      if (s[i] != 0) larger->Place(Untag(s[i]), Hash(Untag(s[i])->name));
    }
    index = std::move(larger);
  }
  index->Place(child, hash);
}

}  // namespace vellis::fileindex
