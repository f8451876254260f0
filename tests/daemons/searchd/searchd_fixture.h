// Requests of the search daemon's tests, written as JSON text. Indexes use
// the library's own mappings, as production does.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "common/json_util.h"
#include "fileindex/elastic/schema.h"
#include "tests/support/parse_json.h"

namespace vellis::searchd::testing {

using ::vellis::testing::ParseJson;

// {"command": command, "data": data}, `data` JSON text; index `id` unless it names one.
inline Json::Value Request(const std::string& command, const std::string& data = "{}",
                           const std::string& id = "s") {
  Json::Value r(Json::objectValue);
  r["command"] = command;
  r["data"] = ParseJson(data);
  if (!r["data"].isMember("id")) r["data"]["id"] = id;
  return r;
}

inline Json::Value CreateRequest(const std::string& id, const std::string& path) {
  Json::Value r = Request("index_create", "{}", id);
  r["data"]["path"] = path;
  r["data"]["mappings"] = fileindex::elastic::GetFileIndexMappings();
  return r;
}

// The upsert of a file's document as the indexer sends it (path, name
// fields, size 100, date 1000), with the members of `extra` (JSON text).
inline Json::Value Upsert(const std::string& path, const std::string& extra = "{}") {
  const std::string name = path.substr(path.rfind('/') + 1);
  Json::Value r = Request("document_upsert_by_id", R"({"data": )" + extra + "}");
  Json::Value& d = r["data"]["data"];
  d["QORUMDPath"] = r["data"]["doc_id"] = path;
  d["QORUMDFSName"] = d["QORUMDSearchFileName"] = name;
  if (name.find('.') != std::string::npos) d["QORUMDExtension"] = name.substr(name.rfind('.') + 1);
  if (!d.isMember("QORUMDFSSize")) d["QORUMDFSSize"] = 100;
  if (!d.isMember("QORUMDFSContentChangeDate")) d["QORUMDFSContentChangeDate"] = 1000;
  if (!d.isMember("QORUMDIsDir")) d["QORUMDIsDir"] = false;
  return r;
}

inline Json::Value Compound(const std::vector<Json::Value>& requests) {
  Json::Value r;
  r["compound"] = Json::arrayValue;
  for (const Json::Value& q : requests) r["compound"].append(q);
  return r;
}

// The answer's "data" when it succeeded; a test failure otherwise.
inline Json::Value DataOf(const Json::Value& request, const Json::Value& answer) {
  EXPECT_TRUE(answer["success"].asBool())
      << JsonToString(request).substr(0, 300) << "\n-> " << JsonToString(answer);
  return answer["data"];
}

// True when `got` has every member of `want` (a missing one counts as null),
// recursively; arrays match in length, numbers by value.
inline bool Holds(const Json::Value& got, const Json::Value& want) {
  if (want.isNumeric()) return got.isNumeric() && got.asDouble() == want.asDouble();
  if (!want.isArray() && !want.isObject()) return got == want;
  if (got.type() != want.type() || (want.isArray() && got.size() != want.size())) return false;
  for (auto it = want.begin(); it != want.end(); ++it) {
    if (!Holds(want.isArray() ? got[it.index()] : got[it.name()], *it)) return false;
  }
  return true;
}

}  // namespace vellis::searchd::testing
