// Shared pieces of the search daemon's tests: the index mappings of a share
// (the fields that the tests exercise, with the share template's settings),
// request builders and documents.
#pragma once

#include <json/json.h>

#include <string>

#include "common/json_util.h"

namespace vellis::searchd::testing {

inline Json::Value Parse(const std::string& text) {
  Json::Value v;
  if (!JsonFromString(v, text)) throw std::runtime_error("bad test JSON: " + text);
  return v;
}

// The mappings of a share index for the fields the tests use.
inline Json::Value ShareMappings() {
  return Parse(R"({
    "property_id": "QORUMDPath",
    "default": {"type": "string", "analyzer": "qorustandard", "required": false,
                "stored": true, "_all": true},
    "properties": {
      "QORUMDPath": {"analyzer": "keyword", "required": true, "_all": false},
      "QORUMDFSName": {"analyzer": "keyword", "_all": false},
      "QORUMDIsDir": {"type": "bool", "_all": false},
      "QORUMDOwnerUserID": {"analyzer": "keyword", "_all": false},
      "QORUMDFSSize": {"type": "int"},
      "QORUMDFSContentChangeDate": {"type": "int"},
      "QORUMDAuthors": {"type": "text", "analyzer": "white space"},
      "QORUMDTitle": {"type": "text"},
      "QORUMDDurationSecond": {"type": "double"},
      "QORUMDMediaTypes": {"analyzer": "keyword"},
      "QORUMDParent": {"analyzer": "keyword", "_all": false},
      "QORUMDExtension": {"analyzer": "keyword", "_all": false},
      "QORUMDTextContent": {"type": "text"},
      "QORUMDKeywords": {},
      "QORUMDSearchFileName": {"type": "text", "analyzer": "white space",
                               "preprocess": ["tolower", "ngram"]}
    }})");
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
  d["settings"] = Json::Value(Json::objectValue);
  d["mappings"] = ShareMappings();
  d["event_handler"]["lib_path"] = "/var/packages/Vellis/target/handler/fileindex_event_handler.so";
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
