// Checks of the names that clients hand over and that end up in file
// names: index ids and database folders.
#pragma once

#include <string>

namespace vellis::searchd {

// The longest index id, in bytes (it becomes a file name with a suffix).
inline constexpr size_t kMaxIndexIdBytes = 200;

// Throws Error kErrBadIndexId naming the problem unless `id` is a usable
// index id: not empty, at most kMaxIndexIdBytes, not "." or "..", without
// "/", NUL or other control characters, so that it can never name a file
// outside its database folder.
void CheckIndexId(const std::string& id);

// Throws Error kErrBadIndexId unless `path` is an absolute folder path
// without NUL and without "." or ".." components.
void CheckDbFolder(const std::string& path);

}  // namespace vellis::searchd
