// The special folders inside shares on the Linux platform.
//
// At the top of a share: "#snapshot" holds its snapshots and "#recycle" its
// recycle bin (used when the share's recycle bin is on). In the "homes"
// share each user's home has its own "#recycle" at its top. "@eaDir" folders
// anywhere hold the platform's metadata and are hidden.
#pragma once

#include <string>
#include <vector>

#include "sdk/platform.h"

namespace vellis::sdk {

inline constexpr char kSnapshotFolder[] = "#snapshot";
inline constexpr char kRecycleFolder[] = "#recycle";
inline constexpr char kHiddenMetadataFolder[] = "@eaDir";
inline constexpr char kHomesShareName[] = "homes";

// The components of `full_path` below `share_path` ("/v/s/a/b" below "/v/s"
// gives {"a", "b"}); empty components are dropped. `full_path` must lie at
// or below `share_path`. Pure.
std::vector<std::string> ComponentsBelow(const std::string& share_path,
                                         const std::string& full_path);

// The rules, for a `full_path` at or below `share`'s path. Pure.
// At or below "#snapshot" at the top of the share.
bool IsInShareSnapshot(const ShareInfo& share, const std::string& full_path);
// At or below "#recycle" at the top of the share, whose recycle bin is on.
bool IsInShareRecycleBin(const ShareInfo& share, const std::string& full_path);
// At or below "<user>/#recycle" in `homes` (the "homes" share), whose recycle
// bin is on.
bool IsInHomeRecycleBin(const ShareInfo& homes, const std::string& full_path);

}  // namespace vellis::sdk
