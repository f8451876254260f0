// Snapshot, recycle-bin and metadata folders of shares.
#include "sdk/linux/share_folders.h"

#include <cerrno>

#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"
#include "sdk/linux/share_registry.h"

namespace vellis::sdk {
namespace {

// The share holding `full_path` into *share; false (error set) when none.
bool HoldingShare(const std::string& full_path, ShareInfo* share) {
  std::vector<ShareInfo> shares;
  if (!LoadShareRegistry(&shares)) {
    SetPlatformError(errno);
    return false;
  }
  const ShareInfo* found = FindShareHolding(shares, full_path);
  if (!found) {
    SetPlatformError(ENOENT);
    return false;
  }
  *share = *found;
  return true;
}

}  // namespace

std::vector<std::string> ComponentsBelow(const std::string& share_path,
                                         const std::string& full_path) {
  std::vector<std::string> parts;
  size_t begin = share_path.size();
  while (begin < full_path.size()) {
    size_t end = full_path.find('/', begin);
    if (end == std::string::npos) end = full_path.size();
    if (end > begin) parts.push_back(full_path.substr(begin, end - begin));
    begin = end + 1;
  }
  return parts;
}

bool IsInShareSnapshot(const ShareInfo& share, const std::string& full_path) {
  std::vector<std::string> parts = ComponentsBelow(share.szPath, full_path);
  return !parts.empty() && parts[0] == kSnapshotFolder;
}

bool IsInShareRecycleBin(const ShareInfo& share, const std::string& full_path) {
  std::vector<std::string> parts = ComponentsBelow(share.szPath, full_path);
  return share.recycle_bin && !parts.empty() && parts[0] == kRecycleFolder;
}

bool IsInHomeRecycleBin(const ShareInfo& homes, const std::string& full_path) {
  if (!homes.recycle_bin) return false;
  if (full_path.compare(0, homes.szPath.size() + 1, homes.szPath + "/") != 0) return false;
  std::vector<std::string> parts = ComponentsBelow(homes.szPath, full_path);
  return parts.size() >= 2 && parts[1] == kRecycleFolder;
}

int LinuxPlatform::QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) {
  ShareInfo share;
  if (!HoldingShare(path, &share)) return -1;
  *in_snapshot = IsInShareSnapshot(share, path) ? 1 : 0;
  return 0;
}

int LinuxPlatform::QORUEAIsHiddenDir(const std::string& name) {
  return name == kHiddenMetadataFolder ? 1 : 0;
}

int LinuxPlatform::QORUShareIsShareRecycle(const std::string& full_path) {
  ShareInfo share;
  if (!HoldingShare(full_path, &share)) return -1;
  return IsInShareRecycleBin(share, full_path) ? 1 : 0;
}

int LinuxPlatform::QORURecycleUserHomePathIsExist(const std::string& full_path, int /*flags*/) {
  ShareInfo homes;
  if (QORUShareGet(kHomesShareName, &homes) < 0) return -1;
  return IsInHomeRecycleBin(homes, full_path) ? 1 : 0;
}

}  // namespace vellis::sdk
