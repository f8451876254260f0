#include "fileindex/folder.h"

#include "common/json_util.h"
#include "fileindex/util.h"

namespace vellis::fileindex {

Folder::Folder(const std::string& path, const std::string& name, bool document, bool audio,
               bool video, bool photo, bool privileged, bool paused)
    : path_(path),
      name_(name),
      document_(document),
      audio_(audio),
      video_(video),
      photo_(photo),
      privileged_(privileged),
      paused_(paused) {}

Folder::Folder(const Json::Value& data) {
  GetJsonValue(path_, data, "path", true);
  GetJsonValue(name_, data, "name", true);
  GetJsonValue(document_, data, "document", true);
  GetJsonValue(audio_, data, "audio", true);
  GetJsonValue(video_, data, "video", true);
  GetJsonValue(photo_, data, "photo", true);
  GetJsonValue(privileged_, data, "privileged", false);
  GetJsonValue(paused_, data, "paused", false);
  GetJsonValue(volume_to_be_clean_, data, "volume_to_be_clean", false);
}

std::string Folder::GetShare() const {
  if (share_.empty()) GetShareNameByPath(share_, path_);
  return share_;
}

void Folder::SetShare(const std::string& share) {
  path_ = ReplacePathShare(path_, share, GetShare());
  share_ = share;
}

std::string Folder::GetFullPath() const {
  if (full_path_.empty()) full_path_ = fileindex::GetFullPath(path_);
  return full_path_;
}

Json::Value Folder::GetData() const {
  Json::Value data(Json::objectValue);
  data["path"] = path_;
  data["name"] = name_;
  data["document"] = document_;
  data["audio"] = audio_;
  data["video"] = video_;
  data["photo"] = photo_;
  data["paused"] = paused_;
  data["privileged"] = privileged_;
  data["volume_to_be_clean"] = volume_to_be_clean_;
  return data;
}

Json::Value Folder::GetIndexCfg() const {
  Json::Value cfg(Json::objectValue);
  cfg["document"] = document_;
  cfg["audio"] = audio_;
  cfg["video"] = video_;
  cfg["photo"] = photo_;
  return cfg;
}

bool Folder::operator==(const Folder& other) const {
  return path_ == other.path_ && name_ == other.name_ &&
         volume_to_be_clean_ == other.volume_to_be_clean_ && document_ == other.document_ &&
         audio_ == other.audio_ && video_ == other.video_ && photo_ == other.photo_ &&
         privileged_ == other.privileged_ && paused_ == other.paused_;
}

}  // namespace vellis::fileindex
