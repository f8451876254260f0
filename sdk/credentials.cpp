#include "sdk/credentials.h"

#include <unistd.h>

#include <memory>

#include "common/log.h"
#include "sdk/platform.h"

namespace vellis::sdk {
namespace {

// The platform calls under the names and argument shapes that the failure
// log lines quote.
int QORUUserGetByUID(uint32_t uid, std::unique_ptr<UserInfo>* out) {
  auto info = std::make_unique<UserInfo>();
  int rc = GetPlatform()->QORUUserGetByUID(uid, info.get());
  if (rc >= 0) *out = std::move(info);
  return rc;
}

bool ResetCredentialsByName(const std::string& username) {
  return GetPlatform()->ResetCredentialsByName(username, 1);
}

std::string PlatformErrorText(const std::string& username) {
  return "ResetCredentialsByName failed, user=" + username +
         ", err=" + std::to_string(GetPlatform()->QLIBCErrGet());
}

}  // namespace

Mutex& SDKMutex() {
  static Mutex* mutex = new Mutex();  // never destroyed: used until exit
  return *mutex;
}

SDKCredentials::SDKCredentials() : euid_(geteuid()), egid_(getegid()) {
  LockMutex lock(SDKMutex());
  std::unique_ptr<UserInfo> user_info;
  VELLIS_THROW_IF(0 > QORUUserGetByUID(euid_, &user_info) || !user_info, kErrCredentials,
                  "QORUUserGetByUID failed, err=" + std::to_string(GetPlatform()->QLIBCErrGet()));
  username_ = user_info->name;
}

SDKCredentials::SDKCredentials(const std::string& username) : SDKCredentials() { AsUser(username); }

void SDKCredentials::AsUser(const std::string& username) {
  LockMutex lock(SDKMutex());
  std::string target_username = username;
  // Root needs no membership test, and the group database may not list it.
  if (username != "root" && GetPlatform()->QLIBGroupIsAdminGroupMem(username, 0) == 1) {
    target_username = "root";
  }
  VELLIS_THROW_IF(!ResetCredentialsByName(target_username), kErrCredentials,
                  PlatformErrorText(target_username));
}

SDKCredentials::~SDKCredentials() noexcept(false) {
  LockMutex lock(SDKMutex());
  if (geteuid() == euid_ && getegid() == egid_) return;
  VELLIS_THROW_IF(!ResetCredentialsByName(username_), kErrCredentials,
                  PlatformErrorText(username_));
}

}  // namespace vellis::sdk
