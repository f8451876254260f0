// The live status of a folder, for listings: need of reindex, waiting
// events and pause.
#include "common/log.h"
#include "fileindex/folder.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/queue_path_filter.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex {

bool Folder::IsIndexing() const {
  QueueMgr queue(sdk::SDKShare(GetShare()).GetQueuePath());
  const std::string full_path = GetFullPath();
  // Most folders of a listing have nothing waiting; proving that by the
  // search would parse every queued event once per folder.
  if (!QueueMayHoldPath(queue.queue_path(), full_path) &&
      !QueueMayHoldPath(queue.queue_path_tmp(), full_path)) {
    return false;
  }
  return queue.IsFullPathProcessing(full_path);
}

void Folder::GetStatus(Json::Value& out) const {
  StatusMgr status;
  if (!CanPathBeIndexed(path_)) {
    out["text"] = "error";
    out["desc"] = "invalid_path";
    return;
  }
  if (status.GetShareStatus(GetShare()) & kShareStatusNeedReindex) {
    out["text"] = "need_reindex";
    return;
  }
  if (!IsIndexing()) {
    out["text"] = "finished";
    return;
  }
  // -1 (not paused) is in the past and reads as processing; a stored 0 is
  // deliberately taken as paused.
  long long resume_time = status.GetPauseInfo();
  if (resume_time != 0 && resume_time <= sdk::GetPlatform()->Time()) {
    out["text"] = "processing";
  } else {
    out["text"] = "paused";
  }
}

// The parameter keeps the spelling that the logged condition text quotes.
Json::Value Folder::GetDataWithAdditional(const Json::Value& addiitionals) const {
  Json::Value result = GetData();
  VELLIS_THROW_IF(!addiitionals.isArray(), kErrBadArgument, "additional is not an array");
  for (const Json::Value& it : addiitionals) {
    VELLIS_THROW_IF(!it.isString(), kErrBadArgument, "additional item is not a string");
    VELLIS_THROW_IF(it.asString() != "status", kErrBadArgument,
                    "Unknown additioal: " + it.asString());
    GetStatus(result["additional"]["status"]);
  }
  return result;
}

}  // namespace vellis::fileindex
