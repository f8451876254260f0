// A fake platform with an in-memory share table and scripted failures.
//
// Shares live in memory (no registry file, no folders needed) and are
// answered by the same rules as the Linux platform: the holder of a full
// path by whole components, "encrypted" meaning encryption on and the path
// not a mount point. Any call named in FailCall fails instead; the rest
// goes to FakePlatform (and from there to the real platform).
#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

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
  void FailCall(const std::string& call, int err, const std::string& arg = "");
  void ClearFailures();

  // QORUQuotaIsEnough answers `enough`; when not, QLIBCErrGet reports `err`.
  // Unscripted, the real file system answers.
  void SetQuota(bool enough, int err);

  // QLIBGroupIsAdminGroupMem(user) answers `answer`; unscripted users go to
  // the real platform.
  void SetAdminMember(const std::string& user, int answer);

  // QORUFSDirIsMntPoint(path) answers `answer`; unscripted paths go to the
  // real platform.
  void SetMountPoint(const std::string& path, int answer);

  // QORUGetFSType answers `type` for `path` and everything below it (the
  // longest scripted path wins); unscripted paths go to the real platform.
  void SetFsType(const std::string& path, int type);

  // One run of the process runner.
  struct Exec {
    std::string program;
    int options;  // -1 for QLIBCExec
    std::vector<std::string> args;
  };
  // Runs of QLIBCExec / QLIBCExecl are recorded and answer `result` without
  // running anything; with `for_real`, they run on the real platform.
  void SetExecResult(int result, bool for_real = false);
  std::vector<Exec> Execs() const;

  // The names of the platform calls made through this fake, in order (the
  // share, user, quota and file-system queries).
  std::vector<std::string> Calls() const;
  void ClearCalls();
  // The users passed to ResetCredentialsByName, in order.
  std::vector<std::string> Resets() const;

  int QLIBCErrGet() override;

  int QORUShareGet(const std::string& name, sdk::ShareInfo* out) override;
  int QLIBShareEnum(std::vector<std::string>* names) override;
  int QLIBShareIsEncryptedGet(const sdk::ShareInfo& share, int* value) override;
  int QLIBShareIsReadOnlyGet(const sdk::ShareInfo& share, int* value) override;
  int QLIBShareIsEncryptionGet(const sdk::ShareInfo& share, int* value) override;
  int QLIBShareRecycleStatusGet(const sdk::ShareInfo& share, int* value) override;
  int QLIBShareHideUnreadableGet(const sdk::ShareInfo& share, int* value) override;
  int QORUShareUserPrivGet(const std::string& user, const sdk::ShareInfo& share) override;
  int QORUShareNamePathGet(const std::string& full_path, char* name, size_t name_size, char* path,
                           size_t path_size) override;
  int QORUQuotaIsEnough(uint32_t uid, const std::string& path, uint64_t bytes, int flags) override;
  int FILEIDXQueuePathCompose(const std::string& share_path, char* buf, size_t size) override;
  int FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) override;
  int FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) override;

  int QLIBGroupIsAdminGroupMem(const std::string& user, int flags) override;
  bool ResetCredentialsByName(const std::string& user, int flags) override;

  int QORUFSDirIsMntPoint(const std::string& path) override;
  int QORUGetFSType(const std::string& path, int flags) override;
  int QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) override;
  int QORUEAIsHiddenDir(const std::string& name) override;
  int QORUShareIsShareRecycle(const std::string& full_path) override;
  int QORURecycleUserHomePathIsExist(const std::string& full_path, int flags) override;

  int QLIBCExec(const std::string& program, const std::vector<std::string>& args) override;
  int QLIBCExecl(const std::string& program, int options,
                 const std::vector<std::string>& args) override;

 protected:
  // Records `call`; true (with the error set) when it is scripted to fail
  // for `arg`.
  bool Fails(const std::string& call, const std::string& arg);
  // The share holding `full_path` into *out; false (error set) when none.
  bool HoldingShare(const std::string& full_path, sdk::ShareInfo* out);
  // Sets the error that QLIBCErrGet reports on this fake.
  void SetError(int err);

 private:
  struct Failure {
    int err;
    std::string arg;
  };

  mutable std::mutex share_mu_;
  std::vector<sdk::ShareInfo> shares_;
  std::multimap<std::string, Failure> failures_;
  std::optional<std::pair<bool, int>> quota_;
  std::map<std::string, int> admin_members_;
  std::map<std::string, int> mount_points_;
  std::map<std::string, int> fs_types_;
  std::vector<Exec> execs_;
  int exec_result_ = 0;
  bool exec_for_real_ = false;
  std::vector<std::string> calls_;
  std::vector<std::string> resets_;
  std::optional<int> error_;  // the fake's own last error, once one is set
};

}  // namespace vellis::testing
