#include "common/large_alloc.h"

#include <sys/mman.h>

#include <cstdlib>

namespace vellis {

void* AllocateLarge(size_t bytes) {
  if (bytes < kHugePageBytes) return malloc(bytes);
  // Whole huge pages, aligned to one, so that the kernel can back them all.
  const size_t rounded = (bytes + kHugePageBytes - 1) / kHugePageBytes * kHugePageBytes;
  void* p = aligned_alloc(kHugePageBytes, rounded);
  // Only advice: without transparent huge pages the memory works the same.
  if (p != nullptr && !getenv("NOHUGE")) madvise(p, rounded, MADV_HUGEPAGE);
  return p;
}

void FreeLarge(void* p) { free(p); }

}  // namespace vellis
