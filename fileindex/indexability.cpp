// Which full paths may be indexed.
#include <string>

#include "common/fs_util.h"
#include "fileindex/util.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex {
namespace {

constexpr int kHomeRecycleFlags = 11;

bool Contains(const std::string& s, const char* needle) {
  return s.find(needle) != std::string::npos;
}

}  // namespace

const char* IndexRuleName(IndexRule rule) {
  switch (rule) {
    case IndexRule::kIndexable:
      return "indexable";
    case IndexRule::kInSnapshot:
      return "snapshot";
    case IndexRule::kUnexaminable:
      return "file-system-unknown";
    case IndexRule::kRemoteFs:
      return "remote-fs";
    case IndexRule::kImageFs:
      return "image-fs";
    case IndexRule::kPseudoFs:
      return "system-fs";
    case IndexRule::kShareNotIndexable:
      return "share-not-indexable";
    case IndexRule::kInRecycleBin:
      return "recycle-bin";
    case IndexRule::kMountPoint:
      return "mount-point";
    case IndexRule::kUnresolvable:
      return "unresolvable";
    case IndexRule::kNotCanonical:
      return "not-canonical";
  }
  return "unknown";
}

bool IsFullPathInRecycleBin(const std::string& full_path) {
  sdk::Platform* platform = sdk::GetPlatform();
  std::string share_name;
  std::string share_path;
  GetShareNamePathByFullPath(share_name, share_path, full_path);
  if (Contains(full_path, "#recycle") && platform->QORUShareIsShareRecycle(full_path) == 1) {
    return true;
  }
  return share_name == "homes" &&
         platform->QORURecycleUserHomePathIsExist(full_path, kHomeRecycleFlags) == 1;
}

IndexRule CheckFullPathIndexable(const std::string& full_path) {
  sdk::Platform* platform = sdk::GetPlatform();
  if (Contains(full_path, "#snapshot")) {
    int in_snapshot = 0;
    if (platform->QLIBFhsPathInSnapshot(full_path, &in_snapshot) == 0 && in_snapshot == 1) {
      return IndexRule::kInSnapshot;
    }
  }

  int fs_type = platform->QORUGetFSType(full_path, 0);
  if (fs_type < 0) return IndexRule::kUnexaminable;
  if (platform->QORUFSIsRemoteFS(fs_type)) return IndexRule::kRemoteFs;
  if (platform->QORUFSIsImageFS(fs_type)) return IndexRule::kImageFs;
  // Type 12 is excluded by its number: the system's own file systems.
  if (fs_type == sdk::kFsPseudo) return IndexRule::kPseudoFs;

  std::string share_name;
  std::string share_path;
  GetShareNamePathByFullPath(share_name, share_path, full_path);
  sdk::SDKShare share(share_name);
  if (!share.CanBeIndexed()) return IndexRule::kShareNotIndexable;

  if (IsFullPathInRecycleBin(full_path)) return IndexRule::kInRecycleBin;

  // An unlocked encrypted share is itself mounted at its path.
  if (platform->QORUFSDirIsMntPoint(full_path) == 1 && !share.IsEncryption()) {
    return IndexRule::kMountPoint;
  }

  // Last and costliest: only the canonical spelling of a path is indexed, so
  // a link (to /etc, say), "." or "..", or a doubled or trailing "/" is not.
  std::string resolved = RealPath(full_path);
  if (resolved.empty()) return IndexRule::kUnresolvable;
  if (resolved != full_path) return IndexRule::kNotCanonical;
  return IndexRule::kIndexable;
}

bool CanFullPathBeIndexed(const std::string& full_path) {
  return CheckFullPathIndexable(full_path) == IndexRule::kIndexable;
}

bool CanPathBeIndexed(const std::string& share_path) {
  return CanFullPathBeIndexed(GetFullPath(share_path));
}

bool IsSystemPreservedFileName(const std::string& name) {
  if (sdk::GetPlatform()->QORUEAIsHiddenDir(name) == 1) return true;
  for (const char* preserved : kSystemPreservedFileNames) {
    if (name == preserved) return true;
  }
  return false;
}

}  // namespace vellis::fileindex
