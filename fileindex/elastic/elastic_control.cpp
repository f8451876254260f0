#include "fileindex/elastic/elastic_control.h"

#include "common/fs_util.h"
#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/document_requests.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex::elastic {
namespace {

// Busy answers past this many retries are worth an administrator's look.
constexpr unsigned kRetriesBeforeNotify = 10;

std::string StringMember(const Json::Value& v, const char* key) {
  if (!v.isObject() || !v[key].isString()) return std::string();
  return v[key].asString();
}

// What the busy-retry line names. A compound request has no command or index
// of its own, so its size and first sub-request stand for it.
void DescribeRequest(const Json::Value& req, std::string* command, std::string* db) {
  const Json::Value none;
  const Json::Value& compound = req.isObject() ? req["compound"] : none;
  if (compound.isArray()) {
    const Json::Value& first = compound.empty() ? none : compound[0];
    *command = "compound[" + std::to_string(compound.size()) + "]";
    if (!StringMember(first, "command").empty()) *command += " " + StringMember(first, "command");
    *db = StringMember(first.isObject() ? first["data"] : none, "id");
    return;
  }
  *command = StringMember(req, "command");
  *db = StringMember(req.isObject() ? req["data"] : none, "id");
}

void CheckPath(const std::string& path, const char* what) {
  VELLIS_THROW_IF(path.empty() || path.back() == '/', kErrBadArgument,
                  std::string("Bad ") + what + ", path=" + path);
}

void SendDocument(const char* command, const std::string& share, const std::string& path,
                  Json::Value doc) {
  SendRequestDiscardResult(DocumentRequest(command, share, path, std::move(doc)));
}

}  // namespace

void SendRequestRetryOnBusy(Json::Value& res, const Json::Value& req) {
  unsigned retry = 0;
  bool notified = false;
  for (;;) {
    try {
      SendRequestImpl(res, req);
      return;
    } catch (const Error& e) {
      if (!IsBusyCode(e.GetCode())) throw;
    }
    std::string command, db;
    DescribeRequest(req, &command, &db);
    VELLIS_LOG_ERR("Retry[%u] since qoruelasticd is busy. Command: %s, db: %s", retry,
                   command.c_str(), db.c_str());
    ++retry;
    if (retry > kRetriesBeforeNotify && !notified) {
      NotifyLackOfMemory();
      notified = true;
    }
    sdk::Platform* platform = sdk::GetPlatform();
    platform->Sleep(static_cast<unsigned>(platform->Rand()) % 5 * 60 + 900);
  }
}

void SendRequestDiscardResult(const Json::Value& req) {
  Json::Value res;
  SendRequestRetryOnBusy(res, req);
}

std::string GetFileIndexID(const std::string& share) { return "fileindex_" + share; }

void ShareIndexCreate(const std::string& share) {
  // An unknown share fails here, before anything is sent.
  const std::string db_path = sdk::SDKShare(share).GetDBPath();
  Json::Value data = IndexData(share);
  data["path"] = db_path;
  data["settings"] = GetFileIndexSettings();
  data["mappings"] = GetFileIndexMappings();
  data["event_handler"] = GetFileIndexEventHandler();
  SendRequestDiscardResult(MakeRequest("index_create", std::move(data)));
}

void ShareIndexDelete(const std::string& share) {
  SendRequestDiscardResult(MakeRequest("index_delete", IndexData(share)));
}

void ShareIndexPause(const std::string& share) {
  SendRequestDiscardResult(MakeRequest("index_pause", IndexData(share)));
}

void ShareIndexResume(const std::string& share) {
  SendRequestDiscardResult(MakeRequest("index_resume", IndexData(share)));
}

void ShareIndexRename(const std::string& old_share, const std::string& new_share,
                      const std::string& new_path) {
  Json::Value data = IndexData(old_share);
  data["data"]["id"] = GetFileIndexID(new_share);
  data["data"]["path"] = new_path;
  SendRequestDiscardResult(MakeRequest("index_config_set", std::move(data)));
}

void ShareIndexMigrate(const std::string& share, const std::string& new_path) {
  Json::Value data = IndexData(share);
  data["data"]["path"] = new_path;
  SendRequestDiscardResult(MakeRequest("index_config_set", std::move(data)));
}

void IndexUpsert(const std::string& share, const std::string& path, bool need_meta) {
  SendRequestDiscardResult(UpsertRequest(share, path, need_meta));
}

void IndexAttr(const std::string& share, const std::string& path) {
  SendRequestDiscardResult(AttrRequest(share, path));
}

void IndexDel(const std::string& share, const std::string& path) {
  SendRequestDiscardResult(DelRequest(share, path));
}

void IndexDelDir(const std::string& share, const std::string& dir) {
  SendRequestDiscardResult(DelDirRequest(share, dir));
}

void IndexGetByPrefixPath(const std::string& share, const std::string& dir,
                          std::vector<std::string>& paths) {
  CheckPath(dir, "directory");
  Json::Value data = IndexData(share);
  data["query"] = PrefixQuery(dir);
  data["load_field"].append(kQORUMDPath);
  Json::Value res;
  SendRequestRetryOnBusy(res, MakeRequest("document_get_by_query", std::move(data)));
  for (const Json::Value& doc : QueryResults(res)) {
    if (doc.isObject() && doc[kQORUMDPath].isString()) paths.push_back(doc[kQORUMDPath].asString());
  }
}

void IndexRename(const std::string& share, const std::string& new_path,
                 const std::string& old_path) {
  CheckPath(old_path, "old path");
  CheckPath(new_path, "new path");
  const std::string name = Basename(new_path);
  Json::Value fields(Json::objectValue);
  fields[kQORUMDPath] = new_path;
  fields[kQORUMDParent] = Dirname(new_path);
  fields[kQORUMDFSName] = name;
  fields[kQORUMDSearchFileName] = name;
  fields[kQORUMDDisplayName] = name;
  fields[kQORUMDKind] = GetFileExtension(name, true);
  fields[kQORUMDExtension] = GetFileExtension(name, false);
  SendDocument("document_set_by_id", share, old_path, std::move(fields));

  Json::Value query = IndexData(share);
  query["query"] = PrefixQuery(old_path);
  for (const char* field : {kQORUMDPath, kQORUMDParent, kQORUMDFSName}) {
    query["load_field"].append(field);
  }
  Json::Value res;
  SendRequestRetryOnBusy(res, MakeRequest("document_get_by_query", std::move(query)));

  const std::string prefix = old_path + "/";
  Json::Value compound(Json::arrayValue);
  for (const Json::Value& doc : QueryResults(res)) {
    const std::string path = doc.isObject() ? StringMember(doc, kQORUMDPath) : std::string();
    if (!StringStartWith(path, prefix)) {
      // Never turn a path that the query should not have returned into
      // another one.
      VELLIS_LOG_ERR("Skip rename of a document not below %s: %s", old_path.c_str(),
                     JsonToString(doc).c_str());
      continue;
    }
    const std::string moved = std::string(path).replace(0, old_path.size(), new_path);
    Json::Value data = IndexData(share);
    data["doc_id"] = path;
    data["data"][kQORUMDPath] = moved;
    data["data"][kQORUMDParent] = Dirname(moved);
    compound.append(MakeRequest("document_set_by_id", std::move(data)));
  }
  Json::Value req(Json::objectValue);
  req["compound"] = std::move(compound);
  SendRequestDiscardResult(req);
}

void IndexCommit(const std::string& share) {
  try {
    SendRequestDiscardResult(MakeRequest("commit", IndexData(share)));
    return;
  } catch (const Error&) {
    if (sdk::SDKShare(share).IsSpaceEnough()) throw;
  }
  // A commit that failed for lack of space leaves the index incomplete.
  StatusMgr().SetShareStatus(share, kShareStatusNeedReindex);
  throw Error(kErrSpaceNotEnough, "Share (" + share + ") space not enough");
}

void UpdateTermSuggestion(const std::string& db_name, const std::vector<std::string>& doc_ids) {
  Json::Value compound(Json::arrayValue);
  for (const std::string& id : doc_ids) {
    Json::Value data(Json::objectValue);
    data["doc_id_field"] = id;
    data["db_name"] = db_name;
    compound.append(MakeRequest("update_term_suggestion", std::move(data)));
  }
  Json::Value req(Json::objectValue);
  req["compound"] = std::move(compound);
  SendRequestDiscardResult(req);
}

}  // namespace vellis::fileindex::elastic
