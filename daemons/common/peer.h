// The process at the other end of a daemon's connection, and who may
// change things through it.
#pragma once

#include <sys/types.h>

namespace vellis::daemon {

// The peer's credentials as the kernel saw them at connect time
// (SO_PEERCRED). Unknown credentials are pid -1, uid and gid (uid_t)-1.
struct Peer {
  pid_t pid = 0;
  uid_t uid = 0;
  gid_t gid = 0;
};

// The credentials of the connected Unix socket `fd`; unknown ones when the
// kernel cannot tell.
Peer PeerOf(int fd);

// True when the peer runs as root, or as a user whom the platform counts
// among the administrators. False for unknown credentials and unknown
// users. Thread-safe.
bool IsAdministrator(const Peer& peer);

}  // namespace vellis::daemon
