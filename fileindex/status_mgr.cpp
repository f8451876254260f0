#include "fileindex/status_mgr.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "common/fs_util.h"
#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/root_path.h"
#include "fileindex/elastic/communication.h"
#include "sdk/credentials.h"
#include "sdk/platform.h"

namespace vellis::fileindex {
namespace {

// A document that the accessors can read without tripping the JSON
// library's type assertions.
bool IsUsableStatus(const Json::Value& data) {
  return data.isObject() && (!data.isMember("share") || data["share"].isObject());
}

std::string ErrnoText(int err) {
  char buf[256];
  return strerror_r(err, buf, sizeof(buf));
}

}  // namespace

StatusMgr::StatusMgr() {
  const std::string path = RootPath(kFileIndexStatusCfgPath);
  VELLIS_THROW_IF(IsFileExist(path) && (!JsonFromFile(data_, path) || !IsUsableStatus(data_)),
                  kErrLoadJson, "Cannot load json: " + path);
}

long long StatusMgr::GetPauseInfo() const {
  const Json::Value& data = data_;
  if (!data.isObject() || !data["resume_time"].isInt64()) return -1;
  return data["resume_time"].asInt64();
}

int StatusMgr::GetShareStatus(const std::string& share) const {
  const Json::Value& data = data_;
  if (!data.isObject() || !data["share"].isObject() || !data["share"][share].isInt()) return 0;
  return data["share"][share].asInt();
}

void StatusMgr::Pause(int hours) {
  LockFile lock(RootPath(kStatusCfgLockPath), true);
  VELLIS_THROW_IF(hours < 0, kErrBadArgument, "Pause length should NOT be negative");
  const Json::Int64 resume_time =
      sdk::GetPlatform()->Time() + static_cast<Json::Int64>(hours) * 3600;
  data_["resume_time"] = resume_time;
  Save();
  Json::Value arg(Json::objectValue);
  arg["resume_time"] = resume_time;
  SendCommandToDaemon("pause", arg);
}

void StatusMgr::Resume() {
  LockFile lock(RootPath(kStatusCfgLockPath), true);
  data_["resume_time"] = Json::Int64(-1);
  Save();
  SendCommandToDaemon("resume", Json::Value());
}

void StatusMgr::SetShareStatus(const std::string& share, int bits) {
  LockFile lock(RootPath(kStatusCfgLockPath), true);
  data_["share"][share] = GetShareStatus(share) | bits;
  Save();
}

void StatusMgr::UnsetShareStatus(const std::string& share, int bits) {
  LockFile lock(RootPath(kStatusCfgLockPath), true);
  data_["share"][share] = GetShareStatus(share) & ~bits;
  Save();
}

void StatusMgr::ClearShareStatus(const std::string& share) {
  LockFile lock(RootPath(kStatusCfgLockPath), true);
  if (data_.isObject() && data_["share"].isObject()) data_["share"].removeMember(share);
  Save();
}

void StatusMgr::Save() {
  const std::string path = RootPath(kFileIndexStatusCfgPath);
  // An empty state is still written as an object, so the file always loads.
  const Json::Value& data = data_.isNull() ? Json::Value(Json::objectValue) : data_;
  sdk::SDKCredentials credentials("root");
  VELLIS_THROW_IF(!JsonToFile(data, path), kErrSaveJson, "Failed to save json: " + path);
  VELLIS_THROW_IF(-1 == chmod(path.c_str(), 0644), kErrInternal,
                  "chmod failed, reason=" + ErrnoText(errno));
}

}  // namespace vellis::fileindex
