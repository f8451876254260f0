#include "common/arena.h"

#include <gtest/gtest.h>

#include <array>
#include <atomic>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace vellis {
namespace {

// Objects made through the allocator, some far larger than a block, keep the
// arena alive after its creator lets go, and their last references may go on
// two threads at once: exactly one frees the arena, after every object is
// done with it (the sanitizer build reports a double free, a use after free
// or a leak otherwise).
TEST(ArenaTest, ObjectsKeepTheArenaUntilTheLastOneGoesOnAnyThread) {
  auto text = [](size_t i) { return std::to_string(i) + std::string(i % 500, 'x'); };
  for (int round = 0; round < 50; ++round) {
    Arena* arena = Arena::New();
    ArenaAllocator<std::string> alloc(arena);
    std::vector<std::shared_ptr<std::string>> halves[2];
    for (size_t i = 0; i < 2000; ++i)
      halves[i % 2].push_back(std::allocate_shared<std::string>(alloc, text(i)));
    // An object far larger than a block gets a block of its own.
    auto big = std::allocate_shared<std::array<char, 200000>>(
        ArenaAllocator<std::array<char, 200000>>(arena));
    ASSERT_GE(arena->BlockBytes(), 200000u);
    arena->Unref();
    std::atomic<int> ready{0};
    std::atomic<bool> intact{true};
    auto drop = [&](size_t half) {
      for (ready.fetch_add(1); ready.load() < 2;) {
      }
      for (size_t i = 0; i < 1000; ++i) {
        if (*halves[half][i] != text(2 * i + half)) intact = false;
      }
      halves[half].clear();
      if (half == 0) big.reset();
    };
    std::thread a(drop, 0), b(drop, 1);
    a.join();
    b.join();
    EXPECT_TRUE(intact) << "round " << round;
  }
}

}  // namespace
}  // namespace vellis
