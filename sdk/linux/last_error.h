// The Linux platform's per-thread last error, read back with QLIBCErrGet.
#pragma once

namespace vellis::sdk {

// Records `err` (an errno value or a PlatformErr) as the calling thread's
// last platform error.
void SetPlatformError(int err);

// The calling thread's last platform error; 0 when none was recorded.
int PlatformError();

// Records `err` and returns -1: the failure result of most platform calls.
// The failure site is forgotten.
int FailWith(int err);
// FailWith that also records where the failure was detected, for
// QLIBCErrorGetFile / QLIBCErrorGetLine: FailAt(err, __FILE__, __LINE__).
int FailAt(int err, const char* file, int line);

}  // namespace vellis::sdk
