// An index of one tree node's children by name, for folders too wide for a
// linear scan of their children.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>

namespace vellis::fileindex {

struct OPNode;

// Open addressing with linear probing, in one allocation with its slots, so
// that a lookup touches the index once before the child it finds. A slot
// holds a child pointer tagged in its top 16 bits with bits of the name's
// hash, so a probe rarely visits a child that does not match. The index
// does not own the children. A slot is 64 bits wide on every target: a
// 32-bit pointer has no unused bits, so there it sits in the low half.
class alignas(8) ChildIndex {
 public:
  static uint32_t Hash(std::string_view name);

  // An empty index.
  static std::unique_ptr<ChildIndex> Make();

  // The indexed child named `name` (`hash` = Hash(name)), or null.
  OPNode* Find(std::string_view name, uint32_t hash) const;
  // Adds a child whose name is not indexed yet. A full index is replaced by
  // a larger one, so `index` may change.
  static void Insert(std::unique_ptr<ChildIndex>& index, OPNode* child, uint32_t hash);

  // How many leading entries of the node's `children` are indexed; kept by
  // the node, which indexes children appended behind its back on its next
  // lookup.
  size_t indexed = 0;

  // The slots follow the object in the same allocation.
  static void operator delete(void* p) { ::operator delete(p); }

 private:
  explicit ChildIndex(uint32_t capacity) : capacity_(capacity) {}
  static std::unique_ptr<ChildIndex> Make(uint32_t capacity);
  using Slot = uint64_t;
  static Slot Tag(uint32_t hash);
  Slot* slots() { return reinterpret_cast<Slot*>(this + 1); }
  const Slot* slots() const { return reinterpret_cast<const Slot*>(this + 1); }
  // Places a child known to be absent, in an index with room for it.
  void Place(OPNode* child, uint32_t hash);

  uint32_t capacity_;  // slots, a power of two
  uint32_t used_ = 0;
};

}  // namespace vellis::fileindex
