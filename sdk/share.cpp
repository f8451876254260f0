#include "sdk/share.h"

#include "common/log.h"
#include "common/mutex.h"
#include "sdk/credentials.h"

namespace vellis::sdk {
namespace {

// The platform calls under the names and argument shapes that the failure
// log lines quote.
int QORUShareGet(const char* name, std::unique_ptr<ShareInfo>* out) {
  auto info = std::make_unique<ShareInfo>();
  int rc = GetPlatform()->QORUShareGet(name, info.get());
  if (rc >= 0) *out = std::move(info);
  return rc;
}

int QLIBShareIsEncryptedGet(const std::unique_ptr<ShareInfo>& share, int* value) {
  return GetPlatform()->QLIBShareIsEncryptedGet(*share, value);
}

int QLIBShareIsReadOnlyGet(const std::unique_ptr<ShareInfo>& share, int* value) {
  return GetPlatform()->QLIBShareIsReadOnlyGet(*share, value);
}

int QLIBShareIsEncryptionGet(const std::unique_ptr<ShareInfo>& share, int* value) {
  return GetPlatform()->QLIBShareIsEncryptionGet(*share, value);
}

int QLIBShareRecycleStatusGet(const std::unique_ptr<ShareInfo>& share, int* value) {
  return GetPlatform()->QLIBShareRecycleStatusGet(*share, value);
}

int FILEIDXQueuePathCompose(const std::string& share_path, char* buf, size_t size) {
  return GetPlatform()->FILEIDXQueuePathCompose(share_path, buf, size);
}

int FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) {
  return GetPlatform()->FILEIDXDBPathCompose(share_path, buf, size);
}

int FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) {
  return GetPlatform()->FILEIDXGetIndexID(share_name, buf, size);
}

int QLIBShareEnum(std::vector<std::string>* names) { return GetPlatform()->QLIBShareEnum(names); }

constexpr uint64_t kIndexSpaceBytes = 104857600;  // 100 MiB

}  // namespace

SDKShare::SDKShare(const std::string& share_name) {
  // The platform takes a C string: a NUL inside the name would cut it to
  // the name of another share.
  VELLIS_THROW_IF(share_name.find('\0') != std::string::npos, kErrShareNotFound,
                  "share name contains a NUL byte");
  LockMutex lock(SDKMutex());
  VELLIS_THROW_IF(0 > QORUShareGet(share_name.c_str(), &share_info_) || !share_info_,
                  kErrShareNotFound, "QORUShareGet failed, share=" + share_name);
}

SDKShare::~SDKShare() = default;

bool SDKShare::IsHideUnReadable() const {
  LockMutex lock(SDKMutex());
  int hide = 0;
  return GetPlatform()->QLIBShareHideUnreadableGet(*share_info_, &hide) >= 0 && hide == 1;
}

bool SDKShare::IsSpaceEnough() const {
  LockMutex lock(SDKMutex());
  Platform* platform = GetPlatform();
  if (platform->QORUQuotaIsEnough(0, share_info_->szPath, kIndexSpaceBytes, 0)) return true;
  // Only a real lack of space stops indexing; a quota query that fails for
  // another reason must not.
  int err = platform->QLIBCErrGet();
  return err != kPlatformErrNoSpace && err != kPlatformErrNoInodes;
}

int SDKShare::GetFTPPrivilege() const { return share_info_->ftp_privilege; }

int SDKShare::GetPrivilege(const std::string& user) const {
  LockMutex lock(SDKMutex());
  return GetPlatform()->QORUShareUserPrivGet(user, *share_info_);
}

bool SDKShare::CanBeIndexed() const {
  LockMutex lock(SDKMutex());
  int is_encrypted = 0;
  int is_readonly = 0;
  VELLIS_THROW_IF(0 > QLIBShareIsEncryptedGet(share_info_, &is_encrypted), kErrInternal,
                  "QLIBShareis_encryptedGet failed, share=" + share_info_->szName);
  VELLIS_THROW_IF(0 > QLIBShareIsReadOnlyGet(share_info_, &is_readonly), kErrInternal,
                  "QLIBShareis_readonlyGet failed, share=" + share_info_->szName);
  return !is_encrypted && !is_readonly;
}

bool SDKShare::IsEncryption() const {
  LockMutex lock(SDKMutex());
  int is_encryption = 0;
  VELLIS_THROW_IF(0 > QLIBShareIsEncryptionGet(share_info_, &is_encryption), kErrInternal,
                  "QLIBShareIsEncryptionGet failed, share=" + share_info_->szName);
  return is_encryption == 1;
}

bool SDKShare::IsEnableRecycleBin() const {
  LockMutex lock(SDKMutex());
  int is_enabled = 0;
  VELLIS_THROW_IF(0 > QLIBShareRecycleStatusGet(share_info_, &is_enabled), kErrInternal,
                  "QLIBShareRecycleStatusGet failed, share=" + share_info_->szName);
  return is_enabled == 1;
}

std::string SDKShare::GetQueuePath() const {
  LockMutex lock(SDKMutex());
  char path[4096] = {0};
  VELLIS_THROW_IF(0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path)),
                  kErrInternal, "FILEIDXQueuePathCompose failed, share=" + share_info_->szName);
  return path;
}

std::string SDKShare::GetDBPath() const {
  LockMutex lock(SDKMutex());
  char path[4096] = {0};
  VELLIS_THROW_IF(0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path)), kErrInternal,
                  "FILEIDXDBPathCompose failed, share=" + share_info_->szName);
  return path;
}

std::string SDKShare::GetDBName() const {
  LockMutex lock(SDKMutex());
  char name[1024] = {0};
  VELLIS_THROW_IF(0 > FILEIDXGetIndexID(share_info_->szName, name, sizeof(name)), kErrInternal,
                  "FILEIDXGetIndexID failed, share=" + share_info_->szName);
  return name;
}

std::string SDKShare::GetName() const { return share_info_->szName; }

std::string SDKShare::GetPath() const { return share_info_->szPath; }

std::vector<std::string> SDKShare::Enum() {
  LockMutex lock(SDKMutex());
  std::vector<std::string> names;
  VELLIS_THROW_IF(0 > QLIBShareEnum(&names), kErrShareEnum, "QLIBShareEnum failed");
  return names;
}

}  // namespace vellis::sdk
