#include "tests/support/fake_document_store.h"

namespace vellis::testing {
namespace {

Json::Value Ok() {
  Json::Value v;
  v["success"] = true;
  return v;
}

Json::Value Fail(int code, const std::string& msg) {
  Json::Value v;
  v["success"] = false;
  v["error"]["code"] = code;
  v["error"]["msg"] = msg;
  return v;
}

std::string PrefixOf(const Json::Value& data) {
  return data["query"]["qsl"]["prefix"]["QORUMDPath"].asString();
}

bool StartsWith(const std::string& s, const std::string& prefix) {
  return s.compare(0, prefix.size(), prefix) == 0;
}

}  // namespace

Json::Value FakeDocumentStore::Handle(const Json::Value& request) {
  std::lock_guard<std::mutex> lock(mu_);
  if (!request.isMember("compound")) return HandleOne(request);
  Json::Value answer = Ok();
  answer["has_fail"] = false;
  answer["data"] = Json::Value(Json::arrayValue);
  for (const Json::Value& sub : request["compound"]) {
    Json::Value one = HandleOne(sub);
    if (!one["success"].asBool()) answer["has_fail"] = true;
    answer["data"].append(one);
  }
  return answer;
}

Json::Value FakeDocumentStore::HandleOne(const Json::Value& request) {
  const std::string command = request["command"].asString();
  const Json::Value& data = request["data"];
  auto& docs = indexes_[data["id"].asString()];
  const std::string doc_id = data["doc_id"].asString();
  if (command == "document_upsert_by_id") {
    docs[doc_id] = data["data"];
  } else if (command == "document_set_by_id") {
    auto it = docs.find(doc_id);
    if (it == docs.end()) return Fail(404, "no document " + doc_id);
    Json::Value doc = it->second;
    for (const std::string& key : data["data"].getMemberNames()) doc[key] = data["data"][key];
    // The path is the identity: changing it moves the document.
    docs.erase(it);
    docs[doc.get("QORUMDPath", doc_id).asString()] = doc;
  } else if (command == "document_del_by_id") {
    docs.erase(doc_id);
  } else if (command == "document_del_by_query") {
    const std::string prefix = PrefixOf(data);
    for (auto it = docs.begin(); it != docs.end();) {
      it = StartsWith(it->first, prefix) ? docs.erase(it) : std::next(it);
    }
  } else if (command == "document_get_by_query") {
    const std::string prefix = PrefixOf(data);
    Json::Value answer = Ok();
    answer["data"] = Json::Value(Json::arrayValue);
    for (const auto& [id, doc] : docs) {
      if (!StartsWith(id, prefix)) continue;
      Json::Value loaded(Json::objectValue);
      for (const Json::Value& field : data["load_field"]) {
        if (doc.isMember(field.asString())) loaded[field.asString()] = doc[field.asString()];
      }
      answer["data"].append(loaded);
    }
    return answer;
  }
  return Ok();
}

void FakeDocumentStore::Put(const std::string& index, const std::string& doc_id,
                            const Json::Value& doc) {
  std::lock_guard<std::mutex> lock(mu_);
  indexes_[index][doc_id] = doc;
}

std::map<std::string, Json::Value> FakeDocumentStore::Docs(const std::string& index) const {
  std::lock_guard<std::mutex> lock(mu_);
  auto it = indexes_.find(index);
  return it == indexes_.end() ? std::map<std::string, Json::Value>() : it->second;
}

}  // namespace vellis::testing
