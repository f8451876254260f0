// Where the fixed paths of the system live.
#pragma once

#include <string>

namespace vellis {

// The environment variable naming the root directory under which every fixed
// path (configuration, status, lock and socket files) is resolved.
inline constexpr char kRootEnv[] = "VELLIS_ROOT";

// `fixed_path` (absolute, such as "/var/run/fileindexd.sock") under the root
// named by $VELLIS_ROOT: the root with its trailing slashes removed, followed
// by `fixed_path`. Unset, empty or "/": `fixed_path` unchanged. Read anew on
// every call.
std::string RootPath(const std::string& fixed_path);

// Under a root other than "/", creates the folders that the fixed paths live
// in (tmp, var/run, the package's etc and var folders), so that a fresh root
// works like a real system. Does nothing under "/". Programs call it once at
// start; failures show up later where a file cannot be made.
void PrepareRoot();

}  // namespace vellis
