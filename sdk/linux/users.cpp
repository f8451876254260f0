// User and group lookups and the switch of effective identity.
#include "sdk/linux/users.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

// A buffer for the *_r lookups, grown while they answer ERANGE.
template <typename Lookup>
int LookupWithBuffer(Lookup lookup) {
  std::vector<char> buf(16384);
  for (;;) {
    int rc = lookup(buf);
    if (rc != ERANGE || buf.size() >= (1u << 24)) return rc;
    buf.resize(buf.size() * 2);
  }
}

// Group `name`: its id and members into the outputs. False when there is
// none or the lookup fails.
bool GetGroup(const std::string& name, gid_t* gid, std::vector<std::string>* members) {
  bool found = false;
  int rc = LookupWithBuffer([&](std::vector<char>& buf) {
    group gr;
    group* result = nullptr;
    int err = getgrnam_r(name.c_str(), &gr, buf.data(), buf.size(), &result);
    if (err == 0 && result) {
      found = true;
      *gid = gr.gr_gid;
      members->clear();
      for (char** m = gr.gr_mem; m && *m; ++m) members->push_back(*m);
    }
    return err;
  });
  if (rc != 0) errno = rc;
  return found;
}

bool GroupExists(const std::string& name) {
  gid_t gid;
  std::vector<std::string> members;
  return GetGroup(name, &gid, &members);
}

std::vector<gid_t> CurrentGroups() {
  int n = getgroups(0, nullptr);
  std::vector<gid_t> groups(n > 0 ? static_cast<size_t>(n) : 0);
  if (n > 0) groups.resize(static_cast<size_t>(getgroups(n, groups.data())));
  return groups;
}

}  // namespace

std::string AdminGroupName() {
  const char* env = getenv(kAdminGroupEnv);
  if (env && *env) return env;
  return GroupExists(kDefaultAdminGroup) ? kDefaultAdminGroup : kFallbackAdminGroup;
}

int LinuxPlatform::QORUUserGetByUID(uint32_t uid, UserInfo* out) {
  bool found = false;
  int rc = LookupWithBuffer([&](std::vector<char>& buf) {
    passwd pw;
    passwd* result = nullptr;
    int err = getpwuid_r(static_cast<uid_t>(uid), &pw, buf.data(), buf.size(), &result);
    if (err == 0 && result) {
      found = true;
      out->name = pw.pw_name;
      out->uid = pw.pw_uid;
      out->gid = pw.pw_gid;
      out->home = pw.pw_dir ? pw.pw_dir : "";
    }
    return err;
  });
  if (!found) return FailWith(rc != 0 ? rc : ENOENT);
  return 0;
}

int LinuxPlatform::QLIBGroupIsAdminGroupMem(const std::string& user, int /*flags*/) {
  UserInfo info;
  if (QORUUserGet(user, &info) < 0) return FailWith(ENOENT);
  gid_t gid;
  std::vector<std::string> members;
  if (!GetGroup(AdminGroupName(), &gid, &members)) return FailWith(ENOENT);
  if (info.gid == gid) return 1;
  for (const std::string& m : members) {
    if (m == info.name) return 1;
  }
  return 0;
}

bool LinuxPlatform::ResetCredentialsByName(const std::string& user, int /*flags*/) {
  UserInfo info;
  if (QORUUserGet(user, &info) < 0) {
    SetPlatformError(ENOENT);
    return false;
  }
  uid_t old_euid = geteuid();
  gid_t old_egid = getegid();
  std::vector<gid_t> old_groups = CurrentGroups();
  // Groups may only be changed as root: a process that runs as another
  // effective user returns to root first, which its saved id allows when it
  // was started as root, and which fails (EPERM) otherwise.
  if (old_euid != 0 && seteuid(0) != 0) {
    SetPlatformError(errno);
    return false;
  }
  if (initgroups(info.name.c_str(), info.gid) == 0 && setegid(info.gid) == 0 &&
      seteuid(info.uid) == 0) {
    return true;
  }
  // Still root here (seteuid is the last step): put everything back.
  int err = errno;
  setgroups(old_groups.size(), old_groups.data());
  setegid(old_egid);
  seteuid(old_euid);
  SetPlatformError(err);
  return false;
}

}  // namespace vellis::sdk
