// Where a share's index data lives on the Linux platform.
//
// A share's queue file and index database sit on the share's own volume, in
// the hidden folder "@fileindex" at the volume's top, which lies outside
// every share (a share's path is its volume followed by its name), so the
// file-change monitor never reports it and the data moves and goes with the
// volume:
//   /volume1/photo -> /volume1/@fileindex/photo/queue, /volume1/@fileindex/photo/db
// The index of a share is named "fileindex_" and the share's name.
#pragma once

#include <string>

namespace vellis::sdk {

inline constexpr char kIndexDataFolder[] = "@fileindex";
inline constexpr char kIndexNamePrefix[] = "fileindex_";

// The queue file / index database folder of the share at `share_path` (an
// absolute path without a trailing slash). Empty when `share_path` is not
// absolute, ends in "/" or has no name component. Pure functions.
std::string ComposeQueuePath(const std::string& share_path);
std::string ComposeDBPath(const std::string& share_path);

// "fileindex_" followed by `share_name`; empty for an empty name.
std::string ComposeIndexID(const std::string& share_name);

// Copies `value` with its NUL into `buf` of `size` bytes. Returns its length,
// or -1 (buf untouched) when `value` is empty or does not fit.
int CopyToBuffer(const std::string& value, char* buf, size_t size);

}  // namespace vellis::sdk
