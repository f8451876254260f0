#include "common/arena.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <new>

namespace vellis {
namespace {

// Blocks start small, so that a short-lived arena with a few objects costs
// little, and double up to a size at which one more block is cheap next to
// what is already held.
constexpr size_t kFirstBlock = 4096;
constexpr size_t kLargestBlock = 1u << 20;

}  // namespace

Arena* Arena::New() { return new Arena(); }

Arena::~Arena() {
  for (char* b : blocks_) free(b);
}

void Arena::Unref() {
  if (refs_.fetch_sub(1, std::memory_order_acq_rel) == 1) delete this;
}

void* Arena::Allocate(size_t bytes, size_t align) {
  const size_t pad = (align - reinterpret_cast<uintptr_t>(next_) % align) % align;
  if (left_ < bytes + pad) {
    size_t size = blocks_.empty() ? kFirstBlock : std::min(kLargestBlock, 2 * (block_bytes_));
    size = std::max(size, bytes);  // an outsized object gets a block of its own
    blocks_.reserve(blocks_.size() + 1);
    char* block = static_cast<char*>(malloc(size));  // aligned for any object
    if (block == nullptr) throw std::bad_alloc();
    blocks_.push_back(block);
    block_bytes_ += size;
    next_ = block + bytes;
    left_ = size - bytes;
    return block;
  }
  char* p = next_ + pad;
  next_ = p + bytes;
  left_ -= bytes + pad;
  return p;
}

}  // namespace vellis
