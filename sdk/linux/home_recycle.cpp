// Recycle bins of the home folders: "<homes share>/<user>/#recycle".
#include <dirent.h>

#include <algorithm>
#include <cerrno>

#include "common/fs_util.h"
#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"
#include "sdk/linux/share_folders.h"

namespace vellis::sdk {
namespace {

// The home folders of the "homes" share whose owner `keep` accepts, in name
// order. Entries that are not folders (links included) and the share's own
// special folders ("#recycle", "@eaDir", ...) are not homes.
template <typename Keep>
int EnumHomeRecycleBins(LinuxPlatform* platform, std::vector<std::string>* paths, Keep keep) {
  if (!paths) return FailWith(EINVAL);
  ShareInfo homes;
  if (platform->QORUShareGet(kHomesShareName, &homes) < 0) return FailWith(ENOENT);
  DIR* dir = opendir(homes.szPath.c_str());
  if (!dir) return FailWith(errno);
  std::vector<std::string> names;
  while (dirent* entry = readdir(dir)) {
    std::string name = entry->d_name;
    if (name.empty() || name[0] == '.' || name[0] == '#' || name[0] == '@') continue;
    if (!IsDirExist(homes.szPath + "/" + name, false)) continue;
    if (keep(name)) names.push_back(name);
  }
  closedir(dir);
  std::sort(names.begin(), names.end());
  for (const std::string& name : names) {
    paths->push_back(homes.szPath + "/" + name + "/" + kRecycleFolder);
  }
  return 0;
}

}  // namespace

int LinuxPlatform::QORURecycleHomeEnumRecyclePathForAuthType(std::vector<std::string>* paths,
                                                             int auth_type) {
  // This system's only account source is its own user database.
  return EnumHomeRecycleBins(this, paths, [&](const std::string& name) {
    UserInfo user;
    return auth_type == kAuthLocal && QORUUserGet(name, &user) == 0;
  });
}

int LinuxPlatform::QORURecycleHomeEnumRecyclePath(std::vector<std::string>* paths) {
  return EnumHomeRecycleBins(this, paths, [](const std::string&) { return true; });
}

}  // namespace vellis::sdk
