// The Linux platform's registry of shared folders.
//
// One JSON document under the root holds every share:
//   {"shares": [{"name": "photo", "path": "/volume1/photo", "read_only": false,
//                "encryption": false, "recycle_bin": true,
//                "hide_unreadable": false, "ftp_privilege": 0}, ...]}
// in the order of registration. A share's path is its volume followed by its
// name, as on the appliance, and no share lies inside another, so that every
// full path belongs to at most one share. Writers take kShareRegistryLockPath
// and replace the file atomically; readers need no lock.
#pragma once

#include <json/json.h>

#include <cstddef>
#include <string>
#include <vector>

#include "sdk/platform.h"

namespace vellis::sdk {

// Resolve both with RootPath() before use.
inline constexpr char kShareRegistryPath[] = "/var/packages/Vellis/etc/shares.json";
inline constexpr char kShareRegistryLockPath[] = "/tmp/vellis_shares.lock";

// The longest share name, in bytes.
inline constexpr size_t kShareNameMax = 255;

// Why `name` cannot name a share, or empty when it can: it must be 1 to 255
// bytes of well-formed UTF-8 without "/", NUL or newline, not "." or "..",
// and must not begin with "-". Pure.
std::string ShareNameProblem(const std::string& name);

// Why `path` cannot be the path of the share `name`, or empty when it can:
// absolute, shorter than 4096 bytes, without NUL or newline, without empty,
// "." or ".." components or a trailing "/", and ending in the component
// `name`. Pure: the file system is not consulted.
std::string SharePathProblem(const std::string& name, const std::string& path);

// Reads a registry document into *shares. Returns false with *problem set
// when the document is not an object with a "shares" array, an entry lacks
// a string name or path, a name or path breaks the rules above, or two
// shares clash (same name ignoring case, or one inside the other). Pure.
bool ParseShareRegistry(const Json::Value& doc, std::vector<ShareInfo>* shares,
                        std::string* problem);

// The document that ParseShareRegistry reads back as `shares`. Pure.
Json::Value ShareRegistryToJson(const std::vector<ShareInfo>& shares);

// The share whose path holds `full_path`: `full_path` + "/" begins with the
// share's path + "/". Null when none does. The pointer is into `shares`.
const ShareInfo* FindShareHolding(const std::vector<ShareInfo>& shares,
                                  const std::string& full_path);

// The share named exactly `name`; null when none. The pointer is into
// `shares`.
const ShareInfo* FindShareByName(const std::vector<ShareInfo>& shares, const std::string& name);

// Loads the registry at RootPath(kShareRegistryPath). A missing file is an
// empty registry. Returns false, with errno set (EINVAL for an invalid
// document), when the file cannot be read or is invalid. Thread-safe; the
// file is parsed again only when it has changed.
bool LoadShareRegistry(std::vector<ShareInfo>* shares);

// Adds `share` to the registry under the registry lock. The path must also
// be an existing directory reached without symbolic links. Throws Error 120
// with the reason for a bad name or path, or a clash with a registered
// share; 504 when the registry cannot be read (it is left as it is); 505
// when it cannot be written; 506 when the lock cannot be taken. On failure
// the registry is unchanged.
void RegisterShare(const ShareInfo& share);

// Removes the share named `name` (the folder itself is untouched). Throws
// Error 800 when there is none, and the 504, 505 and 506 of RegisterShare.
void UnregisterShare(const std::string& name);

}  // namespace vellis::sdk
