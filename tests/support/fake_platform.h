// The test double of the platform seam.
//
// FakePlatform owns the clock, sleeps, random numbers and the system log, so
// that waits cost nothing and log lines can be read back; every other call
// is forwarded to the real Linux platform. A test that needs scripted answers
// derives from it and overrides just those calls.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "sdk/platform.h"

namespace vellis::testing {

class FakePlatform : public sdk::PlatformWrapper {
 public:
  FakePlatform();

  struct LogLine {
    int priority;
    std::string text;
  };

  int64_t Time() override;
  void Sleep(unsigned int seconds) override;
  void USleep(uint64_t microseconds) override;
  int Rand() override;
  void Syslog(int priority, const std::string& message) override;

  // The clock: Sleep and USleep advance it.
  void SetTime(int64_t now);
  // Rand returns these values in turn, then repeats the last one; a
  // deterministic sequence when none are given.
  void SetRandValues(std::vector<int> values);

  std::vector<LogLine> Logs() const;
  // Log lines that contain `needle`.
  std::vector<std::string> LogsContaining(const std::string& needle) const;
  void ClearLogs();

  std::vector<unsigned int> Sleeps() const;
  std::vector<uint64_t> USleeps() const;

 private:
  mutable std::mutex mu_;
  int64_t now_us_;
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
