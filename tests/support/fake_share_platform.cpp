#include "tests/support/fake_share_platform.h"

#include <cerrno>
#include <cstring>

#include "sdk/linux/share_folders.h"

namespace vellis::testing {
namespace {

bool IsInside(const std::string& path, const std::string& dir) {
  std::string p = path + "/";
  std::string d = dir + "/";
  return p.compare(0, d.size(), d) == 0;
}

int CopyOut(const std::string& value, char* buf, size_t size) {
  if (value.size() >= size) return -1;
  memcpy(buf, value.c_str(), value.size() + 1);
  return 0;
}

}  // namespace

void FakeSharePlatform::AddShare(const sdk::ShareInfo& share) {
  std::lock_guard<std::mutex> lock(share_mu_);
  for (sdk::ShareInfo& s : shares_) {
    if (s.szName == share.szName) {
      s = share;
      return;
    }
  }
  shares_.push_back(share);
}

void FakeSharePlatform::RemoveShare(const std::string& name) {
  std::lock_guard<std::mutex> lock(share_mu_);
  for (auto it = shares_.begin(); it != shares_.end(); ++it) {
    if (it->szName == name) {
      shares_.erase(it);
      return;
    }
  }
}

void FakeSharePlatform::FailCall(const std::string& call, int err, const std::string& arg) {
  std::lock_guard<std::mutex> lock(share_mu_);
  failures_.insert({call, Failure{err, arg}});
}

void FakeSharePlatform::ClearFailures() {
  std::lock_guard<std::mutex> lock(share_mu_);
  failures_.clear();
}

void FakeSharePlatform::SetQuota(bool enough, int err) {
  std::lock_guard<std::mutex> lock(share_mu_);
  quota_ = std::make_pair(enough, err);
}

void FakeSharePlatform::SetAdminMember(const std::string& user, int answer) {
  std::lock_guard<std::mutex> lock(share_mu_);
  admin_members_[user] = answer;
}

void FakeSharePlatform::SetMountPoint(const std::string& path, int answer) {
  std::lock_guard<std::mutex> lock(share_mu_);
  mount_points_[path] = answer;
}

std::vector<std::string> FakeSharePlatform::Calls() const {
  std::lock_guard<std::mutex> lock(share_mu_);
  return calls_;
}

void FakeSharePlatform::ClearCalls() {
  std::lock_guard<std::mutex> lock(share_mu_);
  calls_.clear();
}

std::vector<std::string> FakeSharePlatform::Resets() const {
  std::lock_guard<std::mutex> lock(share_mu_);
  return resets_;
}

bool FakeSharePlatform::Fails(const std::string& call, const std::string& arg) {
  std::lock_guard<std::mutex> lock(share_mu_);
  calls_.push_back(call);
  // A call that the real platform answers leaves its own error.
  error_.reset();
  auto range = failures_.equal_range(call);
  for (auto it = range.first; it != range.second; ++it) {
    if (it->second.arg.empty() || it->second.arg == arg) {
      error_ = it->second.err;
      return true;
    }
  }
  return false;
}

void FakeSharePlatform::SetError(int err) {
  std::lock_guard<std::mutex> lock(share_mu_);
  error_ = err;
}

int FakeSharePlatform::QLIBCErrGet() {
  {
    std::lock_guard<std::mutex> lock(share_mu_);
    if (error_) return *error_;
  }
  return FakePlatform::QLIBCErrGet();
}

int FakeSharePlatform::QORUShareGet(const std::string& name, sdk::ShareInfo* out) {
  if (Fails("QORUShareGet", name)) return -1;
  std::lock_guard<std::mutex> lock(share_mu_);
  for (const sdk::ShareInfo& s : shares_) {
    if (s.szName == name) {
      *out = s;
      return 0;
    }
  }
  error_ = ENOENT;
  return -1;
}

int FakeSharePlatform::QLIBShareEnum(std::vector<std::string>* names) {
  if (Fails("QLIBShareEnum", "")) return -1;
  std::lock_guard<std::mutex> lock(share_mu_);
  names->clear();
  for (const sdk::ShareInfo& s : shares_) names->push_back(s.szName);
  return 0;
}

int FakeSharePlatform::QLIBShareIsEncryptedGet(const sdk::ShareInfo& share, int* value) {
  if (Fails("QLIBShareIsEncryptedGet", share.szName)) return -1;
  *value = share.encryption && QORUFSDirIsMntPoint(share.szPath) != 1 ? 1 : 0;
  return 0;
}

int FakeSharePlatform::QLIBShareIsReadOnlyGet(const sdk::ShareInfo& share, int* value) {
  if (Fails("QLIBShareIsReadOnlyGet", share.szName)) return -1;
  *value = share.read_only ? 1 : 0;
  return 0;
}

int FakeSharePlatform::QLIBShareIsEncryptionGet(const sdk::ShareInfo& share, int* value) {
  if (Fails("QLIBShareIsEncryptionGet", share.szName)) return -1;
  *value = share.encryption ? 1 : 0;
  return 0;
}

int FakeSharePlatform::QLIBShareRecycleStatusGet(const sdk::ShareInfo& share, int* value) {
  if (Fails("QLIBShareRecycleStatusGet", share.szName)) return -1;
  *value = share.recycle_bin ? 1 : 0;
  return 0;
}

int FakeSharePlatform::QLIBShareHideUnreadableGet(const sdk::ShareInfo& share, int* value) {
  if (Fails("QLIBShareHideUnreadableGet", share.szName)) return -1;
  *value = share.hide_unreadable ? 1 : 0;
  return 0;
}

int FakeSharePlatform::QORUShareUserPrivGet(const std::string& user, const sdk::ShareInfo& share) {
  if (Fails("QORUShareUserPrivGet", user)) return -1;
  return FakePlatform::QORUShareUserPrivGet(user, share);
}

int FakeSharePlatform::QORUShareNamePathGet(const std::string& full_path, char* name,
                                            size_t name_size, char* path, size_t path_size) {
  if (Fails("QORUShareNamePathGet", full_path)) return -1;
  std::lock_guard<std::mutex> lock(share_mu_);
  for (const sdk::ShareInfo& s : shares_) {
    if (!IsInside(full_path, s.szPath)) continue;
    if (CopyOut(s.szName, name, name_size) < 0 || CopyOut(s.szPath, path, path_size) < 0) {
      error_ = ENAMETOOLONG;
      return -1;
    }
    return 0;
  }
  error_ = ENOENT;
  return -1;
}

int FakeSharePlatform::QORUQuotaIsEnough(uint32_t uid, const std::string& path, uint64_t bytes,
                                         int flags) {
  if (Fails("QORUQuotaIsEnough", path)) return 0;
  std::optional<std::pair<bool, int>> quota;
  {
    std::lock_guard<std::mutex> lock(share_mu_);
    quota = quota_;
  }
  if (!quota) return FakePlatform::QORUQuotaIsEnough(uid, path, bytes, flags);
  if (!quota->first) SetError(quota->second);
  return quota->first ? 1 : 0;
}

int FakeSharePlatform::FILEIDXQueuePathCompose(const std::string& share_path, char* buf,
                                               size_t size) {
  if (Fails("FILEIDXQueuePathCompose", share_path)) return -1;
  return FakePlatform::FILEIDXQueuePathCompose(share_path, buf, size);
}

int FakeSharePlatform::FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) {
  if (Fails("FILEIDXDBPathCompose", share_path)) return -1;
  return FakePlatform::FILEIDXDBPathCompose(share_path, buf, size);
}

int FakeSharePlatform::FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) {
  if (Fails("FILEIDXGetIndexID", share_name)) return -1;
  return FakePlatform::FILEIDXGetIndexID(share_name, buf, size);
}

int FakeSharePlatform::QLIBGroupIsAdminGroupMem(const std::string& user, int flags) {
  if (Fails("QLIBGroupIsAdminGroupMem", user)) return -1;
  {
    std::lock_guard<std::mutex> lock(share_mu_);
    auto it = admin_members_.find(user);
    if (it != admin_members_.end()) return it->second;
  }
  return FakePlatform::QLIBGroupIsAdminGroupMem(user, flags);
}

bool FakeSharePlatform::ResetCredentialsByName(const std::string& user, int flags) {
  {
    std::lock_guard<std::mutex> lock(share_mu_);
    resets_.push_back(user);
  }
  if (Fails("ResetCredentialsByName", user)) return false;
  return FakePlatform::ResetCredentialsByName(user, flags);
}

int FakeSharePlatform::QORUFSDirIsMntPoint(const std::string& path) {
  if (Fails("QORUFSDirIsMntPoint", path)) return -1;
  {
    std::lock_guard<std::mutex> lock(share_mu_);
    auto it = mount_points_.find(path);
    if (it != mount_points_.end()) return it->second;
  }
  return FakePlatform::QORUFSDirIsMntPoint(path);
}

}  // namespace vellis::testing

namespace vellis::testing {

void FakeSharePlatform::SetFsType(const std::string& path, int type) {
  std::lock_guard<std::mutex> lock(share_mu_);
  fs_types_[path] = type;
}

void FakeSharePlatform::SetExecResult(int result, bool for_real) {
  std::lock_guard<std::mutex> lock(share_mu_);
  exec_result_ = result;
  exec_for_real_ = for_real;
}

std::vector<FakeSharePlatform::Exec> FakeSharePlatform::Execs() const {
  std::lock_guard<std::mutex> lock(share_mu_);
  return execs_;
}

bool FakeSharePlatform::HoldingShare(const std::string& full_path, sdk::ShareInfo* out) {
  std::lock_guard<std::mutex> lock(share_mu_);
  for (const sdk::ShareInfo& s : shares_) {
    if (IsInside(full_path, s.szPath)) {
      *out = s;
      return true;
    }
  }
  error_ = ENOENT;
  return false;
}

int FakeSharePlatform::QORUGetFSType(const std::string& path, int flags) {
  if (Fails("QORUGetFSType", path)) return -1;
  {
    std::lock_guard<std::mutex> lock(share_mu_);
    const std::pair<const std::string, int>* best = nullptr;
    for (const auto& entry : fs_types_) {
      if (IsInside(path, entry.first) && (!best || entry.first.size() > best->first.size())) {
        best = &entry;
      }
    }
    if (best) return best->second;
  }
  return FakePlatform::QORUGetFSType(path, flags);
}

int FakeSharePlatform::QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) {
  if (Fails("QLIBFhsPathInSnapshot", path)) return -1;
  sdk::ShareInfo share;
  if (!HoldingShare(path, &share)) return -1;
  *in_snapshot = sdk::IsInShareSnapshot(share, path) ? 1 : 0;
  return 0;
}

int FakeSharePlatform::QORUEAIsHiddenDir(const std::string& name) {
  if (Fails("QORUEAIsHiddenDir", name)) return -1;
  return FakePlatform::QORUEAIsHiddenDir(name);
}

int FakeSharePlatform::QORUShareIsShareRecycle(const std::string& full_path) {
  if (Fails("QORUShareIsShareRecycle", full_path)) return -1;
  sdk::ShareInfo share;
  if (!HoldingShare(full_path, &share)) return -1;
  return sdk::IsInShareRecycleBin(share, full_path) ? 1 : 0;
}

int FakeSharePlatform::QORURecycleUserHomePathIsExist(const std::string& full_path, int flags) {
  (void)flags;
  if (Fails("QORURecycleUserHomePathIsExist", full_path)) return -1;
  std::lock_guard<std::mutex> lock(share_mu_);
  for (const sdk::ShareInfo& s : shares_) {
    if (s.szName == sdk::kHomesShareName) return sdk::IsInHomeRecycleBin(s, full_path) ? 1 : 0;
  }
  error_ = ENOENT;
  return -1;
}

int FakeSharePlatform::QLIBCExec(const std::string& program, const std::vector<std::string>& args) {
  bool for_real;
  int result;
  {
    std::lock_guard<std::mutex> lock(share_mu_);
    calls_.push_back("QLIBCExec");
    execs_.push_back(Exec{program, -1, args});
    for_real = exec_for_real_;
    result = exec_result_;
  }
  return for_real ? FakePlatform::QLIBCExec(program, args) : result;
}

int FakeSharePlatform::QLIBCExecl(const std::string& program, int options,
                                  const std::vector<std::string>& args) {
  bool for_real;
  int result;
  {
    std::lock_guard<std::mutex> lock(share_mu_);
    calls_.push_back("QLIBCExecl");
    execs_.push_back(Exec{program, options, args});
    for_real = exec_for_real_;
    result = exec_result_;
  }
  return for_real ? FakePlatform::QLIBCExecl(program, options, args) : result;
}

}  // namespace vellis::testing
