#include "sdk/linux/last_error.h"

#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

// Per thread, as errno: a failure on one thread must not be read as another
// thread's reason.
thread_local int t_last_error = 0;

}  // namespace

void SetPlatformError(int err) { t_last_error = err; }

int PlatformError() { return t_last_error; }

int FailWith(int err) {
  t_last_error = err;
  return -1;
}

int LinuxPlatform::QLIBCErrGet() { return t_last_error; }

}  // namespace vellis::sdk
