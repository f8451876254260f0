// The library's one exception type and its table of codes.
//
// Every failure inside the library is thrown as vellis::Error. A caller that
// survives one logs GetCode() and what() separately.
#pragma once

#include <cstdint>
#include <stdexcept>
#include <string>

namespace vellis {

// Codes thrown by the library. The enumeration is open: a failure code
// reported by the search-engine daemon is carried through unchanged, so any
// int32 value may appear in an Error.
enum ErrorCode : int32_t {
  kErrBadArgument = 120,         // unusable argument or JSON value
  kErrShareEnum = 121,           // enumerating the platform's shares failed
  kErrInternal = 502,            // a system or internal step failed
  kErrCredentials = 503,         // switching the effective user failed
  kErrLoadJson = 504,            // a JSON file cannot be loaded
  kErrSaveJson = 505,            // a JSON file cannot be saved
  kErrLock = 506,                // a file lock could not be taken
  kErrShareNotFound = 800,       // the platform has no such share
  kErrServiceUser = 801,         // the package's service user is unknown
  kErrFolderLimit = 900,         // too many indexed folders
  kErrFolderDuplicated = 901,    // the folder is already indexed
  kErrFolderNotFound = 902,      // the folder is not configured
  kErrPathCannotIndex = 903,     // the folder's path may not be indexed
  kErrMalformedEvent = 906,      // a queue line is not valid JSON
  kErrDaemonUnreachable = 913,   // the search daemon cannot be reached
  kErrParseFailed = 914,         // content extraction of a file failed
  kErrNoData = 916,              // a query response lacks its data array
  kErrSpaceNotEnough = 1003,     // the share's volume is short of space
  kErrBusy = 1400,               // search daemon busy (retry later)
  kErrBusyAlt = 1401,            // search daemon busy (retry later)
  kErrNodeByPath = 9999,         // the operation tree cannot resolve a path
};

// True for the two codes by which the search daemon says "busy, retry".
inline bool IsBusyCode(int32_t code) { return code == kErrBusy || code == kErrBusyAlt; }

class Error : public std::runtime_error {
 public:
  explicit Error(ErrorCode code);
  Error(ErrorCode code, const std::string& reason);

  // The reason text (not the composed message). Empty when none was given.
  const char* what() const noexcept override;

  ErrorCode GetCode() const { return code_; }

  // "Vellis error, code=<code>[, reason=[<reason>]]", as composed at
  // construction and held by the std::runtime_error base.
  const char* Message() const noexcept { return std::runtime_error::what(); }

 private:
  ErrorCode code_;
  std::string reason_;
};

}  // namespace vellis
