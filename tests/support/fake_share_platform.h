// A fake platform with an in-memory share table and scripted failures.
//
// Shares live in memory (no registry file, no folders needed) and are
// answered by the same rules as the Linux platform: the holder of a full
// path by whole components, "encrypted" meaning encryption on and the path
// not a mount point. Any call named in FailCall fails instead; the rest
// goes to FakePlatform (and from there to the real platform).
#pragma once

#include <cerrno>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "sdk/linux/share_registry.h"
#include "tests/support/fake_platform.h"

namespace vellis::testing {

class FakeSharePlatform : public FakePlatform {
 public:
  // Adds or replaces (by name) a share.
  void AddShare(const sdk::ShareInfo& share);
  void RemoveShare(const std::string& name);

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
  void SetAdminMember(const std::string& user, int answer) {
    Locked([&] { admin_members_[user] = answer; });
  }
  void SetMountPoint(const std::string& path, int answer) {
    Locked([&] { mount_points_[path] = answer; });
  }
  void SetFsType(const std::string& path, int type) {
    Locked([&] { fs_types_[path] = type; });
  }

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

  int QORUShareGet(const std::string& name, sdk::ShareInfo* out) override;
  int QLIBShareEnum(std::vector<std::string>* names) override;
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
  int QORUShareUserPrivGet(const std::string& user, const sdk::ShareInfo& share) override {
    if (Fails("QORUShareUserPrivGet", user)) return -1;
    return FakePlatform::QORUShareUserPrivGet(user, share);
  }
  int QORUShareNamePathGet(const std::string& full_path, char* name, size_t name_size, char* path,
                           size_t path_size) override;
  int QORUQuotaIsEnough(uint32_t uid, const std::string& path, uint64_t bytes, int flags) override;
  int FILEIDXQueuePathCompose(const std::string& share_path, char* buf, size_t size) override {
    if (Fails("FILEIDXQueuePathCompose", share_path)) return -1;
    return FakePlatform::FILEIDXQueuePathCompose(share_path, buf, size);
  }
  int FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) override {
    if (Fails("FILEIDXDBPathCompose", share_path)) return -1;
    return FakePlatform::FILEIDXDBPathCompose(share_path, buf, size);
  }
  int FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) override {
    if (Fails("FILEIDXGetIndexID", share_name)) return -1;
    return FakePlatform::FILEIDXGetIndexID(share_name, buf, size);
  }

  int QLIBGroupIsAdminGroupMem(const std::string& user, int flags) override {
    if (Fails("QLIBGroupIsAdminGroupMem", user)) return -1;
    std::optional<int> answer = Scripted(admin_members_, user);
    return answer ? *answer : FakePlatform::QLIBGroupIsAdminGroupMem(user, flags);
  }
  bool ResetCredentialsByName(const std::string& user, int flags) override {
    Locked([&] { resets_.push_back(user); });
    return !Fails("ResetCredentialsByName", user) &&
           FakePlatform::ResetCredentialsByName(user, flags);
  }

  int QORUFSDirIsMntPoint(const std::string& path) override {
    if (Fails("QORUFSDirIsMntPoint", path)) return -1;
    std::optional<int> answer = Scripted(mount_points_, path);
    return answer ? *answer : FakePlatform::QORUFSDirIsMntPoint(path);
  }
  int QORUGetFSType(const std::string& path, int flags) override {
    if (Fails("QORUGetFSType", path)) return -1;
    std::optional<int> answer = Scripted(fs_types_, path, true);
    return answer ? *answer : FakePlatform::QORUGetFSType(path, flags);
  }
  int QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) override;
  int QORUEAIsHiddenDir(const std::string& name) override {
    return Fails("QORUEAIsHiddenDir", name) ? -1 : FakePlatform::QORUEAIsHiddenDir(name);
  }
  int QORUShareIsShareRecycle(const std::string& full_path) override;
  int QORURecycleUserHomePathIsExist(const std::string& full_path, int flags) override;

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
  bool Fails(const std::string& call, const std::string& arg);
  // The share holding `full_path` into *out; false (error set) when none.
  bool HoldingShare(const std::string& full_path, sdk::ShareInfo* out) {
    return Lookup(sdk::FindShareHolding, full_path, out);
  }
  // Sets the error that QLIBCErrGet reports on this fake.
  void SetError(int err) { Set(error_, {err}); }

 private:
  using FindShare = const sdk::ShareInfo* (*)(const std::vector<sdk::ShareInfo>&,
                                              const std::string&);
  // The share that `find` picks for `key` into *out; false (error ENOENT)
  // when none.
  bool Lookup(FindShare find, const std::string& key, sdk::ShareInfo* out);
  // Under the lock: the share named `name`, or end().
  std::vector<sdk::ShareInfo>::iterator Named(const std::string& name);
  int Flag(const std::string& call, const sdk::ShareInfo& share, bool on, int* value) {
    if (Fails(call, share.szName)) return -1;
    *value = on ? 1 : 0;
    return 0;
  }
  // The scripted answer for `key`, if any; with `below`, for the longest
  // scripted folder holding `key`.
  std::optional<int> Scripted(const std::map<std::string, int>& answers, const std::string& key,
                              bool below = false) const;
  // Records a run; its scripted result, or none when it runs for real.
  std::optional<int> Record(const std::string& call, Exec exec) {
    return Locked([&] {
      calls_.push_back(call);
      execs_.push_back(std::move(exec));
      return exec_result_;
    });
  }

  struct Failure {
    int err;
    std::string arg;
  };
  std::vector<sdk::ShareInfo> shares_;
  std::multimap<std::string, Failure> failures_;
  std::optional<std::pair<bool, int>> quota_;
  std::map<std::string, int> admin_members_, mount_points_, fs_types_;
  std::vector<Exec> execs_;
  std::optional<int> exec_result_ = 0;  // none: run for real
  std::vector<std::string> calls_, resets_;
  std::optional<int> error_;  // the fake's own last error, once one is set
};

}  // namespace vellis::testing
