// One shared folder's platform record and the questions the indexer asks
// of it.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "sdk/platform.h"

namespace vellis::sdk {

// Holds the record of one share for its lifetime. Every platform query is
// made while holding SDKMutex(), so an SDKShare may be used from any thread;
// one SDKShare is not meant to be shared between threads.
class SDKShare {
 public:
  // Fetches the record of the share named `share_name` (exact bytes).
  // Throws Error 800 when the platform has no such share.
  explicit SDKShare(const std::string& share_name);
  ~SDKShare();
  SDKShare(const SDKShare&) = delete;
  SDKShare& operator=(const SDKShare&) = delete;

  // True when listings hide what a user may not read. A failing query
  // answers false. Never throws.
  bool IsHideUnReadable() const;

  // True unless the share's volume lacks 100 MiB (104857600 bytes) for its
  // index: only the platform's two "no space" errors (kPlatformErrNoSpace,
  // kPlatformErrNoInodes) answer false; any other failure of the quota
  // query answers true. Never throws.
  bool IsSpaceEnough() const;

  // The record's FTP privilege word, unchanged.
  int GetFTPPrivilege() const;

  // What `user` may do in the share (SharePriv), as the platform answers;
  // negative for an unknown user.
  int GetPrivilege(const std::string& user) const;

  // True when the share is neither encrypted (locked) nor read-only. Both
  // queries are always made, encryption first. Throws Error 502 when one
  // fails.
  bool CanBeIndexed() const;

  // Whether the share uses encryption / has its recycle bin on. Throw Error
  // 502 when the platform cannot say.
  bool IsEncryption() const;
  bool IsEnableRecycleBin() const;

  // The share's queue file, its index database folder (the "path" of the
  // index-create request) and its index name, as the platform composes them.
  // Throw Error 502 when the platform cannot.
  std::string GetQueuePath() const;
  std::string GetDBPath() const;
  std::string GetDBName() const;

  // The record's name and full path ("photo", "/volume1/photo").
  std::string GetName() const;
  std::string GetPath() const;

  // The names of every share known to the platform, in the platform's order.
  // Throws Error 121 "QLIBShareEnum failed" when it cannot list them.
  static std::vector<std::string> Enum();

 private:
  std::unique_ptr<ShareInfo> share_info_;
};

}  // namespace vellis::sdk
