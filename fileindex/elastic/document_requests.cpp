#include "fileindex/elastic/document_requests.h"

#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "sdk/platform.h"

namespace vellis::fileindex::elastic {
namespace {

void CheckPath(const std::string& path, const char* what) {
  VELLIS_THROW_IF(path.empty() || path.back() == '/', kErrBadArgument,
                  std::string("Bad ") + what + ", path=" + path);
}

}  // namespace

Json::Value MakeRequest(const char* command, Json::Value data) {
  Json::Value req(Json::objectValue);
  req["command"] = command;
  req["data"] = std::move(data);
  return req;
}

Json::Value IndexData(const std::string& share) {
  Json::Value data(Json::objectValue);
  data["id"] = GetFileIndexID(share);
  return data;
}

Json::Value PrefixQuery(const std::string& dir) {
  Json::Value query;
  query["qsl"]["prefix"][kQORUMDPath] = dir + "/";
  return query;
}

Json::Value ExtractDocument(const std::string& path, bool need_meta) {
  Json::Value options(Json::objectValue);
  options[kCENeedMeta] = need_meta;
  Json::Value doc;
  int ret = -1;
  try {
    ret = sdk::GetPlatform()->ParseFile(path, options, &doc);
  } catch (...) {
    ret = -1;  // whatever the extractor throws is one failure to the caller
  }
  VELLIS_THROW_IF(0 != ret || !doc.isObject(), kErrParseFailed, "Parse failed, path=" + path);
  // The file name is searched through the n-gram field.
  if (doc.isMember(kQORUMDFSName)) doc[kQORUMDSearchFileName] = doc[kQORUMDFSName];
  return doc;
}

Json::Value DocumentRequest(const char* command, const std::string& share, const std::string& path,
                            Json::Value doc) {
  Json::Value data = IndexData(share);
  data["doc_id"] = path;
  data["data"] = std::move(doc);
  return MakeRequest(command, std::move(data));
}

Json::Value UpsertRequest(const std::string& share, const std::string& path, bool need_meta) {
  return DocumentRequest("document_upsert_by_id", share, path, ExtractDocument(path, need_meta));
}

Json::Value AttrRequest(const std::string& share, const std::string& path) {
  return DocumentRequest("document_set_by_id", share, path, ExtractDocument(path, false));
}

Json::Value DelRequest(const std::string& share, const std::string& path) {
  Json::Value data = IndexData(share);
  data["doc_id"] = path;
  return MakeRequest("document_del_by_id", std::move(data));
}

Json::Value DelDirRequest(const std::string& share, const std::string& dir) {
  CheckPath(dir, "directory");
  Json::Value data = IndexData(share);
  data["query"] = PrefixQuery(dir);
  return MakeRequest("document_del_by_query", std::move(data));
}

const Json::Value& QueryResults(const Json::Value& res) {
  VELLIS_THROW_IF(!res.isMember("data") || !res["data"].isArray(), kErrNoData,
                  "No data array in the answer, res=" + JsonToString(res));
  return res["data"];
}

Json::Value IndexGetPage(const std::string& share, const std::string& dir, const std::string& after,
                         int limit, const std::vector<std::string>& fields) {
  CheckPath(dir, "directory");
  Json::Value data = IndexData(share);
  data["query"] = PrefixQuery(dir);
  data["load_field"].append(kQORUMDPath);
  for (const std::string& f : fields) data["load_field"].append(f);
  data["after"] = after;
  data["limit"] = limit;
  Json::Value res;
  SendRequestRetryOnBusy(res, MakeRequest("document_get_by_query", std::move(data)));
  return QueryResults(res);
}

}  // namespace vellis::fileindex::elastic
