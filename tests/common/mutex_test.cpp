#include "common/mutex.h"

#include <gtest/gtest.h>

#include <thread>

namespace vellis {
namespace {

TEST(MutexTest, GuardExcludesOtherThreadsForItsScopeEvenWhenLeftByAnException) {
  Mutex mutex;
  auto free_elsewhere = [&] {
    bool got = false;
    std::thread([&] { got = mutex.TryLock() && mutex.Unlock(); }).join();
    return got;
  };
  try {
    LockMutex guard(mutex);
    EXPECT_FALSE(free_elsewhere());
    throw 1;
  } catch (int) {
  }
  EXPECT_TRUE(free_elsewhere()) << "an exception left the mutex held";
}

}  // namespace
}  // namespace vellis
