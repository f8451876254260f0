// The one seam between the library and the system it runs on.
//
// Every call that the library imports from the appliance's platform, and the
// clock, sleeps, random numbers and the system log, go through Platform. The
// process holds one instance, reached with GetPlatform(). The real one is
// sdk/linux/LinuxPlatform; tests install a fake with SetPlatform().
//
// Conventions of the imported calls are kept: an int result of 0 (or 1 for a
// yes/no test) means success, a negative one failure. Records that the
// platform hands out are plain values owned by the caller.
//
// Thread safety: implementations must be safe for concurrent calls;
// SetPlatform itself must not race with calls through the old instance.
#pragma once

#include <cstdint>
#include <string>

namespace Json {
class Value;
}  // namespace Json

namespace vellis::sdk {

// Options of FileCopy. Fields not named are off.
struct CopyArgs {
  bool overwrite = false;      // replace an existing destination
  bool remove_source = false;  // move instead of copy
};

// A user account of the platform's user database.
struct UserInfo {
  std::string name;
  uint32_t uid = 0;
  uint32_t gid = 0;
  std::string home;
};

// Permission bits reported by QORUACLPermGet.
enum AclPerm : int {
  kAclExecute = 1,
  kAclWrite = 2,
  kAclRead = 4,
};

class Platform {
 public:
  virtual ~Platform() = default;

  // --- Clock, randomness and the system log ---
  // Seconds since the Unix epoch.
  virtual int64_t Time() = 0;
  virtual void Sleep(unsigned int seconds) = 0;
  virtual void USleep(uint64_t microseconds) = 0;
  // The process-wide rand(): 0 to RAND_MAX.
  virtual int Rand() = 0;
  // One line to the system log at `priority` (LOG_ERR, LOG_DEBUG, ...).
  virtual void Syslog(int priority, const std::string& message) = 0;

  // --- File systems ---
  // The effective user's permission bits (AclPerm) on `path` into *perm.
  // 0 on success, negative when the path cannot be examined.
  virtual int QORUACLPermGet(const std::string& path, int* perm) = 0;
  // 1 when `path` is a mount point, 0 when not, negative on failure.
  virtual int QORUFSDirIsMntPoint(const std::string& path) = 0;
  // Copies (or moves, with remove_source) a regular file. 0 on success.
  virtual int QORUFileCopy(const std::string& from, const std::string& to,
                           const CopyArgs& args) = 0;

  // --- Users ---
  // Looks a user up by name. 0 and *out filled on success, negative when
  // there is no such user.
  virtual int QORUUserGet(const std::string& name, UserInfo* out) = 0;

  // --- Content extraction ---
  // Fills *doc (replacing it) with the document of the file or directory at
  // the full path `path`: an object keyed by the metadata field names of
  // fileindex/elastic/schema.h (docs/document.md lists which). `options`
  // member "need_meta" (bool) asks for content metadata as well as the
  // file-system fields. A symbolic link is described as itself, never
  // followed. 0 on success, negative when the path cannot be examined
  // (errno says why). Implementations may also throw; callers treat that as
  // a failure.
  virtual int ParseFile(const std::string& path, const Json::Value& options,
                        Json::Value* doc) = 0;
};

// The process's platform. Never null: the Linux platform until replaced.
Platform* GetPlatform();

// Installs `platform` (not owned; must outlive its use) and returns the one it
// replaces. Passing nullptr restores the Linux platform.
Platform* SetPlatform(Platform* platform);

// Forwards every call to a target, so that a test double overrides only what
// it needs.
class PlatformWrapper : public Platform {
 public:
  explicit PlatformWrapper(Platform* target) : target_(target) {}
  Platform* target() const { return target_; }

  int64_t Time() override { return target_->Time(); }
  void Sleep(unsigned int seconds) override { target_->Sleep(seconds); }
  void USleep(uint64_t microseconds) override { target_->USleep(microseconds); }
  int Rand() override { return target_->Rand(); }
  void Syslog(int priority, const std::string& message) override {
    target_->Syslog(priority, message);
  }
  int QORUACLPermGet(const std::string& path, int* perm) override {
    return target_->QORUACLPermGet(path, perm);
  }
  int QORUFSDirIsMntPoint(const std::string& path) override {
    return target_->QORUFSDirIsMntPoint(path);
  }
  int QORUFileCopy(const std::string& from, const std::string& to,
                   const CopyArgs& args) override {
    return target_->QORUFileCopy(from, to, args);
  }
  int QORUUserGet(const std::string& name, UserInfo* out) override {
    return target_->QORUUserGet(name, out);
  }
  int ParseFile(const std::string& path, const Json::Value& options, Json::Value* doc) override {
    return target_->ParseFile(path, options, doc);
  }

 private:
  Platform* target_;
};

}  // namespace vellis::sdk
