// The real platform on an ordinary Linux machine. See docs/platform.md for
// what each call does here.
#pragma once

#include "sdk/platform.h"

namespace vellis::sdk {

class LinuxPlatform : public Platform {
 public:
  int64_t Time() override;
  void Sleep(unsigned int seconds) override;
  void USleep(uint64_t microseconds) override;
  int Rand() override;
  void Syslog(int priority, const std::string& message) override;

  int QORUACLPermGet(const std::string& path, int* perm) override;
  int QORUFSDirIsMntPoint(const std::string& path) override;
  int QORUFileCopy(const std::string& from, const std::string& to,
                   const CopyArgs& args) override;

  int QORUUserGet(const std::string& name, UserInfo* out) override;

  // In sdk/linux/content_extract.cpp.
  int ParseFile(const std::string& path, const Json::Value& options, Json::Value* doc) override;
};

}  // namespace vellis::sdk
