// Events that the library itself queues for the indexing daemon: renames
// made by management operations, reindex requests and configuration
// updates. They go into the share's queue in the monitor's line format, so
// that they are folded and processed in order with the monitored changes.
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::fileindex {

// Appends the line {"data": data, "event": event, "path": path, "path_old":
// path_old} and a newline to the queue of the share that holds the full path
// `path` ("path" is the new path of a rename, "path_old" the former one).
// The queue's lock (QueueLockPath) is held from before the queue is opened
// until the line is written, so a rotation of the queue never splits or
// loses it, and the line is written with one write(2) on an O_APPEND
// descriptor, so concurrent appenders never interleave with it. The queue
// (and its folder) is created when missing; a queue that is a symbolic
// link, a FIFO or anything but a regular file is refused.
//
// Never throws: a failure (no share holds the path, the share does not
// exist, its queue path cannot be composed, the lock cannot be taken, the
// queue cannot be written) is logged with its code and reason, and the
// share is flagged need-reindex (StatusMgr::SetShareStatus(share,
// kShareStatusNeedReindex)), so that the lost event is made good by
// reindexing the whole share. When no share holds `path` there is nothing
// to flag and the failure is only logged.
void AddCustomEvent(int event, const std::string& path, const std::string& path_old,
                    const Json::Value& data);

}  // namespace vellis::fileindex
