// Reindex requests for recycle bins whose indexability has changed.
#include <new>
#include <string>
#include <vector>

#include "common/fs_util.h"
#include "common/log.h"
#include "fileindex/util.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex {
namespace {

constexpr size_t kRecyclePathListCapacity = 1024;
constexpr char kShareRecycleFolder[] = "/#recycle";

// One reindex per path, in list order; AddCustomEvent deals with a failed
// one (the share is flagged for a reindex) and the loop goes on.
void QueueReindexes(const std::vector<std::string>& paths) {
  for (const std::string& path : paths) {
    if (path.empty()) continue;
    AddCustomEvent(kEventReindex, path, "", Json::Value());
  }
}

bool AllocPathList(std::vector<std::string>* list) {
  try {
    list->reserve(kRecyclePathListCapacity);
    return true;
  } catch (const std::bad_alloc&) {
    return false;
  }
}

}  // namespace

void HomeEnable(int auth_type) {
  std::vector<std::string> list;
  if (!AllocPathList(&list)) {
    VELLIS_LOG_ERRNO("QLIBCSzListAlloc failed");
    return;
  }
  if (0 > sdk::GetPlatform()->QORURecycleHomeEnumRecyclePathForAuthType(&list, auth_type)) {
    VELLIS_LOG_ERRNO("QORURecycleHomeEnumRecyclePathForAuthType failed. auth: %d", auth_type);
    return;
  }
  QueueReindexes(list);
}

void HomeDisable(int auth_type) {
  std::vector<std::string> list;
  if (!AllocPathList(&list)) {
    VELLIS_LOG_ERRNO("QLIBCSzListAlloc failed");
    return;
  }
  // Every home: once the home service is off for one account source, which
  // homes belonged to it can no longer be told.
  if (0 > sdk::GetPlatform()->QORURecycleHomeEnumRecyclePath(&list)) {
    VELLIS_LOG_ERRNO("QORURecycleHomeEnumRecyclePath failed. auth: %d", auth_type);
    return;
  }
  QueueReindexes(list);
}

void ShareCheckRecycle(const std::string& share_name) {
  sdk::SDKShare share(share_name);
  // Whether the recycle bin is on is not asked: the reindex lets the
  // indexability rules decide afresh.
  if (!IsDirExist(share.GetPath(), false)) return;
  AddCustomEvent(kEventReindex, share.GetPath() + kShareRecycleFolder, "", Json::Value());
}

}  // namespace vellis::fileindex
