// A FakeSharePlatform whose sleeps and content extraction a test can
// script.
#pragma once

#include <json/json.h>

#include <functional>
#include <string>

#include "tests/support/fake_share_platform.h"

namespace vellis::testing {

class ScriptedPlatform : public FakeSharePlatform {
 public:
  // Runs `hook` after each Sleep has been recorded (the count includes it).
  void SetOnSleep(std::function<void(unsigned int seconds, size_t sleeps_so_far)> hook) {
    on_sleep_ = std::move(hook);
  }
  // Answers ParseFile with `hook` instead of the real extraction.
  void SetParseFile(
      std::function<int(const std::string& path, const Json::Value& options, Json::Value* doc)>
          hook) {
    parse_file_ = std::move(hook);
  }

  void Sleep(unsigned int seconds) override {
    FakeSharePlatform::Sleep(seconds);
    if (on_sleep_) on_sleep_(seconds, Sleeps().size());
  }
  int ParseFile(const std::string& path, const Json::Value& options, Json::Value* doc) override {
    return parse_file_ ? parse_file_(path, options, doc)
                       : FakeSharePlatform::ParseFile(path, options, doc);
  }

 private:
  std::function<void(unsigned int, size_t)> on_sleep_;
  std::function<int(const std::string&, const Json::Value&, Json::Value*)> parse_file_;
};

}  // namespace vellis::testing
