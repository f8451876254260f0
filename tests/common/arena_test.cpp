#include "common/arena.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdint>
#include <cstring>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace vellis {
namespace {

// Objects of mixed sizes and alignments, some far larger than a block, each
// keep their own bytes: no two allocations overlap and each is aligned.
TEST(ArenaTest, AllocationsAreAlignedAndDisjoint) {
  Arena* arena = Arena::New();
  struct Case {
    size_t bytes, align;
  } cases[] = {{1, 1}, {24, 8}, {144, 8}, {7, 2}, {16, 16}, {3000, 8}, {200000, 16}, {40, 4}};
  std::vector<std::pair<unsigned char*, size_t>> blocks;
  for (int round = 0; round < 200; ++round) {
    for (const auto& c : cases) {
      auto* p = static_cast<unsigned char*>(arena->Allocate(c.bytes, c.align));
      ASSERT_EQ(reinterpret_cast<uintptr_t>(p) % c.align, 0u) << c.bytes << "/" << c.align;
      memset(p, static_cast<int>(blocks.size() & 0xff), c.bytes);
      blocks.emplace_back(p, c.bytes);
    }
  }
  for (size_t i = 0; i < blocks.size(); ++i) {
    const auto [p, n] = blocks[i];
    for (size_t j = 0; j < n; j += 97) {
      ASSERT_EQ(p[j], static_cast<unsigned char>(i & 0xff)) << "allocation " << i << " overwritten";
    }
  }
  EXPECT_GE(arena->BlockBytes(), 200u * 200000);
  arena->Unref();
}

// Objects made through the allocator keep the arena alive after its creator
// lets go; the last one frees it (the sanitizer build reports a use after
// free or a leak if either half is wrong).
TEST(ArenaTest, ObjectsOutliveTheirCreatorsReference) {
  Arena* arena = Arena::New();
  std::vector<std::shared_ptr<std::string>> kept;
  for (int i = 0; i < 1000; ++i) {
    auto s = std::allocate_shared<std::string>(ArenaAllocator<std::string>(arena),
                                               "object " + std::to_string(i));
    if (i % 10 == 0) kept.push_back(std::move(s));
  }
  arena->Unref();
  ASSERT_EQ(kept.size(), 100u);
  for (size_t i = 0; i < kept.size(); ++i) EXPECT_EQ(*kept[i], "object " + std::to_string(i * 10));
  kept.clear();
}

// The last references may go on different threads at once: exactly one of
// them frees the arena, after every object is done with it (the sanitizer
// build reports a double free, a use after free or a leak otherwise).
TEST(ArenaTest, LastReferencesDroppedOnTwoThreadsFreeItOnce) {
  for (int round = 0; round < 50; ++round) {
    Arena* arena = Arena::New();
    std::vector<std::shared_ptr<std::string>> halves[2];
    for (int i = 0; i < 2000; ++i) {
      halves[i % 2].push_back(std::allocate_shared<std::string>(
          ArenaAllocator<std::string>(arena), "object " + std::to_string(i)));
    }
    arena->Unref();
    std::atomic<int> ready{0};
    std::atomic<bool> intact{true};
    auto drop = [&](int half) {
      ready.fetch_add(1);
      while (ready.load() < 2) {
      }
      for (size_t i = 0; i < halves[half].size(); ++i) {
        if (*halves[half][i] != "object " + std::to_string(2 * i + half)) intact = false;
        halves[half][i].reset();
      }
    };
    std::thread a(drop, 0), b(drop, 1);
    a.join();
    b.join();
    EXPECT_TRUE(intact) << "round " << round;
  }
}

}  // namespace
}  // namespace vellis
