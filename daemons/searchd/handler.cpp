#include "daemons/searchd/handler.h"

#include <syslog.h>

#include <exception>

#include "common/json_util.h"
#include "daemons/searchd/args.h"
#include "daemons/searchd/error_codes.h"
#include "daemons/searchd/names.h"
#include "daemons/searchd/search_request.h"
#include "sdk/platform.h"

namespace vellis::searchd {
namespace {

constexpr char kData[] = "data";
constexpr int64_t kDefaultSuggestLimit = 10;

std::string IndexId(const Json::Value& data, const char* key = "id") {
  std::string id = RequireString(data, kData, key, false);
  CheckIndexId(id);
  return id;
}

// The one field and prefix of {"qsl": {"prefix": {field: prefix}}}.
std::pair<std::string, std::string> PrefixQuery(const Json::Value& data) {
  const Json::Value& query = RequireObject(data, kData, "query");
  const Json::Value& qsl = RequireObject(query, "data.query", "qsl");
  const Json::Value& prefix = RequireObject(qsl, "data.query.qsl", "prefix");
  if (prefix.size() != 1) {
    throw Error(kErrBadMember, "data.query.qsl.prefix must hold exactly one field");
  }
  std::string field = prefix.getMemberNames()[0];
  if (!prefix[field].isString()) {
    throw Error(kErrBadMember, "data.query.qsl.prefix." + field + " must be a string");
  }
  return {field, prefix[field].asString()};
}

Json::Value InfoToJson(const IndexInfo& info, bool with_stats) {
  Json::Value out(Json::objectValue);
  out["id"] = info.id;
  out["path"] = info.path;
  out["paused"] = info.paused;
  if (with_stats) {
    out["documents"] = static_cast<Json::Int64>(info.documents);
    out["disk_bytes"] = static_cast<Json::Int64>(info.disk_bytes);
    out["merging"] = info.maintenance_pending;
  }
  return out;
}

}  // namespace

Json::Value ErrorAnswer(int code, const std::string& msg) {
  Json::Value out(Json::objectValue);
  out["success"] = false;
  out["error"]["code"] = code;
  out["error"]["msg"] = msg;
  return out;
}

std::string Handler::HandleText(const std::string& request_text) {
  Json::Value request;
  if (!JsonFromString(request, request_text) || !request.isObject()) {
    sdk::GetPlatform()->Syslog(LOG_WARNING, "searchd: refused a request that is not a JSON object");
    return JsonToString(ErrorAnswer(kErrMalformedRequest,
                                    "The request is not a JSON object (or not UTF-8 JSON text)"));
  }
  return JsonToString(Handle(request));
}

Json::Value Handler::Handle(const Json::Value& request) {
  std::lock_guard<std::mutex> lock(mu_);
  return Answer(request, false);
}

bool Handler::Idle() {
  std::lock_guard<std::mutex> lock(mu_);
  try {
    return engine_.Maintain();
  } catch (const std::exception& e) {
    sdk::GetPlatform()->Syslog(LOG_WARNING, std::string("searchd: upkeep failed: ") + e.what());
    return false;
  }
}

Json::Value Handler::Answer(const Json::Value& request, bool nested) {
  try {
    return Run(request, nested);
  } catch (const Error& e) {
    if (!IsBusyCode(e.GetCode())) {
      sdk::GetPlatform()->Syslog(
          LOG_WARNING,
          "searchd: request failed: code=" + std::to_string(e.GetCode()) + ", reason=" + e.what());
    }
    return ErrorAnswer(e.GetCode(), e.what());
  } catch (const std::exception& e) {
    sdk::GetPlatform()->Syslog(LOG_ERR, std::string("searchd: internal failure: ") + e.what());
    return ErrorAnswer(kErrStorage, std::string("Internal failure: ") + e.what());
  }
}

Json::Value Handler::Run(const Json::Value& request, bool nested) {
  if (!request.isObject()) throw Error(kErrBadMember, "A request must be a JSON object");
  if (request.isMember("compound")) {
    if (nested) throw Error(kErrBadMember, "Compound requests do not nest");
    const Json::Value& subs = request["compound"];
    if (!subs.isArray()) throw Error(kErrBadMember, "compound must be an array of requests");
    Json::Value out(Json::objectValue);
    out["success"] = true;
    out["has_fail"] = false;
    out["data"] = Json::Value(Json::arrayValue);
    for (const Json::Value& sub : subs) {
      Json::Value answer = Answer(sub, true);
      if (!answer["success"].asBool()) out["has_fail"] = true;
      out["data"].append(std::move(answer));
    }
    return out;
  }
  std::string command = RequireString(request, "request", "command");
  static const Json::Value kNoData(Json::objectValue);
  const Json::Value& data =
      request.isMember(kData) ? RequireObject(request, "request", kData) : kNoData;
  Json::Value out(Json::objectValue);
  out["success"] = true;
  out["data"] = Dispatch(command, data);
  return out;
}

Json::Value Handler::Dispatch(const std::string& command, const Json::Value& data) {
  Json::Value none(Json::objectValue);
  if (command == "index_create") {
    IndexConfig config;
    config.id = IndexId(data);
    config.path = RequireString(data, kData, "path");
    CheckDbFolder(config.path);
    config.mappings = RequireObject(data, kData, "mappings");
    config.settings = data.isMember("settings") ? data["settings"] : Json::Value(Json::objectValue);
    config.event_handler =
        data.isMember("event_handler") ? data["event_handler"] : Json::Value(Json::objectValue);
    engine_.CreateIndex(config);
    return none;
  }
  if (command == "index_delete") {
    engine_.DeleteIndex(IndexId(data));
    return none;
  }
  if (command == "index_pause" || command == "index_resume") {
    engine_.SetPaused(IndexId(data), command == "index_pause");
    return none;
  }
  if (command == "index_config_set") {
    std::string id = IndexId(data);
    const Json::Value& change = RequireObject(data, kData, "data");
    std::string new_id = OptionalString(change, "data.data", "id").value_or("");
    std::string new_path = OptionalString(change, "data.data", "path").value_or("");
    if (!change.isMember("id") && !change.isMember("path")) {
      throw Error(kErrBadMember, "data.data must hold \"id\" or \"path\"");
    }
    if (change.isMember("id")) CheckIndexId(new_id);
    if (change.isMember("path")) CheckDbFolder(new_path);
    engine_.Reconfigure(id, new_id, new_path);
    return none;
  }
  if (command == "index_list") {
    Json::Value out(Json::arrayValue);
    for (const IndexInfo& info : engine_.ListIndexes()) out.append(InfoToJson(info, false));
    return out;
  }
  if (command == "index_stats") return InfoToJson(engine_.Stats(IndexId(data)), true);
  if (command == "document_upsert_by_id") {
    engine_.Upsert(IndexId(data), RequireString(data, kData, "doc_id"),
                   RequireObject(data, kData, "data"));
    return none;
  }
  if (command == "document_set_by_id") {
    engine_.Update(IndexId(data), RequireString(data, kData, "doc_id"),
                   RequireObject(data, kData, "data"));
    return none;
  }
  if (command == "document_del_by_id") {
    Json::Value out(Json::objectValue);
    out["deleted"] = engine_.DeleteDocument(IndexId(data), RequireString(data, kData, "doc_id"));
    return out;
  }
  if (command == "document_del_by_query") {
    std::string id = IndexId(data);
    auto [field, prefix] = PrefixQuery(data);
    Json::Value out(Json::objectValue);
    out["deleted"] = static_cast<Json::Int64>(engine_.DeleteByPrefix(id, field, prefix));
    return out;
  }
  if (command == "document_get_by_query") {
    std::string id = IndexId(data);
    auto [field, prefix] = PrefixQuery(data);
    const int64_t limit = OptionalInt(data, kData, "limit").value_or(0);
    if (limit < 0) throw Error(kErrBadMember, "data.limit must not be negative");
    return engine_.GetByPrefix(id, field, prefix, StringList(data, kData, "load_field"),
                               OptionalString(data, kData, "after").value_or(""), limit);
  }
  if (command == "commit") {
    engine_.Commit(IndexId(data));
    return none;
  }
  if (command == "update_term_suggestion") {
    std::string db = IndexId(data, "db_name");
    engine_.UpdateTermSuggestion(db, RequireString(data, kData, "doc_id_field"));
    return none;
  }
  if (command == "term_suggest") {
    std::string id = IndexId(data);
    int64_t limit = OptionalInt(data, kData, "limit").value_or(kDefaultSuggestLimit);
    if (limit < 0 || limit > kMaxSearchLimit) {
      throw Error(kErrBadQuery, "data.limit must be 0 to " + std::to_string(kMaxSearchLimit));
    }
    Json::Value out(Json::arrayValue);
    for (const TermCount& t :
         engine_.SuggestTerms(id, OptionalString(data, kData, "prefix").value_or(""), limit)) {
      Json::Value e(Json::objectValue);
      e["term"] = t.term;
      e["documents"] = static_cast<Json::Int64>(t.documents);
      out.append(e);
    }
    return out;
  }
  if (command == "document_search") {
    std::string id = IndexId(data);
    SearchQuery q = ParseSearchRequest(data);
    return SearchResultToJson(engine_.Search(id, q), q);
  }
  throw Error(kErrUnknownCommand, "Unknown command \"" + command + "\"");
}

}  // namespace vellis::searchd
