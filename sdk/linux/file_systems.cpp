// File-system types from statfs magic numbers.
#include "sdk/linux/file_systems.h"

#include <sys/vfs.h>

#include <cerrno>

#include "common/fs_util.h"
#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

struct MagicType {
  uint64_t magic;
  int type;
};

// The kernel's magic numbers (linux/magic.h and the file systems' own
// sources), including those of out-of-tree file systems such as ZFS.
constexpr MagicType kMagicTypes[] = {
    {0xEF53, kFsExt},
    {0x9123683E, kFsBtrfs},
    {0x58465342, kFsXfs},
    {0x01021994, kFsTmpfs},  // tmpfs; also devtmpfs, told apart by place
    {0x858458F6, kFsTmpfs},  // ramfs
    {0x4D44, kFsFat},        // msdos and vfat
    {0x2011BAB0, kFsFat},    // exFAT
    {0x5346544E, kFsNtfs},   // ntfs and ntfs3
    {0x2FC12FC1, kFsZfs},
    {0xF2F52010, kFsF2fs},
    {0x794C7630, kFsOverlay},
    // The kernel's own file systems.
    {0x9FA0, kFsPseudo},      // proc
    {0x62656572, kFsPseudo},  // sysfs
    {0x1CD1, kFsPseudo},      // devpts
    {0x27E0EB, kFsPseudo},    // cgroup
    {0x63677270, kFsPseudo},  // cgroup2
    {0x64626720, kFsPseudo},  // debugfs
    {0x74726163, kFsPseudo},  // tracefs
    {0x73636673, kFsPseudo},  // securityfs
    {0xF97CFF8C, kFsPseudo},  // selinuxfs
    {0x6165676C, kFsPseudo},  // pstore
    {0xCAFE4A11, kFsPseudo},  // bpf
    {0x19800202, kFsPseudo},  // mqueue
    {0x958458F6, kFsPseudo},  // hugetlbfs
    {0x42494E4D, kFsPseudo},  // binfmt_misc
    {0x62656570, kFsPseudo},  // configfs
    {0xDE5E81E4, kFsPseudo},  // efivarfs
    {0x6E736673, kFsPseudo},  // nsfs
    {0x0187, kFsPseudo},      // autofs
    {0x50495045, kFsPseudo},  // pipefs
    {0x534F434B, kFsPseudo},  // sockfs
    // Remote file systems.
    {0x6969, kFsNfs},
    {0xFF534D42, kFsCifs},  // cifs
    {0xFE534D42, kFsCifs},  // smb2/smb3
    {0x517B, kFsCifs},      // smbfs
    {0x65735546, kFsFuse},  // fuse: sshfs, s3fs and the like; no way to tell
    {0x01021997, kFs9p},
    {0x00C36400, kFsCeph},
    {0x5346414F, kFsAfs},  // kAFS
    {0x6B414653, kFsAfs},  // OpenAFS
    {0x73757245, kFsCoda},
    // Image file systems.
    {0x9660, kFsIso9660},
    {0x15013346, kFsUdf},
    {0x73717368, kFsSquashfs},
    {0x28CD3D45, kFsCramfs},
    {0x453DCD28, kFsCramfs},  // cramfs of the other byte order
    {0xE0F5E1E2, kFsErofs},
    {0x7275, kFsRomfs},
};

// Where the system mounts its own tmpfs instances.
constexpr const char* kSystemTrees[] = {"/run", "/dev", "/sys", "/proc"};

}  // namespace

int FsTypeFromMagic(uint64_t magic, const std::string& path) {
  // statfs reports f_type sign-extended on some 32-bit ABIs.
  magic &= 0xFFFFFFFFu;
  for (const MagicType& m : kMagicTypes) {
    if (m.magic != magic) continue;
    if (m.type != kFsTmpfs) return m.type;
    for (const char* tree : kSystemTrees) {
      if (StringStartWith(path + "/", std::string(tree) + "/")) return kFsPseudo;
    }
    return kFsTmpfs;
  }
  return kFsOther;
}

bool IsRemoteFsType(int type) { return type >= 20 && type <= 29; }

bool IsImageFsType(int type) { return type >= 30 && type <= 39; }

int LinuxPlatform::QORUGetFSType(const std::string& path, int /*flags*/) {
  struct statfs fs;
  if (statfs(path.c_str(), &fs) != 0) return FailWith(errno);
  std::string canonical = RealPath(path);
  if (canonical.empty()) return FailWith(errno ? errno : ENOENT);
  return FsTypeFromMagic(static_cast<uint64_t>(fs.f_type), canonical);
}

int LinuxPlatform::QORUFSIsRemoteFS(int type) { return IsRemoteFsType(type) ? 1 : 0; }

int LinuxPlatform::QORUFSIsImageFS(int type) { return IsImageFsType(type) ? 1 : 0; }

}  // namespace vellis::sdk
