// The test double of the platform seam.
//
// FakePlatform owns the clock, sleeps, random numbers and the system log, so
// that waits cost nothing and log lines can be read back; every other call
// is forwarded to the real Linux platform. A test that needs scripted answers
// derives from it and overrides just those calls.
#pragma once

#include <algorithm>
#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "sdk/linux/linux_platform.h"
#include "sdk/platform.h"

namespace vellis::testing {

class FakePlatform : public sdk::PlatformWrapper {
 public:
  FakePlatform() : PlatformWrapper(Real()) {}

  struct LogLine {
    int priority;
    std::string text;
  };

  // The clock: Sleep and USleep advance it.
  int64_t Time() override { return Get(now_us_) / 1000000; }
  void SetTime(int64_t now) { Set(now_us_, now * 1000000); }
  void Sleep(unsigned int seconds) override { Wait(&sleeps_, seconds, seconds * 1000000LL); }
  void USleep(uint64_t microseconds) override { Wait(&usleeps_, microseconds, microseconds); }
  std::vector<unsigned int> Sleeps() const { return Get(sleeps_); }
  std::vector<uint64_t> USleeps() const { return Get(usleeps_); }

  // Rand returns these values in turn, then repeats the last one; a
  // deterministic sequence when none are given.
  void SetRandValues(std::vector<int> values) {
    Locked([&] {
      rand_values_ = std::move(values);
      rand_next_ = 0;
    });
  }
  int Rand() override {
    return Locked([&] {
      if (rand_values_.empty()) return static_cast<int>((lcg_ = lcg_ * 1103515245u + 12345u) >> 1);
      return rand_values_[std::min(rand_next_++, rand_values_.size() - 1)];
    });
  }

  void Syslog(int priority, const std::string& message) override {
    Locked([&] { logs_.push_back({priority, message}); });
  }
  std::vector<LogLine> Logs() const { return Get(logs_); }
  // Log lines that contain `needle`.
  std::vector<std::string> LogsContaining(const std::string& needle) const {
    std::vector<std::string> out;
    for (const LogLine& l : Logs()) {
      if (l.text.find(needle) != std::string::npos) out.push_back(l.text);
    }
    return out;
  }
  void ClearLogs() { Set(logs_, {}); }

 protected:
  // Runs `f` under the fake's lock (not reentrant: `f` must not call back
  // into a locked method).
  template <typename F>
  auto Locked(F f) const -> decltype(f()) {
    std::lock_guard<std::mutex> lock(mu_);
    return f();
  }
  // A member read or written under the fake's lock.
  template <typename T>
  T Get(const T& member) const {
    return Locked([&] { return member; });
  }
  template <typename T>
  void Set(T& member, T value) {
    Locked([&] { member = std::move(value); });
  }

 private:
  static sdk::Platform* Real() {
    static sdk::Platform* real = new sdk::LinuxPlatform();  // used until exit
    return real;
  }
  template <typename T>
  void Wait(std::vector<T>* record, T amount, int64_t us) {
    Locked([&] {
      record->push_back(amount);
      now_us_ += us;
    });
  }

  mutable std::mutex mu_;
  int64_t now_us_ = 1700000000LL * 1000000;
  std::vector<int> rand_values_;
  size_t rand_next_ = 0;
  uint32_t lcg_ = 12345;
  std::vector<LogLine> logs_;
  std::vector<unsigned int> sleeps_;
  std::vector<uint64_t> usleeps_;
};

// Installs a platform for the scope and restores the previous one.
class ScopedPlatform {
 public:
  explicit ScopedPlatform(sdk::Platform* platform) : old_(sdk::SetPlatform(platform)) {}
  ~ScopedPlatform() { sdk::SetPlatform(old_); }
  ScopedPlatform(const ScopedPlatform&) = delete;
  ScopedPlatform& operator=(const ScopedPlatform&) = delete;

 private:
  sdk::Platform* old_;
};

}  // namespace vellis::testing
