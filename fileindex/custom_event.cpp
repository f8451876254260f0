#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/fs_util.h"
#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace vellis::fileindex {
namespace {

// One write(2) of the whole line: O_APPEND places it at the end of the file
// in one step, so the monitor appending at the same time cannot tear it.
void AppendLine(const std::string& queue_path, const std::string& line) {
  int fd = -1;
  VELLIS_THROW_IF(0 > (fd = OpenRegularFile(queue_path, O_WRONLY | O_APPEND | O_CREAT)),
                  kErrInternal, "open failed, path=" + queue_path + ", reason=" + strerror(errno));
  ssize_t written;
  do {
    written = write(fd, line.data(), line.size());
  } while (written < 0 && errno == EINTR);
  int saved = errno;
  if (written > 0 && static_cast<size_t>(written) < line.size()) {
    // A full disk cut the line: end the fragment so that the next appended
    // line is not glued to it; the reader skips the fragment alone.
    if (write(fd, "\n", 1) < 0) saved = errno;
  }
  close(fd);
  errno = saved;
  VELLIS_THROW_IF(written < 0 || static_cast<size_t>(written) != line.size(), kErrInternal,
                  "write failed, path=" + queue_path + ", reason=" + strerror(errno));
}

}  // namespace

void AppendQueueLines(const std::string& queue_path, const std::string& lines) {
  // The queue's folder may not exist before the share's first event; a
  // failure shows when the lock or the queue is opened.
  MakeDirs(Dirname(queue_path));
  LockFile lock(QueueLockPath(queue_path), true);
  AppendLine(queue_path, lines);
}

void AddCustomEvent(int event, const std::string& path, const std::string& path_old,
                    const Json::Value& data) {
  std::string share_name;
  try {
    std::string share_path;
    GetShareNamePathByFullPath(share_name, share_path, path);
    const std::string queue_path = sdk::SDKShare(share_name).GetQueuePath();

    Json::Value line(Json::objectValue);
    line["event"] = event;
    line["path"] = path;
    line["path_old"] = path_old;
    line["data"] = data;
    const std::string text = JsonToString(line) + "\n";

    AppendQueueLines(queue_path, text);
    return;
  } catch (const Error& e) {
    VELLIS_LOG_ERRNO("AddCustomEvent failed, code=%d, reason=%s. Set [%s] need reindex",
                     static_cast<int>(e.GetCode()), e.what(), share_name.c_str());
  }
  if (share_name.empty()) return;
  try {
    StatusMgr().SetShareStatus(share_name, kShareStatusNeedReindex);
  } catch (const Error& e) {
    VELLIS_LOG_ERRNO("Failed to set [%s] need reindex, code=%d, reason=%s", share_name.c_str(),
                     static_cast<int>(e.GetCode()), e.what());
  }
}

}  // namespace vellis::fileindex
