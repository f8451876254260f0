#include "daemons/common/peer.h"

#include <sys/socket.h>

#include "common/mutex.h"
#include "sdk/credentials.h"
#include "sdk/platform.h"

namespace vellis::daemon {

Peer PeerOf(int fd) {
  Peer peer;
  ucred cred;
  socklen_t len = sizeof(cred);
  if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &cred, &len) == 0) {
    peer.pid = cred.pid;
    peer.uid = cred.uid;
    peer.gid = cred.gid;
  } else {
    // Unknown credentials must never pass for root.
    peer.pid = -1;
    peer.uid = static_cast<uid_t>(-1);
    peer.gid = static_cast<gid_t>(-1);
  }
  return peer;
}

bool IsAdministrator(const Peer& peer) {
  if (peer.uid == 0) return true;
  if (peer.uid == static_cast<uid_t>(-1)) return false;
  sdk::UserInfo user;
  LockMutex lock(sdk::SDKMutex());
  sdk::Platform* platform = sdk::GetPlatform();
  if (platform->QORUUserGetByUID(peer.uid, &user) < 0) return false;
  return platform->QLIBGroupIsAdminGroupMem(user.name, 0) == 1;
}

}  // namespace vellis::daemon
