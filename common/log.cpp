#include "common/log.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <vector>

#include "common/host.h"

namespace vellis {

namespace fileindex {
int log_level = LOG_INFO;
}  // namespace fileindex

namespace {

std::string StringPrintfV(const char* fmt, va_list ap) {
  char small[512];
  va_list copy;
  va_copy(copy, ap);
  int n = vsnprintf(small, sizeof(small), fmt, copy);
  va_end(copy);
  if (n < 0) return std::string();
  if (static_cast<size_t>(n) < sizeof(small)) return std::string(small, n);
  std::vector<char> big(static_cast<size_t>(n) + 1);
  vsnprintf(big.data(), big.size(), fmt, ap);
  return std::string(big.data(), n);
}

// "<file>:<line> (<pid>, <euid>) (<func>) ", the prefix of every line that
// names the calling process.
std::string ProcessPrefix(const char* file, int line, const char* func) {
  return StringPrintf("%s:%d (%d, %u) (%s) ", internal::SourceName(file), line,
                      static_cast<int>(getpid()), static_cast<unsigned>(geteuid()), func);
}

std::string ErrnoSuffix(int err) {
  if (err == 0) return std::string();
  char buf[256];
  // GNU strerror_r returns the text, which may not be in buf.
  return std::string(" [err: ") + strerror_r(err, buf, sizeof(buf)) + "]";
}

}  // namespace

std::string StringPrintf(const char* fmt, ...) {
  va_list ap;
  va_start(ap, fmt);
  std::string s = StringPrintfV(fmt, ap);
  va_end(ap);
  return s;
}

namespace internal {

const char* SourceName(const char* file) {
  const char* slash = strrchr(file, '/');
  return slash ? slash + 1 : file;
}

void ThrowCheckFailure(int saved_errno, const char* file, int line, const char* func,
                       const char* condition, ErrorCode code, const std::string& reason) {
  GetHost()->Syslog(LOG_ERR, ProcessPrefix(file, line, func) + "Failed [" + condition +
                                          "], reason: " + reason + ErrnoSuffix(saved_errno));
  errno = 0;
  throw Error(code, reason);
}

void LogWithErrno(int priority, const char* file, int line, const char* func,
                  const std::string& text) {
  int err = errno;
  GetHost()->Syslog(priority, ProcessPrefix(file, line, func) + text + ErrnoSuffix(err));
  errno = 0;
}

void LogPlain(int priority, const char* file, int line, const std::string& text) {
  int err = errno;  // logging must not disturb the caller's errno
  GetHost()->Syslog(priority, StringPrintf("%s:%d ", SourceName(file), line) + text);
  errno = err;
}

}  // namespace internal
}  // namespace vellis
