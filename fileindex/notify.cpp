// Notifications to the administrators through the platform's notifier.
#include "fileindex/util.h"
#include "sdk/platform.h"

namespace vellis::fileindex {

int SendHMXNotify() {
  // The link opens the package's preference page from the message.
  return sdk::GetPlatform()->QLIBCExecl(
      kHmxNotifyPath, kNotifyExecOption,
      {"-c", "QORU.Vellis.Application", "-b", "true", "-e", "false", "@administrators",
       "app:displayname", "error:index_no_space",
       "<a data-qoru-app=\"QORU.Vellis.Application\" data-qoru-fn=\"preference\">", "</a>"});
}

int NotifyLackOfMemory() {
  return sdk::GetPlatform()->QLIBCExecl(kHmxNotifyPath, kNotifyExecOption,
                                        {"-c", "QORU.Vellis.Application", "@administrators",
                                         "app:displayname", "error:lack_of_memory"});
}

int NotifyWatchLimit() {
  return sdk::GetPlatform()->QLIBCExecl(
      kHmxNotifyPath, kNotifyExecOption,
      {"-c", "QORU.Vellis.Application", "@administrators", "app:displayname", "error:watch_limit"});
}

}  // namespace vellis::fileindex
