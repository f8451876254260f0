#include "common/mutex.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

namespace vellis {
namespace {

// TryLock from another thread: whether the mutex is free right now.
bool FreeForOtherThread(Mutex& mutex) {
  bool got = false;
  std::thread t([&] {
    got = mutex.TryLock();
    if (got) mutex.Unlock();
  });
  t.join();
  return got;
}

TEST(MutexTest, TryLockFailsWhileHeldElsewhere) {
  Mutex mutex;
  ASSERT_TRUE(mutex.Lock());
  EXPECT_FALSE(FreeForOtherThread(mutex));
  ASSERT_TRUE(mutex.Unlock());
  EXPECT_TRUE(FreeForOtherThread(mutex));
  ASSERT_TRUE(mutex.TryLock());
  EXPECT_FALSE(FreeForOtherThread(mutex));
  EXPECT_TRUE(mutex.Unlock());
}

TEST(MutexTest, GuardHoldsForItsScope) {
  Mutex mutex;
  {
    LockMutex guard(mutex);
    EXPECT_FALSE(FreeForOtherThread(mutex));
  }
  EXPECT_TRUE(FreeForOtherThread(mutex));
  try {
    LockMutex guard(mutex);
    throw 1;
  } catch (int) {
  }
  EXPECT_TRUE(FreeForOtherThread(mutex)) << "an exception left the mutex held";
}

TEST(MutexTest, GuardSerialisesReadModifyWrite) {
  Mutex mutex;
  long counter = 0;
  std::vector<std::thread> threads;
  for (int t = 0; t < 2; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 3000; ++i) {
        LockMutex guard(mutex);
        long v = counter;
        std::this_thread::yield();
        counter = v + 1;
      }
    });
  }
  for (auto& t : threads) t.join();
  EXPECT_EQ(counter, 2 * 3000);
}

}  // namespace
}  // namespace vellis
