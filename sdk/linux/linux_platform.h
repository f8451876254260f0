// The real platform on an ordinary Linux machine. See docs/platform.md for
// what each call does here.
#pragma once

#include "sdk/platform.h"

namespace vellis::sdk {

class LinuxPlatform : public Platform {
 public:
  int64_t Time() override;
  void Sleep(unsigned int seconds) override;
  void USleep(uint64_t microseconds) override;
  int Rand() override;
  void Syslog(int priority, const std::string& message) override;

  // --- Errors (last_error.cpp) ---
  int QLIBCErrGet() override;

  // --- Shares (shares.cpp, quota.cpp, index_paths.cpp) ---
  int QORUShareGet(const std::string& name, ShareInfo* out) override;
  int QLIBShareEnum(std::vector<std::string>* names) override;
  int QLIBShareIsEncryptedGet(const ShareInfo& share, int* value) override;
  int QLIBShareIsReadOnlyGet(const ShareInfo& share, int* value) override;
  int QLIBShareIsEncryptionGet(const ShareInfo& share, int* value) override;
  int QLIBShareRecycleStatusGet(const ShareInfo& share, int* value) override;
  int QLIBShareHideUnreadableGet(const ShareInfo& share, int* value) override;
  int QORUShareUserPrivGet(const std::string& user, const ShareInfo& share) override;
  int QORUShareNamePathGet(const std::string& full_path, char* name, size_t name_size, char* path,
                           size_t path_size) override;
  int QORUQuotaIsEnough(uint32_t uid, const std::string& path, uint64_t bytes, int flags) override;
  int FILEIDXQueuePathCompose(const std::string& share_path, char* buf, size_t size) override;
  int FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) override;
  int FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) override;

  // --- Users and credentials (users.cpp) ---
  int QORUUserGetByUID(uint32_t uid, UserInfo* out) override;
  int QLIBGroupIsAdminGroupMem(const std::string& user, int flags) override;
  bool ResetCredentialsByName(const std::string& user, int flags) override;

  // --- Processes (process.cpp) ---
  int QLIBCExec(const std::string& program, const std::vector<std::string>& args) override;
  int QLIBCExecl(const std::string& program, int options,
                 const std::vector<std::string>& args) override;

  // --- Text (unicode.cpp) ---
  int QLIBCUnicodeUTF8StrCaseCmp(const std::string& a, const std::string& b) override;

  int QORUACLPermGet(const std::string& path, int* perm) override;
  int QORUFSDirIsMntPoint(const std::string& path) override;
  int QORUFileCopy(const std::string& from, const std::string& to,
                   const CopyArgs& args) override;
  // (file_systems.cpp, share_folders.cpp)
  int QORUGetFSType(const std::string& path, int flags) override;
  int QORUFSIsRemoteFS(int type) override;
  int QORUFSIsImageFS(int type) override;
  int QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) override;
  int QORUEAIsHiddenDir(const std::string& name) override;
  int QORUShareIsShareRecycle(const std::string& full_path) override;
  int QORURecycleUserHomePathIsExist(const std::string& full_path, int flags) override;

  int QORUUserGet(const std::string& name, UserInfo* out) override;

  // In sdk/linux/content_extract.cpp.
  int ParseFile(const std::string& path, const Json::Value& options, Json::Value* doc) override;

  // --- Services and monitor (services.cpp, smb_conf.cpp, monitor_queues.cpp;
  // the failure site in last_error.cpp) ---
  int QLIBServiceStart(const std::string& service, bool wait) override;
  int QLIBServiceStop(const std::string& service, bool wait) override;
  int QLIBServiceRestart(const std::string& service) override;
  int QLIBServicectlStart(const std::string& service, int type) override;
  int QLIBServicectlStop(const std::string& service, int type) override;
  int QORUSMBIsEnableSpotlight() override;
  int QORUSMBSetSpotlight(int enable) override;
  std::string QLIBCErrorGetFile() override;
  int QLIBCErrorGetLine() override;
  bool MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) override;
  bool MonitorQueueDelete(const std::string& queue_path, const std::string& app, int type) override;
  // (home_recycle.cpp)
  int QORURecycleHomeEnumRecyclePathForAuthType(std::vector<std::string>* paths,
                                                int auth_type) override;
  int QORURecycleHomeEnumRecyclePath(std::vector<std::string>* paths) override;
};

}  // namespace vellis::sdk
