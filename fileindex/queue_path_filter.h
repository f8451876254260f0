// A quick "certainly not" to the question whether a queue file holds an
// event at or below a path, so that listing the status of many folders does
// not parse every queued event once per folder.
//
// One pass over the raw file records a 64-bit hash of every path in it and
// of each of that path's ancestors; a path whose hash is not recorded has no
// event at or below it. The pass is shared by every query in the process
// while the file stays the same (same device, inode, size, modification and
// change times); the four most recently asked files are kept, each with at
// most 2^21 distinct hashes (16 MiB): a file with more paths than that is
// not filtered (every answer is "maybe"). Thread-safe.
#pragma once

#include <string>

namespace vellis::fileindex {

// False only when no event in the queue file at `queue_path` can have a
// "path" or "path_old" at or below `full_path` (by whole components); true
// means "maybe", to be settled by QueueMgr's search. A missing file, or one
// that is not a regular file, answers false, as QueueMgr's search does; a
// file that cannot be read answers true. Never throws.
bool QueueMayHoldPath(const std::string& queue_path, const std::string& full_path);

}  // namespace vellis::fileindex
