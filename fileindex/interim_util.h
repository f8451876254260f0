// Share path conversions needed by the folder records until the library's
// path utilities (fileindex/util.h) are merged; the same names and
// contracts, so that switching over is a change of include.
#pragma once

#include <string>

namespace vellis::fileindex {

// The first component of `share_path`. Throws Error 120 (reason the path)
// when the path is empty or does not begin with "/".
void GetShareNameByPath(std::string& share_name, const std::string& share_path);

// The share's volume followed by `share_path`. Throws Error 800 when the
// share does not exist.
std::string GetFullPath(const std::string& share_path);

// The share that holds `full_path`: its name and its own full path. Throws
// Error 502 when no share holds it.
void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path_on_disk,
                                const std::string& full_path);

// `path` with its first whole component equal to `old_share` replaced by
// `new_share`. Throws Error 120 "Cannot find share: <old_share>" when there
// is none.
std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                             const std::string& old_share);

}  // namespace vellis::fileindex
