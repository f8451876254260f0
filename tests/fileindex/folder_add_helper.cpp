// folder_add_helper <share name> <share path> <folder>...: adds each folder
// in a call of its own, as a second management process would, under
// $VELLIS_ROOT; exits 0 when every add succeeded.
#include <iostream>

#include "common/error.h"
#include "fileindex/index_mgr.h"
#include "tests/support/folder_env.h"

int main(int argc, char** argv) {
  if (argc < 4) return 2;
  vellis::testing::FakeServicesPlatform platform;
  vellis::testing::ScopedPlatform scoped(&platform);
  // The folder lock's retry waits must pass for real.
  platform.SetRealUSleep(20);
  vellis::sdk::ShareInfo share;
  share.szName = argv[1];
  share.szPath = argv[2];
  platform.AddShare(share);
  int rc = 0;
  for (int i = 3; i < argc; ++i) {
    try {
      vellis::fileindex::FolderAdd(
          vellis::testing::IndexMgrTest::List(vellis::testing::Strings{argv[i]}), false);
    } catch (const vellis::Error& e) {
      std::cerr << argv[i] << ": " << e.Message() << "\n";
      rc = 1;
    }
  }
  return rc;
}
