#include "daemons/searchd/registry.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "common/json_util.h"
#include "daemons/searchd/error_codes.h"

namespace vellis::searchd {

Registry::Registry(std::string file) : file_(std::move(file)) {
  struct stat st;
  if (stat(file_.c_str(), &st) != 0 && errno == ENOENT) return;
  Json::Value root;
  if (!JsonFromFile(root, file_) || !root.isObject() || !root["indexes"].isObject()) {
    throw Error(kErrStorage, "Index registry " + file_ + " is unreadable");
  }
  const Json::Value& list = root["indexes"];
  for (const std::string& id : list.getMemberNames()) {
    const Json::Value& e = list[id];
    if (!e["path"].isString())
      throw Error(kErrStorage, "Index registry entry " + id + " lacks a path");
    entries_[id] = RegistryEntry{e["path"].asString(), e["paused"].asBool()};
  }
}

const RegistryEntry* Registry::Find(const std::string& id) const {
  auto it = entries_.find(id);
  return it == entries_.end() ? nullptr : &it->second;
}

void Registry::Save(const std::map<std::string, RegistryEntry>& entries) {
  Json::Value root(Json::objectValue);
  root["indexes"] = Json::Value(Json::objectValue);
  for (const auto& [id, e] : entries) {
    root["indexes"][id]["path"] = e.path;
    root["indexes"][id]["paused"] = e.paused;
  }
  if (!JsonToFile(root, file_)) {
    throw Error(kErrStorage, "Cannot save index registry " + file_ + ": " + strerror(errno));
  }
}

void Registry::Put(const std::string& id, const RegistryEntry& entry) {
  auto next = entries_;
  next[id] = entry;
  Save(next);
  entries_ = std::move(next);
}

void Registry::Replace(const std::string& old_id, const std::string& new_id,
                       const RegistryEntry& entry) {
  auto next = entries_;
  next.erase(old_id);
  next[new_id] = entry;
  Save(next);
  entries_ = std::move(next);
}

void Registry::Remove(const std::string& id) {
  auto next = entries_;
  next.erase(id);
  Save(next);
  entries_ = std::move(next);
}

}  // namespace vellis::searchd
