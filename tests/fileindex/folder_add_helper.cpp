// A second process for the folder tests: adds folders as another management
// process would, under the root that $VELLIS_ROOT names, reaching the fake
// daemons that the test's own process serves on their sockets there.
//
// Usage: folder_add_helper <share name> <share path> <folder>...
// The share is the only one its fake platform knows; each folder (a share
// path such as "/photo/p0") is added in a call of its own. Exits 0 when every
// add succeeded, 1 when one threw (its message on stderr), 2 on bad usage.
#include <json/json.h>

#include <iostream>

#include "common/error.h"
#include "fileindex/index_mgr.h"
#include "tests/support/index_mgr_env.h"

int main(int argc, char** argv) {
  using vellis::testing::IndexMgrEnv;
  if (argc < 4) {
    std::cerr << "usage: " << argv[0] << " <share name> <share path> <folder>...\n";
    return 2;
  }
  vellis::testing::FakeServicesPlatform platform;
  vellis::testing::ScopedPlatform scoped(&platform);
  // The folder lock's retry waits must pass for real: the other process
  // releases the lock only as time goes by.
  platform.SetRealUSleep(20);
  vellis::sdk::ShareInfo share;
  share.szName = argv[1];
  share.szPath = argv[2];
  platform.AddShare(share);

  int rc = 0;
  for (int i = 3; i < argc; ++i) {
    Json::Value list(Json::arrayValue);
    list.append(IndexMgrEnv::FolderJson(argv[i]));
    try {
      vellis::fileindex::FolderAdd(list, false);
    } catch (const vellis::Error& e) {
      std::cerr << argv[i] << ": " << e.Message() << "\n";
      rc = 1;
    }
  }
  return rc;
}
