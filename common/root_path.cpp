#include "common/root_path.h"

#include <cstdlib>

#include "common/fs_util.h"

namespace vellis {

std::string RootPath(const std::string& fixed_path) {
  const char* env = getenv(kRootEnv);
  std::string root = env ? env : "";
  while (!root.empty() && root.back() == '/') root.pop_back();
  return root + fixed_path;
}

void PrepareRoot() {
  if (RootPath("").empty()) return;
  for (const char* dir : {"/tmp", "/var/run", "/var/packages/Vellis/etc",
                          "/var/packages/Vellis/var"}) {
    MakeDirs(RootPath(dir));
  }
}

}  // namespace vellis
