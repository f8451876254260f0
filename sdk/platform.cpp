#include "sdk/platform.h"

#include <atomic>

#include "common/host.h"
#include "common/mutex.h"
#include "sdk/credentials.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

Platform* DefaultPlatform() {
  static LinuxPlatform* linux_platform = new LinuxPlatform();  // never destroyed
  return linux_platform;
}

std::atomic<Platform*> g_platform{nullptr};

// common/'s view of the platform: every call goes to whichever platform is
// installed at the time of the call.
class PlatformHost : public Host {
 public:
  void Syslog(int priority, const std::string& line) override {
    GetPlatform()->Syslog(priority, line);
  }
  void USleep(uint64_t microseconds) override { GetPlatform()->USleep(microseconds); }
  int Rand() override { return GetPlatform()->Rand(); }
  int FileCopy(const std::string& from, const std::string& to, bool overwrite,
               bool remove_source) override {
    CopyArgs args;
    args.overwrite = overwrite;
    args.remove_source = remove_source;
    return GetPlatform()->QORUFileCopy(from, to, args);
  }
  int AclPermGet(const std::string& path, int* perm) override {
    return GetPlatform()->QORUACLPermGet(path, perm);
  }
  int DirIsMountPoint(const std::string& path) override {
    return GetPlatform()->QORUFSDirIsMntPoint(path);
  }
  int UserIds(const std::string& name, uint32_t* uid, uint32_t* gid) override {
    UserInfo user;
    LockMutex lock(SDKMutex());
    int rc = GetPlatform()->QORUUserGet(name, &user);
    if (rc < 0) return rc;
    *uid = user.uid;
    *gid = user.gid;
    return 0;
  }
};

// Installed when the library is loaded, before any caller can log; never
// destroyed, so that lines logged at exit still reach the platform.
[[maybe_unused]] const bool g_host_installed = [] {
  SetHost(new PlatformHost());
  return true;
}();

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
