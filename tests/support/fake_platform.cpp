#include "tests/support/fake_platform.h"

#include "sdk/linux/linux_platform.h"

namespace vellis::testing {
namespace {

sdk::Platform* RealPlatform() {
  static sdk::LinuxPlatform* real = new sdk::LinuxPlatform();
  return real;
}

}  // namespace

FakePlatform::FakePlatform() : PlatformWrapper(RealPlatform()), now_us_(1700000000LL * 1000000) {}

int64_t FakePlatform::Time() {
  std::lock_guard<std::mutex> lock(mu_);
  return now_us_ / 1000000;
}

void FakePlatform::Sleep(unsigned int seconds) {
  std::lock_guard<std::mutex> lock(mu_);
  sleeps_.push_back(seconds);
  now_us_ += static_cast<int64_t>(seconds) * 1000000;
}

void FakePlatform::USleep(uint64_t microseconds) {
  std::lock_guard<std::mutex> lock(mu_);
  usleeps_.push_back(microseconds);
  now_us_ += static_cast<int64_t>(microseconds);
}

int FakePlatform::Rand() {
  std::lock_guard<std::mutex> lock(mu_);
  if (!rand_values_.empty()) {
    int v = rand_values_[rand_next_];
    if (rand_next_ + 1 < rand_values_.size()) ++rand_next_;
    return v;
  }
  lcg_ = lcg_ * 1103515245u + 12345u;
  return static_cast<int>((lcg_ >> 1) & 0x7fffffff);
}

void FakePlatform::Syslog(int priority, const std::string& message) {
  std::lock_guard<std::mutex> lock(mu_);
  logs_.push_back({priority, message});
}

void FakePlatform::SetTime(int64_t now) {
  std::lock_guard<std::mutex> lock(mu_);
  now_us_ = now * 1000000;
}

void FakePlatform::SetRandValues(std::vector<int> values) {
  std::lock_guard<std::mutex> lock(mu_);
  rand_values_ = std::move(values);
  rand_next_ = 0;
}

std::vector<FakePlatform::LogLine> FakePlatform::Logs() const {
  std::lock_guard<std::mutex> lock(mu_);
  return logs_;
}

std::vector<std::string> FakePlatform::LogsContaining(const std::string& needle) const {
  std::lock_guard<std::mutex> lock(mu_);
  std::vector<std::string> out;
  for (const auto& l : logs_) {
    if (l.text.find(needle) != std::string::npos) out.push_back(l.text);
  }
  return out;
}

void FakePlatform::ClearLogs() {
  std::lock_guard<std::mutex> lock(mu_);
  logs_.clear();
}

std::vector<unsigned int> FakePlatform::Sleeps() const {
  std::lock_guard<std::mutex> lock(mu_);
  return sleeps_;
}

std::vector<uint64_t> FakePlatform::USleeps() const {
  std::lock_guard<std::mutex> lock(mu_);
  return usleeps_;
}

}  // namespace vellis::testing
