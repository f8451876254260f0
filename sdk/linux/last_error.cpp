#include "sdk/linux/last_error.h"

#include "common/log.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

// Per thread, as errno: a failure on one thread must not be read as another
// thread's reason.
thread_local int t_last_error = 0;
thread_local const char* t_last_file = nullptr;  // __FILE__ literals only
thread_local int t_last_line = 0;

}  // namespace

void SetPlatformError(int err) {
  t_last_error = err;
  t_last_file = nullptr;
  t_last_line = 0;
}

int PlatformError() { return t_last_error; }

int FailWith(int err) {
  SetPlatformError(err);
  return -1;
}

int FailAt(int err, const char* file, int line) {
  t_last_error = err;
  t_last_file = file;
  t_last_line = line;
  return -1;
}

int LinuxPlatform::QLIBCErrGet() { return t_last_error; }

std::string LinuxPlatform::QLIBCErrorGetFile() {
  return t_last_file ? internal::SourceName(t_last_file) : "";
}

int LinuxPlatform::QLIBCErrorGetLine() { return t_last_line; }

}  // namespace vellis::sdk
