#include "common/root_path.h"

#include <cstdlib>

namespace vellis {

std::string RootPath(const std::string& fixed_path) {
  const char* env = getenv(kRootEnv);
  std::string root = env ? env : "";
  while (!root.empty() && root.back() == '/') root.pop_back();
  return root + fixed_path;
}

}  // namespace vellis
