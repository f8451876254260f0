#include "tests/support/folder_env.h"

#include <gtest/gtest.h>

#include "common/error.h"
#include "common/json_util.h"

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

std::shared_ptr<fileindex::Folder> MakeFolder(const std::string& path, const std::string& name,
                                              bool document, bool audio, bool video, bool photo) {
  return std::make_shared<fileindex::Folder>(path, name, document, audio, video, photo, false,
                                             false);
}

}  // namespace vellis::testing
