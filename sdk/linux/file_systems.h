// File-system types on the Linux platform.
#pragma once

#include <cstdint>
#include <string>

namespace vellis::sdk {

// The FsType of a file system with the statfs magic number `magic`, holding
// the canonical (symbolic links resolved) path `path`. A tmpfs or ramfs at
// or below /run, /dev, /sys or /proc is the system's own and counts as
// kFsPseudo; elsewhere (/tmp, a data volume) it is kFsTmpfs. Unknown magic
// numbers are kFsOther. Pure.
int FsTypeFromMagic(uint64_t magic, const std::string& path);

// True for the remote (20 to 29) and image (30 to 39) ranges of FsType.
bool IsRemoteFsType(int type);
bool IsImageFsType(int type);

}  // namespace vellis::sdk
