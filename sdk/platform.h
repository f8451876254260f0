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

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

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

// A shared folder's record, as QORUShareGet hands it out. szName and szPath
// keep the platform record's own field names, which log texts quote.
struct ShareInfo {
  std::string szName;            // the share's name ("photo")
  std::string szPath;            // its full path, ending in the name ("/volume1/photo")
  int ftp_privilege = 0;         // the FTP privilege word, passed on unchanged
  bool read_only = false;        // files may not be changed through the share
  bool encryption = false;       // the share's data is encrypted
  bool recycle_bin = false;      // deleted files go to "#recycle" at its top
  bool hide_unreadable = false;  // listings hide what a user may not read
};

// What QORUShareUserPrivGet grants a user in a share.
enum SharePriv : int {
  kSharePrivNoAccess = 0,
  kSharePrivReadOnly = 1,
  kSharePrivReadWrite = 2,
};

// Error numbers that QLIBCErrGet reports besides errno values (which are all
// below 4096).
enum PlatformErr : int {
  kPlatformErrNoSpace = 0x2900,   // 10496: too little free space on the volume
  kPlatformErrNoInodes = 0x2400,  // 9216: no free file slots (inodes) on the volume
};

// The file-system types that QORUGetFSType reports. Remote file systems are
// 20 to 29 and image file systems 30 to 39; kFsPseudo (12) stands for every
// file system of the kernel's own making, which is never indexed.
enum FsType : int {
  kFsOther = 0,  // a local file system not listed below
  kFsExt = 1,    // ext2, ext3, ext4
  kFsBtrfs = 2,
  kFsXfs = 3,
  kFsTmpfs = 4,  // a tmpfs or ramfs that is not one of the system's own
  kFsFat = 5,    // vfat, msdos, exFAT
  kFsNtfs = 6,
  kFsZfs = 7,
  kFsF2fs = 8,
  kFsOverlay = 9,
  kFsPseudo = 12,  // proc, sysfs, devtmpfs, cgroup, /run and /dev/shm tmpfs...
  kFsNfs = 20,
  kFsCifs = 21,  // CIFS and SMB
  kFsFuse = 22,  // FUSE: taken as remote, since most FUSE mounts are
  kFs9p = 23,
  kFsCeph = 24,
  kFsAfs = 25,
  kFsCoda = 26,
  kFsIso9660 = 30,
  kFsUdf = 31,
  kFsSquashfs = 32,
  kFsCramfs = 33,
  kFsErofs = 34,
  kFsRomfs = 35,
};

// Options of QLIBCExecl (bits; the others are ignored here).
enum ExecOption : int {
  kExecStdoutToNull = 0x01,  // the program's standard output goes to /dev/null
  kExecStderrToNull = 0x02,  // its standard error goes to /dev/null
};

// Sources of user accounts (the AUTH_TYPE of the home-folder hooks).
enum AuthType : int {
  kAuthLocal = 1,   // the system's own users
  kAuthDomain = 2,  // users of a Windows domain
  kAuthLdap = 3,    // users of a directory server
};

// Service controllers of QLIBServicectlStart and QLIBServicectlStop.
enum ServicectlType : int {
  kServicectlUpstart = 1,  // the package's job of the init system
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

  // --- Errors ---
  // The error of the calling thread's last failed platform call: an errno
  // value or a PlatformErr; 0 when none failed yet.
  virtual int QLIBCErrGet() = 0;

  // --- Shares ---
  // The record of the share named `name` (exact bytes) into *out. 0 on
  // success, negative when there is no such share.
  virtual int QORUShareGet(const std::string& name, ShareInfo* out) = 0;
  // The names of all shares into *names. 0 on success, negative on failure.
  virtual int QLIBShareEnum(std::vector<std::string>* names) = 0;
  // Each of these sets *value to 1 or 0 and returns 0, or returns negative.
  // Encrypted: the share uses encryption and is locked (its data is not
  // reachable). Encryption: the share uses encryption, locked or not.
  virtual int QLIBShareIsEncryptedGet(const ShareInfo& share, int* value) = 0;
  virtual int QLIBShareIsReadOnlyGet(const ShareInfo& share, int* value) = 0;
  virtual int QLIBShareIsEncryptionGet(const ShareInfo& share, int* value) = 0;
  virtual int QLIBShareRecycleStatusGet(const ShareInfo& share, int* value) = 0;
  virtual int QLIBShareHideUnreadableGet(const ShareInfo& share, int* value) = 0;
  // What `user` may do in `share` (SharePriv); negative for an unknown user.
  virtual int QORUShareUserPrivGet(const std::string& user, const ShareInfo& share) = 0;
  // The share that holds `full_path` (at or below its path, by whole
  // components): its name into `name` and its path into `path`, each
  // NUL-terminated within its size. 0 on success; negative when no share
  // holds the path or a result does not fit.
  virtual int QORUShareNamePathGet(const std::string& full_path, char* name, size_t name_size,
                                   char* path, size_t path_size) = 0;
  // 1 when the file system of `path` has `bytes` free for user `uid`; 0 when
  // not or when it cannot be told, with QLIBCErrGet saying which
  // (kPlatformErrNoSpace, kPlatformErrNoInodes, or an errno value). `flags`
  // is the platform's; 0.
  virtual int QORUQuotaIsEnough(uint32_t uid, const std::string& path, uint64_t bytes,
                                int flags) = 0;
  // The queue file and the index database folder of the share at
  // `share_path`, and the index name of the share named `share_name`, into
  // `buf`, NUL-terminated. The same input always gives the same result.
  // Return the length written; negative when it does not fit in `size`
  // bytes or the input is unusable.
  virtual int FILEIDXQueuePathCompose(const std::string& share_path, char* buf, size_t size) = 0;
  virtual int FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) = 0;
  virtual int FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) = 0;

  // --- Users and credentials ---
  // Looks a user up by id. 0 and *out filled on success, negative when there
  // is no such user.
  virtual int QORUUserGetByUID(uint32_t uid, UserInfo* out) = 0;
  // 1 when `user` belongs to the administrators group, 0 when not, negative
  // when the user or the group is unknown. `flags` is the platform's; 0.
  virtual int QLIBGroupIsAdminGroupMem(const std::string& user, int flags) = 0;
  // Makes `user` the effective user, with its primary group as effective
  // group and its supplementary groups. `flags` is the platform's; 1.
  // Returns true on success; on failure false, with the ids as before and
  // QLIBCErrGet saying why.
  virtual bool ResetCredentialsByName(const std::string& user, int flags) = 0;

  // --- Processes ---
  // Runs `program` (an absolute path) with `args` (argv[1] onwards) and
  // waits for it: no shell, standard input from /dev/null, no descriptor of
  // this process inherited. Programs of the appliance are mapped to this
  // system's own (see docs/platform.md). Returns the exit status (0 to 255);
  // negative when it cannot be started or dies of a signal.
  virtual int QLIBCExec(const std::string& program, const std::vector<std::string>& args) = 0;
  // The same with `options` (ExecOption bits).
  virtual int QLIBCExecl(const std::string& program, int options,
                         const std::vector<std::string>& args) = 0;

  // --- Text ---
  // Compares UTF-8 texts ignoring case: negative, 0 or positive.
  virtual int QLIBCUnicodeUTF8StrCaseCmp(const std::string& a, const std::string& b) = 0;

  // --- File systems ---
  // The effective user's permission bits (AclPerm) on `path` into *perm.
  // 0 on success, negative when the path cannot be examined.
  virtual int QORUACLPermGet(const std::string& path, int* perm) = 0;
  // 1 when `path` is a mount point, 0 when not, negative on failure.
  virtual int QORUFSDirIsMntPoint(const std::string& path) = 0;
  // Copies (or moves, with remove_source) a regular file. 0 on success.
  virtual int QORUFileCopy(const std::string& from, const std::string& to,
                           const CopyArgs& args) = 0;
  // The FsType of the file system holding `path`; negative when the path
  // cannot be examined. `flags` is the platform's; 0.
  virtual int QORUGetFSType(const std::string& path, int flags) = 0;
  // Non-zero when `type` is a remote / an image file system.
  virtual int QORUFSIsRemoteFS(int type) = 0;
  virtual int QORUFSIsImageFS(int type) = 0;
  // *in_snapshot = 1 when `path` lies in a share's snapshot folder
  // ("#snapshot" at the share's top), else 0; returns 0, or negative when no
  // share holds the path.
  virtual int QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) = 0;
  // 1 when `name` (one path component) is the platform's hidden metadata
  // folder ("@eaDir"), else 0.
  virtual int QORUEAIsHiddenDir(const std::string& name) = 0;
  // 1 when `full_path` is at or below "#recycle" at the top of a share whose
  // recycle bin is on; 0 when not; negative when no share holds it.
  virtual int QORUShareIsShareRecycle(const std::string& full_path) = 0;
  // 1 when `full_path` is at or below "#recycle" at the top of a user's home
  // folder in the "homes" share; 0 when not; negative when there is no
  // "homes" share. `flags` is the platform's; 11.
  virtual int QORURecycleUserHomePathIsExist(const std::string& full_path, int flags) = 0;

  // --- Users ---
  // Looks a user up by name. 0 and *out filled on success, negative when
  // there is no such user.
  virtual int QORUUserGet(const std::string& name, UserInfo* out) = 0;

  // --- Content extraction ---
  // Fills *doc (replacing it) with the document of the file or directory at
  // the full path `path`: an object keyed by the metadata field names of
  // sdk/metadata_fields.h (docs/document.md lists which). `options`
  // member "need_meta" (bool) asks for content metadata as well as the
  // file-system fields. A symbolic link is described as itself, never
  // followed. 0 on success, negative when the path cannot be examined
  // (errno says why). Implementations may also throw; callers treat that as
  // a failure.
  virtual int ParseFile(const std::string& path, const Json::Value& options, Json::Value* doc) = 0;

  // --- Services and monitor ---
  // Services are named as on the appliance ("samba", "qorucontentextractd",
  // "pkg-Vellis-fileindexd"); docs/platform.md says what each one is here.
  // Start / stop / restart `service`. With `wait`, return once it runs / has
  // ended. 0 on success, also when it already ran / was not running;
  // negative on failure (an unknown service or a program that is not
  // installed included), with QLIBCErrGet saying why.
  virtual int QLIBServiceStart(const std::string& service, bool wait) = 0;
  virtual int QLIBServiceStop(const std::string& service, bool wait) = 0;
  virtual int QLIBServiceRestart(const std::string& service) = 0;
  // The same for a package's own service run by the service controller
  // `type` (ServicectlType); they return once the controller has acted.
  virtual int QLIBServicectlStart(const std::string& service, int type) = 0;
  virtual int QLIBServicectlStop(const std::string& service, int type) = 0;
  // 1 when the file-sharing service's search support (its "spotlight"
  // option) is on; 0 when it is off, unset, or the service is not configured
  // at all.
  virtual int QORUSMBIsEnableSpotlight() = 0;
  // Switches that support on (`enable` 1) or off (0). 0 on success; negative
  // on failure (no configuration to change included), with QLIBCErrGet
  // saying why. The service itself is not restarted.
  virtual int QORUSMBSetSpotlight(int enable) = 0;
  // The source file (basename) and line at which the calling thread's last
  // platform failure was detected; "" and 0 when the platform did not record
  // them.
  virtual std::string QLIBCErrorGetFile() = 0;
  virtual int QLIBCErrorGetLine() = 0;
  // Enters or replaces, in the file-change monitor's configuration, the
  // queue `queue` of application `app` with queue type `type`: `queue` is
  // {"queue": <queue file>, "config": [{"path": <full path>, "mask": <int>,
  // "ignore": [<name>...]}...]}. True on success.
  virtual bool MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) = 0;
  // Removes the queue `queue_path` of `app`; true on success, also when it
  // was not configured.
  virtual bool MonitorQueueDelete(const std::string& queue_path, const std::string& app,
                                  int type) = 0;
  // Appends to *paths the recycle-bin folder ("<home>/#recycle") of every
  // home folder in the "homes" share: of the users of the account source
  // `auth_type` (AuthType) / of all users, in name order. 0 on success;
  // negative when there is no "homes" share or it cannot be listed.
  virtual int QORURecycleHomeEnumRecyclePathForAuthType(std::vector<std::string>* paths,
                                                        int auth_type) = 0;
  virtual int QORURecycleHomeEnumRecyclePath(std::vector<std::string>* paths) = 0;
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

  int QLIBCErrGet() override { return target_->QLIBCErrGet(); }

  int QORUShareGet(const std::string& name, ShareInfo* out) override {
    return target_->QORUShareGet(name, out);
  }
  int QLIBShareEnum(std::vector<std::string>* names) override {
    return target_->QLIBShareEnum(names);
  }
  int QLIBShareIsEncryptedGet(const ShareInfo& share, int* value) override {
    return target_->QLIBShareIsEncryptedGet(share, value);
  }
  int QLIBShareIsReadOnlyGet(const ShareInfo& share, int* value) override {
    return target_->QLIBShareIsReadOnlyGet(share, value);
  }
  int QLIBShareIsEncryptionGet(const ShareInfo& share, int* value) override {
    return target_->QLIBShareIsEncryptionGet(share, value);
  }
  int QLIBShareRecycleStatusGet(const ShareInfo& share, int* value) override {
    return target_->QLIBShareRecycleStatusGet(share, value);
  }
  int QLIBShareHideUnreadableGet(const ShareInfo& share, int* value) override {
    return target_->QLIBShareHideUnreadableGet(share, value);
  }
  int QORUShareUserPrivGet(const std::string& user, const ShareInfo& share) override {
    return target_->QORUShareUserPrivGet(user, share);
  }
  int QORUShareNamePathGet(const std::string& full_path, char* name, size_t name_size, char* path,
                           size_t path_size) override {
    return target_->QORUShareNamePathGet(full_path, name, name_size, path, path_size);
  }
  int QORUQuotaIsEnough(uint32_t uid, const std::string& path, uint64_t bytes, int flags) override {
    return target_->QORUQuotaIsEnough(uid, path, bytes, flags);
  }
  int FILEIDXQueuePathCompose(const std::string& share_path, char* buf, size_t size) override {
    return target_->FILEIDXQueuePathCompose(share_path, buf, size);
  }
  int FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) override {
    return target_->FILEIDXDBPathCompose(share_path, buf, size);
  }
  int FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) override {
    return target_->FILEIDXGetIndexID(share_name, buf, size);
  }

  int QORUUserGetByUID(uint32_t uid, UserInfo* out) override {
    return target_->QORUUserGetByUID(uid, out);
  }
  int QLIBGroupIsAdminGroupMem(const std::string& user, int flags) override {
    return target_->QLIBGroupIsAdminGroupMem(user, flags);
  }
  bool ResetCredentialsByName(const std::string& user, int flags) override {
    return target_->ResetCredentialsByName(user, flags);
  }

  int QLIBCExec(const std::string& program, const std::vector<std::string>& args) override {
    return target_->QLIBCExec(program, args);
  }
  int QLIBCExecl(const std::string& program, int options,
                 const std::vector<std::string>& args) override {
    return target_->QLIBCExecl(program, options, args);
  }

  int QLIBCUnicodeUTF8StrCaseCmp(const std::string& a, const std::string& b) override {
    return target_->QLIBCUnicodeUTF8StrCaseCmp(a, b);
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
  int QORUGetFSType(const std::string& path, int flags) override {
    return target_->QORUGetFSType(path, flags);
  }
  int QORUFSIsRemoteFS(int type) override { return target_->QORUFSIsRemoteFS(type); }
  int QORUFSIsImageFS(int type) override { return target_->QORUFSIsImageFS(type); }
  int QLIBFhsPathInSnapshot(const std::string& path, int* in_snapshot) override {
    return target_->QLIBFhsPathInSnapshot(path, in_snapshot);
  }
  int QORUEAIsHiddenDir(const std::string& name) override {
    return target_->QORUEAIsHiddenDir(name);
  }
  int QORUShareIsShareRecycle(const std::string& full_path) override {
    return target_->QORUShareIsShareRecycle(full_path);
  }
  int QORURecycleUserHomePathIsExist(const std::string& full_path, int flags) override {
    return target_->QORURecycleUserHomePathIsExist(full_path, flags);
  }
  int QORUUserGet(const std::string& name, UserInfo* out) override {
    return target_->QORUUserGet(name, out);
  }
  int ParseFile(const std::string& path, const Json::Value& options, Json::Value* doc) override {
    return target_->ParseFile(path, options, doc);
  }

  int QLIBServiceStart(const std::string& service, bool wait) override {
    return target_->QLIBServiceStart(service, wait);
  }
  int QLIBServiceStop(const std::string& service, bool wait) override {
    return target_->QLIBServiceStop(service, wait);
  }
  int QLIBServiceRestart(const std::string& service) override {
    return target_->QLIBServiceRestart(service);
  }
  int QLIBServicectlStart(const std::string& service, int type) override {
    return target_->QLIBServicectlStart(service, type);
  }
  int QLIBServicectlStop(const std::string& service, int type) override {
    return target_->QLIBServicectlStop(service, type);
  }
  int QORUSMBIsEnableSpotlight() override { return target_->QORUSMBIsEnableSpotlight(); }
  int QORUSMBSetSpotlight(int enable) override { return target_->QORUSMBSetSpotlight(enable); }
  std::string QLIBCErrorGetFile() override { return target_->QLIBCErrorGetFile(); }
  int QLIBCErrorGetLine() override { return target_->QLIBCErrorGetLine(); }
  bool MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) override {
    return target_->MonitorQueueUpsert(queue, app, type);
  }
  bool MonitorQueueDelete(const std::string& queue_path, const std::string& app,
                          int type) override {
    return target_->MonitorQueueDelete(queue_path, app, type);
  }
  int QORURecycleHomeEnumRecyclePathForAuthType(std::vector<std::string>* paths,
                                                int auth_type) override {
    return target_->QORURecycleHomeEnumRecyclePathForAuthType(paths, auth_type);
  }
  int QORURecycleHomeEnumRecyclePath(std::vector<std::string>* paths) override {
    return target_->QORURecycleHomeEnumRecyclePath(paths);
  }

 private:
  Platform* target_;
};

}  // namespace vellis::sdk
