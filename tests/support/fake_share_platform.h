// A fake platform with an in-memory share table and scripted failures.
//
// Shares live in memory (no registry file, no folders needed) and are
// answered by the same rules as the Linux platform: the holder of a full
// path by whole components, "encrypted" meaning encryption on and the path
// not a mount point. Any call named in FailCall fails instead; the rest
// goes to FakePlatform (and from there to the real platform).
#pragma once

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "common/fs_util.h"
#include "sdk/linux/share_folders.h"
#include "sdk/linux/share_registry.h"
#include "tests/support/fake_platform.h"

namespace vellis::testing {

class FakeSharePlatform : public FakePlatform {
 public:
  // Adds or replaces (by name) a share.
  void AddShare(const sdk::ShareInfo& share) {
    Locked([&] {
      auto it = Named(share.szName);
      if (it == shares_.end()) it = shares_.insert(it, share);
      *it = share;
    });
  }
  void RemoveShare(const std::string& name) {
    Locked([&] {
      if (auto it = Named(name); it != shares_.end()) shares_.erase(it);
    });
  }

  // Makes the platform call `call` (its method name, such as
  // "QLIBShareIsReadOnlyGet") fail with error `err`: a negative result, 0
  // for QORUQuotaIsEnough, false for ResetCredentialsByName. With `arg`, only
  // calls whose first string argument (a name or path; for share queries,
  // the share's name) equals it fail.
  void FailCall(const std::string& call, int err, const std::string& arg = "") {
    Locked([&] { failures_.insert({call, {err, arg}}); });
  }
  void ClearFailures() { Set(failures_, {}); }

  // QORUQuotaIsEnough answers `enough`; when not, QLIBCErrGet reports `err`.
  // Unscripted, the real file system answers.
  void SetQuota(bool enough, int err) { Set(quota_, {{enough, err}}); }
  // The answers of QLIBGroupIsAdminGroupMem(user), QORUFSDirIsMntPoint(path)
  // and QORUGetFSType (for `path` and everything below it, the longest
  // scripted path winning); unscripted ones go to the real platform.
  void SetAdminMember(const std::string& user, int answer) { Script(kAdmin, user, answer); }
  void SetMountPoint(const std::string& path, int answer) { Script(kMount, path, answer); }
  void SetFsType(const std::string& path, int type) { Script(kFsType, path, type); }

  // One run of the process runner.
  struct Exec {
    std::string program;
    int options;  // -1 for QLIBCExec
    std::vector<std::string> args;
  };
  // Runs of QLIBCExec / QLIBCExecl are recorded and answer `result` without
  // running anything; with `for_real`, they run on the real platform.
  void SetExecResult(int result, bool for_real = false) {
    Set(exec_result_, for_real ? std::nullopt : std::optional<int>(result));
  }
  std::vector<Exec> Execs() const { return Get(execs_); }

  // The names of the platform calls made through this fake, in order (the
  // share, user, quota and file-system queries).
  std::vector<std::string> Calls() const { return Get(calls_); }
  void ClearCalls() { Set(calls_, {}); }
  // The users passed to ResetCredentialsByName, in order.
  std::vector<std::string> Resets() const { return Get(resets_); }

  int QLIBCErrGet() override {
    std::optional<int> err = Get(error_);
    return err ? *err : FakePlatform::QLIBCErrGet();
  }

  int QORUShareGet(const std::string& name, sdk::ShareInfo* out) override {
    return Fails("QORUShareGet", name) || !Lookup(sdk::FindShareByName, name, out) ? -1 : 0;
  }
  int QLIBShareEnum(std::vector<std::string>* names) override {
    if (Fails("QLIBShareEnum", "")) return -1;
    names->clear();
    for (const sdk::ShareInfo& s : Get(shares_)) names->push_back(s.szName);
    return 0;
  }
  int QLIBShareIsEncryptedGet(const sdk::ShareInfo& s, int* value) override {
    if (Fails("QLIBShareIsEncryptedGet", s.szName)) return -1;
    *value = s.encryption && QORUFSDirIsMntPoint(s.szPath) != 1 ? 1 : 0;
    return 0;
  }
  int QLIBShareIsReadOnlyGet(const sdk::ShareInfo& s, int* value) override {
    return Flag("QLIBShareIsReadOnlyGet", s, s.read_only, value);
  }
  int QLIBShareIsEncryptionGet(const sdk::ShareInfo& s, int* value) override {
    return Flag("QLIBShareIsEncryptionGet", s, s.encryption, value);
  }
  int QLIBShareRecycleStatusGet(const sdk::ShareInfo& s, int* value) override {
    return Flag("QLIBShareRecycleStatusGet", s, s.recycle_bin, value);
  }
  int QLIBShareHideUnreadableGet(const sdk::ShareInfo& s, int* value) override {
    return Flag("QLIBShareHideUnreadableGet", s, s.hide_unreadable, value);
  }
  int QORUShareUserPrivGet(const std::string& user, const sdk::ShareInfo& s) override {
    return Answer("QORUShareUserPrivGet", user,
                  [&] { return FakePlatform::QORUShareUserPrivGet(user, s); });
  }
  int QORUShareNamePathGet(const std::string& full_path, char* name, size_t name_size, char* path,
                           size_t path_size) override {
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
  int QORUQuotaIsEnough(uint32_t uid, const std::string& path, uint64_t bytes, int flags) override {
    if (Fails("QORUQuotaIsEnough", path)) return 0;
    std::optional<std::pair<bool, int>> quota = Get(quota_);
    if (!quota) return FakePlatform::QORUQuotaIsEnough(uid, path, bytes, flags);
    if (!quota->first) SetError(quota->second);
    return quota->first ? 1 : 0;
  }
  int FILEIDXQueuePathCompose(const std::string& share_path, char* buf, size_t size) override {
    return Answer("FILEIDXQueuePathCompose", share_path,
                  [&] { return FakePlatform::FILEIDXQueuePathCompose(share_path, buf, size); });
  }
  int FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) override {
    return Answer("FILEIDXDBPathCompose", share_path,
                  [&] { return FakePlatform::FILEIDXDBPathCompose(share_path, buf, size); });
  }
  int FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) override {
    return Answer("FILEIDXGetIndexID", share_name,
                  [&] { return FakePlatform::FILEIDXGetIndexID(share_name, buf, size); });
  }

  int QLIBGroupIsAdminGroupMem(const std::string& user, int flags) override {
    return Answer(kAdmin, user,
                  [&] { return FakePlatform::QLIBGroupIsAdminGroupMem(user, flags); });
  }
  bool ResetCredentialsByName(const std::string& user, int flags) override {
    Locked([&] { resets_.push_back(user); });
    return !Fails("ResetCredentialsByName", user) &&
           FakePlatform::ResetCredentialsByName(user, flags);
  }

  int QORUFSDirIsMntPoint(const std::string& path) override {
    return Answer(kMount, path, [&] { return FakePlatform::QORUFSDirIsMntPoint(path); });
  }
  int QORUGetFSType(const std::string& path, int flags) override {
    return Answer(kFsType, path, [&] { return FakePlatform::QORUGetFSType(path, flags); });
  }
  int QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) override {
    sdk::ShareInfo share;
    if (Fails("QLIBFhsPathInSnapshot", path) || !HoldingShare(path, &share)) return -1;
    *in_snapshot = sdk::IsInShareSnapshot(share, path) ? 1 : 0;
    return 0;
  }
  int QORUEAIsHiddenDir(const std::string& name) override {
    return Answer("QORUEAIsHiddenDir", name, [&] { return FakePlatform::QORUEAIsHiddenDir(name); });
  }
  int QORUShareIsShareRecycle(const std::string& full_path) override {
    sdk::ShareInfo share;
    if (Fails("QORUShareIsShareRecycle", full_path) || !HoldingShare(full_path, &share)) return -1;
    return sdk::IsInShareRecycleBin(share, full_path) ? 1 : 0;
  }
  int QORURecycleUserHomePathIsExist(const std::string& full_path, int) override {
    sdk::ShareInfo homes;
    if (Fails("QORURecycleUserHomePathIsExist", full_path) ||
        !Lookup(sdk::FindShareByName, sdk::kHomesShareName, &homes)) {
      return -1;
    }
    return sdk::IsInHomeRecycleBin(homes, full_path) ? 1 : 0;
  }

  int QLIBCExec(const std::string& program, const std::vector<std::string>& args) override {
    std::optional<int> scripted = Record("QLIBCExec", {program, -1, args});
    return scripted ? *scripted : FakePlatform::QLIBCExec(program, args);
  }
  int QLIBCExecl(const std::string& program, int options,
                 const std::vector<std::string>& args) override {
    std::optional<int> scripted = Record("QLIBCExecl", {program, options, args});
    return scripted ? *scripted : FakePlatform::QLIBCExecl(program, options, args);
  }

 protected:
  // Records `call`; true (with the error set) when it is scripted to fail
  // for `arg`.
  bool Fails(const std::string& call, const std::string& arg) {
    return Locked([&] {
      calls_.push_back(call);
      error_.reset();  // a call that the real platform answers leaves its own error
      auto [begin, end] = failures_.equal_range(call);
      auto it = std::find_if(begin, end, [&](const auto& f) {
        return f.second.second.empty() || f.second.second == arg;
      });
      if (it != end) error_ = it->second.first;
      return it != end;
    });
  }
  // The share holding `full_path` into *out; false (error set) when none.
  bool HoldingShare(const std::string& full_path, sdk::ShareInfo* out) {
    return Lookup(sdk::FindShareHolding, full_path, out);
  }
  // Sets the error that QLIBCErrGet reports on this fake.
  void SetError(int err) { Set(error_, {err}); }

 private:
  static constexpr char kAdmin[] = "QLIBGroupIsAdminGroupMem", kMount[] = "QORUFSDirIsMntPoint",
                        kFsType[] = "QORUGetFSType";
  using FindShare = const sdk::ShareInfo* (*)(const std::vector<sdk::ShareInfo>&,
                                              const std::string&);
  // The share that `find` picks for `key` into *out; false (error ENOENT)
  // when none.
  bool Lookup(FindShare find, const std::string& key, sdk::ShareInfo* out) {
    bool found = Locked([&] {
      const sdk::ShareInfo* s = find(shares_, key);
      if (s) *out = *s;
      return s != nullptr;
    });
    if (!found) SetError(ENOENT);
    return found;
  }
  // Under the lock: the share named `name`, or end().
  std::vector<sdk::ShareInfo>::iterator Named(const std::string& name) {
    return std::find_if(shares_.begin(), shares_.end(),
                        [&](const sdk::ShareInfo& s) { return s.szName == name; });
  }
  int Flag(const std::string& call, const sdk::ShareInfo& share, bool on, int* value) {
    if (Fails(call, share.szName)) return -1;
    *value = on ? 1 : 0;
    return 0;
  }
  void Script(const std::string& call, const std::string& key, int answer) {
    Locked([&] { answers_[call][key] = answer; });
  }
  // -1 when `call` is scripted to fail for `key`; else its scripted answer
  // for `key` (for a file-system type, that of the longest scripted folder
  // holding `key`); else what `real` answers.
  template <typename F>
  int Answer(const std::string& call, const std::string& key, F real) {
    if (Fails(call, key)) return -1;
    const bool below = call == kFsType;
    std::optional<int> answer = Locked([&]() -> std::optional<int> {
      const std::pair<const std::string, int>* best = nullptr;
      for (const auto& entry : answers_[call]) {
        bool match = below ? StringStartWith(key + "/", entry.first + "/") : key == entry.first;
        if (match && (!best || entry.first.size() > best->first.size())) best = &entry;
      }
      return best ? std::optional<int>(best->second) : std::nullopt;
    });
    return answer ? *answer : real();
  }
  // Records a run; its scripted result, or none when it runs for real.
  std::optional<int> Record(const std::string& call, Exec exec) {
    return Locked([&] {
      calls_.push_back(call);
      execs_.push_back(std::move(exec));
      return exec_result_;
    });
  }

  std::vector<sdk::ShareInfo> shares_;
  std::multimap<std::string, std::pair<int, std::string>> failures_;  // call: error, argument
  std::optional<std::pair<bool, int>> quota_;
  std::map<std::string, std::map<std::string, int>> answers_;  // by call, then argument
  std::vector<Exec> execs_;
  std::optional<int> exec_result_ = 0;  // none: run for real
  std::vector<std::string> calls_, resets_;
  std::optional<int> error_;  // the fake's own last error, once one is set
};

}  // namespace vellis::testing
