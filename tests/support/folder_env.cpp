#include "tests/support/folder_env.h"

namespace vellis::testing {

FolderEnv::FolderEnv() : scoped_(&platform_) {}

std::string FolderEnv::AddShare(const std::string& name) {
  sdk::ShareInfo share;
  share.szName = name;
  share.szPath = Volume() + "/" + name;
  MakeDirs(share.szPath);
  MakeDirs(Volume() + "/@fileindex/" + name);
  platform_.AddShare(share);
  return share.szPath;
}

std::string FolderEnv::FoldersFile() const {
  return root_.Path("/var/packages/Vellis/etc/fileindex.folders");
}

std::string FolderEnv::StatusFile() const {
  return root_.Path("/var/packages/Vellis/etc/fileindex.status");
}

std::string FolderEnv::QueuePath(const std::string& name) const {
  return Volume() + "/@fileindex/" + name + "/queue";
}

}  // namespace vellis::testing
