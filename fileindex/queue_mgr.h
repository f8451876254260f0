// One share's queue file: rotation to its side file, and queries.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "fileindex/optree.h"

namespace vellis::fileindex {

// The lock that serialises every writer of the library and the rotation of a
// queue: a companion file beside the queue, so that the lock stays on one
// file while the queue itself is renamed away.
std::string QueueLockPath(const std::string& queue_path);

class QueueMgr {
 public:
  explicit QueueMgr(const std::string& queue_path);

  // Moves the live queue aside to "<queue>.tmp" under the queue lock, unless
  // a side file from an unfinished round is still there (then both stay as
  // they are). Does nothing when there is no live queue. Throws Error 502
  // "rename failed, reason=..." when the rename fails, and the lock's 506.
  void PrepareTmpQueue();

  // Removes the side file; a missing one is no error. Call it after the side
  // file has been processed successfully.
  void DeleteTmp();

  // A new tree of the live / side queue (the file is read at once).
  std::shared_ptr<OPTree> GetOPTree() const;
  std::shared_ptr<OPTree> GetOPTreeTmp() const;

  // With `tmp`: rotates (PrepareTmpQueue) and processes the side file; 0 when
  // there is none. Without: processes the live queue in place; 0 when there
  // is none. Returns OPTree::ProcessOP's count. The side file is never
  // deleted here, so a failure leaves it for the next round.
  unsigned int ProcessOP(const std::function<void(std::shared_ptr<OP>)>& fn, bool tmp);

  // True when the live or side queue holds an event whose "path" (or, when
  // that is not below, "path_old") lies at or below `full_path`, by whole
  // components. Unparsable lines are skipped. Throws Error 502 when a queue
  // that exists cannot be read.
  bool IsFullPathProcessing(const std::string& full_path) const;

  // True when the live or side queue holds an event of exactly 0x10000 (a
  // reindex alone) whose "path" is `full_path` or one of its ancestors.
  bool IsFullPathHasReindex(const std::string& full_path) const;

  const std::string& queue_path() const { return queue_path_; }
  const std::string& queue_path_tmp() const { return queue_path_tmp_; }

 private:
  bool FindQueue(const std::string& path,
                 const std::function<bool(const std::shared_ptr<Event>&)>& pred) const;

  std::string queue_path_;
  std::string queue_path_tmp_;
};

}  // namespace vellis::fileindex
