#include "common/host.h"

#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>

namespace vellis {
namespace {

// Serves processes that link common/ alone: the log and sleeps work, the
// platform's own calls do not exist.
class LibcHost : public Host {
 public:
  void Syslog(int priority, const std::string& line) override {
    syslog(priority, "%s", line.c_str());
  }
  void USleep(uint64_t microseconds) override { usleep(static_cast<useconds_t>(microseconds)); }
  int Rand() override { return rand(); }
  int FileCopy(const std::string&, const std::string&, bool, bool) override { return NoPlatform(); }
  int AclPermGet(const std::string&, int*) override { return NoPlatform(); }
  int DirIsMountPoint(const std::string&) override { return NoPlatform(); }
  int UserIds(const std::string&, uint32_t*, uint32_t*) override { return NoPlatform(); }

 private:
  static int NoPlatform() {
    errno = ENOSYS;
    return -1;
  }
};

// Built on first use and never destroyed, so that lines logged during
// static construction or destruction still have a host.
Host* LibcHostInstance() {
  static Host* host = new LibcHost();
  return host;
}

std::atomic<Host*> g_host{nullptr};

}  // namespace

Host* GetHost() {
  Host* host = g_host.load(std::memory_order_acquire);
  return host ? host : LibcHostInstance();
}

Host* SetHost(Host* host) {
  Host* old = g_host.exchange(host, std::memory_order_acq_rel);
  return old ? old : LibcHostInstance();
}

}  // namespace vellis
