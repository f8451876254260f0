#include "tests/support/fake_share_platform.h"

#include <algorithm>
#include <cstring>

#include "common/fs_util.h"
#include "sdk/linux/share_folders.h"

namespace vellis::testing {

std::vector<sdk::ShareInfo>::iterator FakeSharePlatform::Named(const std::string& name) {
  return std::find_if(shares_.begin(), shares_.end(),
                      [&](const sdk::ShareInfo& s) { return s.szName == name; });
}

void FakeSharePlatform::AddShare(const sdk::ShareInfo& share) {
  Locked([&] {
    auto it = Named(share.szName);
    if (it == shares_.end()) it = shares_.insert(it, share);
    *it = share;
  });
}

void FakeSharePlatform::RemoveShare(const std::string& name) {
  Locked([&] {
    auto it = Named(name);
    if (it != shares_.end()) shares_.erase(it);
  });
}

bool FakeSharePlatform::Fails(const std::string& call, const std::string& arg) {
  return Locked([&] {
    calls_.push_back(call);
    error_.reset();  // a call that the real platform answers leaves its own error
    auto [begin, end] = failures_.equal_range(call);
    for (auto it = begin; it != end; ++it) {
      if (it->second.arg.empty() || it->second.arg == arg) {
        error_ = it->second.err;
        return true;
      }
    }
    return false;
  });
}

bool FakeSharePlatform::Lookup(FindShare find, const std::string& key, sdk::ShareInfo* out) {
  bool found = Locked([&] {
    const sdk::ShareInfo* s = find(shares_, key);
    if (s) *out = *s;
    return s != nullptr;
  });
  if (!found) SetError(ENOENT);
  return found;
}

std::optional<int> FakeSharePlatform::Scripted(const std::map<std::string, int>& answers,
                                               const std::string& key, bool below) const {
  return Locked([&]() -> std::optional<int> {
    const std::pair<const std::string, int>* best = nullptr;
    for (const auto& entry : answers) {
      bool match = below ? StringStartWith(key + "/", entry.first + "/") : key == entry.first;
      if (match && (!best || entry.first.size() > best->first.size())) best = &entry;
    }
    if (!best) return std::nullopt;
    return best->second;
  });
}

int FakeSharePlatform::QORUShareGet(const std::string& name, sdk::ShareInfo* out) {
  return Fails("QORUShareGet", name) || !Lookup(sdk::FindShareByName, name, out) ? -1 : 0;
}

int FakeSharePlatform::QLIBShareEnum(std::vector<std::string>* names) {
  if (Fails("QLIBShareEnum", "")) return -1;
  names->clear();
  for (const sdk::ShareInfo& s : Get(shares_)) names->push_back(s.szName);
  return 0;
}

int FakeSharePlatform::QORUShareNamePathGet(const std::string& full_path, char* name,
                                            size_t name_size, char* path, size_t path_size) {
  sdk::ShareInfo s;
  if (Fails("QORUShareNamePathGet", full_path) || !HoldingShare(full_path, &s)) return -1;
  if (s.szName.size() >= name_size || s.szPath.size() >= path_size) {
    SetError(ENAMETOOLONG);
    return -1;
  }
  memcpy(name, s.szName.c_str(), s.szName.size() + 1);
  memcpy(path, s.szPath.c_str(), s.szPath.size() + 1);
  return 0;
}

int FakeSharePlatform::QORUQuotaIsEnough(uint32_t uid, const std::string& path, uint64_t bytes,
                                         int flags) {
  if (Fails("QORUQuotaIsEnough", path)) return 0;
  std::optional<std::pair<bool, int>> quota = Get(quota_);
  if (!quota) return FakePlatform::QORUQuotaIsEnough(uid, path, bytes, flags);
  if (!quota->first) SetError(quota->second);
  return quota->first ? 1 : 0;
}

int FakeSharePlatform::QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) {
  sdk::ShareInfo share;
  if (Fails("QLIBFhsPathInSnapshot", path) || !HoldingShare(path, &share)) return -1;
  *in_snapshot = sdk::IsInShareSnapshot(share, path) ? 1 : 0;
  return 0;
}

int FakeSharePlatform::QORUShareIsShareRecycle(const std::string& full_path) {
  sdk::ShareInfo share;
  if (Fails("QORUShareIsShareRecycle", full_path) || !HoldingShare(full_path, &share)) return -1;
  return sdk::IsInShareRecycleBin(share, full_path) ? 1 : 0;
}

int FakeSharePlatform::QORURecycleUserHomePathIsExist(const std::string& full_path, int) {
  if (Fails("QORURecycleUserHomePathIsExist", full_path)) return -1;
  sdk::ShareInfo homes;
  if (!Lookup(sdk::FindShareByName, sdk::kHomesShareName, &homes)) return -1;
  return sdk::IsInHomeRecycleBin(homes, full_path) ? 1 : 0;
}

}  // namespace vellis::testing
