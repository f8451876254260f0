// Log lines and the failure-check convention.
//
// Every line goes to the system log through the host (common/host.h), which
// the platform layer forwards to its seam, so tests can read them. Source names are the
// basename of the real file; pid and euid are the calling process's.
//
// VELLIS_THROW_IF(failed, code, reason): when `failed` is true, writes
//   "<file>:<line> (<pid>, <euid>) (<function>) Failed [<failed>], reason: <reason> [err: %m]"
// at priority 3 (without " [err: %m]" when errno is 0), sets errno to 0 and
// throws Error(code, reason). `failed` is the failure condition as written in
// the source; `reason` is evaluated only on failure, after errno is saved.
#pragma once

#include <syslog.h>

#include <cstdarg>
#include <string>

#include "common/error.h"

namespace vellis {

namespace fileindex {
// Debug lines are written only when this is 7 (LOG_DEBUG). Default 6.
extern int log_level;
}  // namespace fileindex

// printf into a std::string.
std::string StringPrintf(const char* fmt, ...) __attribute__((format(printf, 1, 2)));

namespace internal {

// The basename of a source path such as __FILE__.
const char* SourceName(const char* file);

// Writes the failure line described above for a saved errno, resets errno
// and throws Error(code, reason).
[[noreturn]] void ThrowCheckFailure(int saved_errno, const char* file, int line, const char* func,
                                    const char* condition, ErrorCode code,
                                    const std::string& reason);

// "<file>:<line> (<pid>, <euid>) (<func>) <text>" plus " [err: %m]" when
// errno is not 0; errno is reset to 0 afterwards.
void LogWithErrno(int priority, const char* file, int line, const char* func,
                  const std::string& text);

// "<file>:<line> <text>".
void LogPlain(int priority, const char* file, int line, const std::string& text);

}  // namespace internal
}  // namespace vellis

#define VELLIS_THROW_IF(failed, code, reason)                                                 \
  do {                                                                                        \
    if (failed) {                                                                             \
      int vellis_saved_errno_ = errno;                                                        \
      ::vellis::internal::ThrowCheckFailure(vellis_saved_errno_, __FILE__, __LINE__, __func__, \
                                            #failed, (code), (reason));                       \
    }                                                                                         \
  } while (0)

// Error-priority line with the pid/euid/function prefix and the errno suffix.
#define VELLIS_LOG_ERRNO(...)                                                         \
  ::vellis::internal::LogWithErrno(LOG_ERR, __FILE__, __LINE__, __func__,             \
                                   ::vellis::StringPrintf(__VA_ARGS__))

// Error-priority line with only the "<file>:<line> " prefix.
#define VELLIS_LOG_ERR(...) \
  ::vellis::internal::LogPlain(LOG_ERR, __FILE__, __LINE__, ::vellis::StringPrintf(__VA_ARGS__))

// Debug line, written only when fileindex::log_level is 7.
#define VELLIS_LOG_DEBUG(...)                                                          \
  do {                                                                                 \
    if (::vellis::fileindex::log_level == LOG_DEBUG)                                   \
      ::vellis::internal::LogPlain(LOG_DEBUG, __FILE__, __LINE__,                      \
                                   ::vellis::StringPrintf(__VA_ARGS__));               \
  } while (0)
