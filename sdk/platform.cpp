#include "sdk/platform.h"

#include <atomic>

#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

Platform* DefaultPlatform() {
  static LinuxPlatform* linux_platform = new LinuxPlatform();  // never destroyed
  return linux_platform;
}

std::atomic<Platform*> g_platform{nullptr};

}  // namespace

Platform* GetPlatform() {
  Platform* p = g_platform.load(std::memory_order_acquire);
  return p ? p : DefaultPlatform();
}

Platform* SetPlatform(Platform* platform) {
  Platform* old = g_platform.exchange(platform, std::memory_order_acq_rel);
  return old ? old : DefaultPlatform();
}

}  // namespace vellis::sdk
