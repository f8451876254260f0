// Shared pieces of the search daemon's tests: request builders and
// documents. Indexes are created with the library's own mappings, so the
// tests exercise the schema that production uses.
#pragma once

#include <json/json.h>

#include <string>

#include "common/json_util.h"
#include "fileindex/elastic/schema.h"

namespace vellis::searchd::testing {

inline Json::Value Parse(const std::string& text) {
  Json::Value v;
  if (!JsonFromString(v, text)) throw std::runtime_error("bad test JSON: " + text);
  return v;
}

inline Json::Value Request(const std::string& command, const Json::Value& data) {
  Json::Value r(Json::objectValue);
  r["command"] = command;
  r["data"] = data;
  return r;
}

inline Json::Value CreateRequest(const std::string& id, const std::string& path) {
  Json::Value d(Json::objectValue);
  d["id"] = id;
  d["path"] = path;
  d["settings"] = fileindex::elastic::GetFileIndexSettings();
  d["mappings"] = fileindex::elastic::GetFileIndexMappings();
  d["event_handler"] = fileindex::elastic::GetFileIndexEventHandler();
  return Request("index_create", d);
}

// A file's document as the indexer sends it: path, name fields, size, date.
inline Json::Value FileDoc(const std::string& path, int64_t size = 100, int64_t mtime = 1000) {
  Json::Value d(Json::objectValue);
  std::string name = path.substr(path.rfind('/') + 1);
  d["QORUMDPath"] = path;
  d["QORUMDFSName"] = name;
  d["QORUMDSearchFileName"] = name;
  d["QORUMDParent"] = path.substr(0, path.rfind('/'));
  size_t dot = name.rfind('.');
  if (dot != std::string::npos) d["QORUMDExtension"] = name.substr(dot + 1);
  d["QORUMDFSSize"] = static_cast<Json::Int64>(size);
  d["QORUMDFSContentChangeDate"] = static_cast<Json::Int64>(mtime);
  d["QORUMDIsDir"] = false;
  return d;
}

inline Json::Value UpsertRequest(const std::string& id, const Json::Value& doc) {
  Json::Value d(Json::objectValue);
  d["id"] = id;
  d["doc_id"] = doc["QORUMDPath"];
  d["data"] = doc;
  return Request("document_upsert_by_id", d);
}

inline Json::Value PrefixQuery(const std::string& prefix) {
  Json::Value q(Json::objectValue);
  q["qsl"]["prefix"]["QORUMDPath"] = prefix;
  return q;
}

}  // namespace vellis::searchd::testing
