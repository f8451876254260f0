#include "fileindex/queue_mgr.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/fs_util.h"
#include "common/line_reader.h"
#include "common/lock_file.h"
#include "common/log.h"

namespace vellis::fileindex {
namespace {

// `path` is `dir` itself or lies below it, by whole components.
bool IsAtOrBelow(const std::string& path, const std::string& dir) {
  return StringStartWith(path + "/", dir + "/");
}

}  // namespace

std::string QueueLockPath(const std::string& queue_path) { return queue_path + ".lock"; }

QueueMgr::QueueMgr(const std::string& queue_path)
    : queue_path_(queue_path), queue_path_tmp_(queue_path + ".tmp") {}

void QueueMgr::PrepareTmpQueue() {
  if (!IsFileExist(queue_path_)) return;
  LockFile lock(QueueLockPath(queue_path_), true);
  if (IsFileExist(queue_path_tmp_)) return;  // the older round goes first
  VELLIS_THROW_IF(0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str()), kErrInternal,
                  std::string("rename failed, reason=") + strerror(errno));
}

void QueueMgr::DeleteTmp() { Unlink(queue_path_tmp_); }

std::shared_ptr<OPTree> QueueMgr::GetOPTree() const {
  return std::make_shared<OPTree>(queue_path_);
}

std::shared_ptr<OPTree> QueueMgr::GetOPTreeTmp() const {
  return std::make_shared<OPTree>(queue_path_tmp_);
}

unsigned int QueueMgr::ProcessOP(const std::function<void(std::shared_ptr<OP>)>& fn, bool tmp) {
  std::shared_ptr<OPTree> tree;
  if (tmp) {
    PrepareTmpQueue();
    if (!IsFileExist(queue_path_tmp_)) return 0;
    tree = GetOPTreeTmp();
  } else {
    if (!IsFileExist(queue_path_)) return 0;
    tree = GetOPTree();
  }
  return tree->ProcessOP(fn);
}

bool QueueMgr::FindQueue(const std::string& path,
                         const std::function<bool(const std::shared_ptr<Event>&)>& pred) const {
  if (!IsFileExist(path)) return false;
  LineReader reader;
  VELLIS_THROW_IF(!reader.Open(path), kErrInternal,
                  std::string("Failed to open queue, reason=") + strerror(errno));
  std::string_view line;
  for (;;) {
    LineReader::Status status = reader.Next(&line);
    if (status == LineReader::Status::kEnd) return false;
    VELLIS_THROW_IF(status == LineReader::Status::kError, kErrInternal,
                    std::string("Failed to read queue, reason=") + strerror(errno));
    if (status == LineReader::Status::kTooLong) continue;
    std::shared_ptr<Event> event;
    try {
      event = std::make_shared<Event>(std::string(line));
    } catch (const Error&) {
      continue;  // the tree's reader logs and skips such lines as well
    }
    if (pred(event)) return true;
  }
}

bool QueueMgr::IsFullPathProcessing(const std::string& full_path) const {
  auto pred = [&full_path](const std::shared_ptr<Event>& e) {
    return IsAtOrBelow(e->path, full_path) ||
           (!e->path_old.empty() && IsAtOrBelow(e->path_old, full_path));
  };
  return FindQueue(queue_path_, pred) || FindQueue(queue_path_tmp_, pred);
}

bool QueueMgr::IsFullPathHasReindex(const std::string& full_path) const {
  auto pred = [&full_path](const std::shared_ptr<Event>& e) {
    return e->event == kEventReindex && IsAtOrBelow(full_path, e->path);
  };
  return FindQueue(queue_path_, pred) || FindQueue(queue_path_tmp_, pred);
}

}  // namespace vellis::fileindex
