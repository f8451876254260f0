// A toy model of the search daemon's indexes, to put behind
// FakeSearchDaemon::SetHandler: documents are kept per index by identity
// (their full path) and the document commands act on them as the protocol
// describes (docs/protocol.md). Thread-safe.
#pragma once

#include <json/json.h>

#include <map>
#include <mutex>
#include <string>

namespace vellis::testing {

class FakeDocumentStore {
 public:
  // The answer to one request (compound requests included).
  Json::Value Handle(const Json::Value& request);

  void Put(const std::string& index, const std::string& doc_id, const Json::Value& doc);
  // The documents of `index` by identity.
  std::map<std::string, Json::Value> Docs(const std::string& index) const;

 private:
  Json::Value HandleOne(const Json::Value& request);

  mutable std::mutex mu_;
  std::map<std::string, std::map<std::string, Json::Value>> indexes_;
};

}  // namespace vellis::testing
