// An index of one tree node's children by name, for folders too wide for a
// linear scan of their children.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

namespace vellis::fileindex {

struct OPNode;

// Open addressing with linear probing. A slot holds a child pointer tagged
// in its top 16 bits with bits of the name's hash, so a probe rarely visits
// a child that does not match. The index does not own the children.
class ChildIndex {
 public:
  static uint32_t Hash(std::string_view name);

  // The indexed child named `name` (`hash` = Hash(name)), or null.
  OPNode* Find(std::string_view name, uint32_t hash) const;
  // Adds a child whose name is not indexed yet.
  void Insert(OPNode* child, uint32_t hash);

  // How many leading entries of the node's `children` are indexed; kept by
  // the node, which indexes appended children on its next lookup.
  size_t indexed = 0;

 private:
  static uintptr_t Tag(uint32_t hash);
  std::vector<uintptr_t> slots_;
  size_t used_ = 0;
};

}  // namespace vellis::fileindex
