// vellis-notify: delivers a notification to the administrators by appending
// it to the notifications file and writing it to the system log.
//   vellis-notify -c APP [-b VALUE] [-e VALUE] RECIPIENTS TITLE MESSAGE [PARAM...]
// Exit status: 0 delivered, 1 not written, 2 bad arguments.
#include <syslog.h>

#include <cerrno>
#include <cstring>
#include <iostream>
#include <string>
#include <vector>

#include "sdk/platform.h"
#include "tools/notify/notification.h"

int main(int argc, char** argv) {
  std::vector<std::string> args(argv + 1, argv + argc);
  vellis::notify::Notification n;
  std::string problem;
  if (!vellis::notify::ParseNotifyArgs(args, &n, &problem)) {
    std::cerr << "vellis-notify: " << problem << "\n"
              << "usage: vellis-notify -c APP [-b VALUE] [-e VALUE] RECIPIENTS TITLE MESSAGE "
                 "[PARAM...]\n";
    return 2;
  }
  openlog("vellis-notify", LOG_PID, LOG_USER);
  vellis::sdk::Platform* platform = vellis::sdk::GetPlatform();
  std::string line = vellis::notify::NotificationLine(n, platform->Time());
  platform->Syslog(LOG_NOTICE, "notification for " + n.recipients + ": " + line);
  if (!vellis::notify::AppendNotification(line)) {
    platform->Syslog(LOG_ERR, std::string("notification not written: ") + strerror(errno));
    return 1;
  }
  return 0;
}
