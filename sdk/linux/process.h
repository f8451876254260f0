// Running programs on the Linux platform.
#pragma once

#include <string>

namespace vellis::sdk {

// The appliance's notifier, which the library runs by this path, and the
// program of ours that stands in for it.
inline constexpr char kHmxNotifyProgram[] = "/usr/qoru/bin/qoruhmxnotify";
inline constexpr char kNotifierName[] = "vellis-notify";
// Names the notifier's full path, overriding the search below.
inline constexpr char kNotifierEnv[] = "VELLIS_NOTIFY_BIN";

// The program that actually runs for `program`: for kHmxNotifyProgram,
// $VELLIS_NOTIFY_BIN when set, else "vellis-notify" in the folder of the
// running executable; any other program stays as it is.
std::string MapProgram(const std::string& program);

}  // namespace vellis::sdk
