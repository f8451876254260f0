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
  using SleepHook = std::function<void(unsigned int seconds, size_t sleeps_so_far)>;
  using ParseHook = std::function<int(const std::string&, const Json::Value&, Json::Value*)>;
  // Runs `hook` after each Sleep has been recorded (the count includes it).
  void SetOnSleep(SleepHook hook) { on_sleep_ = std::move(hook); }
  // Answers ParseFile with `hook` instead of the real extraction.
  void SetParseFile(ParseHook hook) { parse_file_ = std::move(hook); }

  void Sleep(unsigned int seconds) override {
    FakeSharePlatform::Sleep(seconds);
    if (on_sleep_) on_sleep_(seconds, Sleeps().size());
  }
  int ParseFile(const std::string& path, const Json::Value& options, Json::Value* doc) override {
    return parse_file_ ? parse_file_(path, options, doc)
                       : FakeSharePlatform::ParseFile(path, options, doc);
  }

 private:
  SleepHook on_sleep_;
  ParseHook parse_file_;
};

}  // namespace vellis::testing
