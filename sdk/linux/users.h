// Users and groups on the Linux platform.
#pragma once

#include <string>

namespace vellis::sdk {

// The environment variable naming the administrators group. Unset or empty:
// "administrators", or "sudo" on a system that has no group of that name.
inline constexpr char kAdminGroupEnv[] = "VELLIS_ADMIN_GROUP";
inline constexpr char kDefaultAdminGroup[] = "administrators";
inline constexpr char kFallbackAdminGroup[] = "sudo";

// The name of the administrators group, as described above. Read anew on
// every call.
std::string AdminGroupName();

}  // namespace vellis::sdk
