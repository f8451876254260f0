#include "sdk/linux/share_registry.h"

#include <sys/stat.h>
#include <unistr.h>

#include <cerrno>
#include <cstring>
#include <mutex>

#include "common/fs_util.h"
#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/root_path.h"
#include "sdk/linux/unicode.h"

namespace vellis::sdk {
namespace {

constexpr size_t kSharePathMax = 4095;

bool IsInside(const std::string& path, const std::string& dir) {
  return StringStartWith(path + "/", dir + "/");
}

// Why `share` cannot join `shares`, or empty.
std::string ClashProblem(const std::vector<ShareInfo>& shares, const ShareInfo& share) {
  for (const ShareInfo& other : shares) {
    if (Utf8CaseCompare(other.szName, share.szName) == 0) {
      return "a share named \"" + other.szName + "\" exists already";
    }
    if (IsInside(share.szPath, other.szPath) || IsInside(other.szPath, share.szPath)) {
      return "share path " + share.szPath + " overlaps share \"" + other.szName + "\" at " +
             other.szPath;
    }
  }
  return "";
}

bool ReadBool(const Json::Value& entry, const char* key) {
  const Json::Value& v = entry[key];
  return v.isBool() && v.asBool();
}

std::string RegistryFile() { return RootPath(kShareRegistryPath); }

// mkdir -p; failures show up when the file is written.
void MakeParentDirs(const std::string& dir) {
  for (size_t pos = 1; pos <= dir.size(); ++pos) {
    if (pos == dir.size() || dir[pos] == '/') mkdir(dir.substr(0, pos).c_str(), 0755);
  }
}

// The last registry read, kept while the file is the same one: readers such
// as the indexability rules ask several questions per path.
struct Cache {
  std::mutex mu;
  bool valid = false;
  dev_t dev = 0;
  ino_t ino = 0;
  off_t size = 0;
  timespec mtime{};
  std::string file;
  std::vector<ShareInfo> shares;
};

Cache& RegistryCache() {
  static Cache* cache = new Cache();  // never destroyed: readers may run at exit
  return *cache;
}

void LoadForUpdate(std::vector<ShareInfo>* shares) {
  VELLIS_THROW_IF(
      !LoadShareRegistry(shares), kErrLoadJson,
      "share registry cannot be read, path=" + RegistryFile() + ", reason=" + strerror(errno));
}

void Save(const std::vector<ShareInfo>& shares) {
  std::string file = RegistryFile();
  MakeParentDirs(Dirname(file));
  VELLIS_THROW_IF(!JsonToFile(ShareRegistryToJson(shares), file), kErrSaveJson,
                  "share registry cannot be written, path=" + file + ", reason=" + strerror(errno));
}

}  // namespace

std::string ShareNameProblem(const std::string& name) {
  if (name.empty()) return "share name is empty";
  if (name.size() > kShareNameMax) {
    return "share name is longer than " + std::to_string(kShareNameMax) + " bytes";
  }
  if (name.find('/') != std::string::npos) return "share name contains \"/\"";
  if (name.find('\0') != std::string::npos) return "share name contains a NUL byte";
  if (name.find('\n') != std::string::npos) return "share name contains a newline";
  if (name == "." || name == "..") return "share name may not be \"" + name + "\"";
  if (name[0] == '-') return "share name may not begin with \"-\"";
  if (u8_check(reinterpret_cast<const uint8_t*>(name.data()), name.size()) != nullptr) {
    return "share name is not valid UTF-8";
  }
  return "";
}

std::string SharePathProblem(const std::string& name, const std::string& path) {
  if (path.empty() || path[0] != '/') return "share path is not absolute: \"" + path + "\"";
  if (path.size() > kSharePathMax) return "share path is longer than 4095 bytes";
  if (path.find('\0') != std::string::npos) return "share path contains a NUL byte";
  if (path.find('\n') != std::string::npos) return "share path contains a newline";
  if (path.back() == '/') return "share path ends in \"/\": " + path;
  for (size_t begin = 1; begin <= path.size();) {
    size_t end = path.find('/', begin);
    if (end == std::string::npos) end = path.size();
    std::string part = path.substr(begin, end - begin);
    if (part.empty()) return "share path contains \"//\": " + path;
    if (part == "." || part == "..") return "share path contains \"" + part + "\": " + path;
    begin = end + 1;
  }
  if (Basename(path) != name) {
    return "share path " + path + " does not end in the share's name \"" + name + "\"";
  }
  return "";
}

bool ParseShareRegistry(const Json::Value& doc, std::vector<ShareInfo>* shares,
                        std::string* problem) {
  shares->clear();
  if (!doc.isObject() || !doc["shares"].isArray()) {
    *problem = "share registry is not an object with a \"shares\" array";
    return false;
  }
  for (const Json::Value& entry : doc["shares"]) {
    if (!entry.isObject() || !entry["name"].isString() || !entry["path"].isString()) {
      *problem = "share entry lacks a string name or path: " + JsonToString(entry);
      return false;
    }
    ShareInfo share;
    share.szName = entry["name"].asString();
    share.szPath = entry["path"].asString();
    share.ftp_privilege = entry["ftp_privilege"].isInt() ? entry["ftp_privilege"].asInt() : 0;
    share.read_only = ReadBool(entry, "read_only");
    share.encryption = ReadBool(entry, "encryption");
    share.recycle_bin = ReadBool(entry, "recycle_bin");
    share.hide_unreadable = ReadBool(entry, "hide_unreadable");
    std::string bad = ShareNameProblem(share.szName);
    if (bad.empty()) bad = SharePathProblem(share.szName, share.szPath);
    if (bad.empty()) bad = ClashProblem(*shares, share);
    if (!bad.empty()) {
      *problem = bad;
      return false;
    }
    shares->push_back(share);
  }
  return true;
}

Json::Value ShareRegistryToJson(const std::vector<ShareInfo>& shares) {
  Json::Value doc(Json::objectValue);
  Json::Value& list = doc["shares"] = Json::Value(Json::arrayValue);
  for (const ShareInfo& share : shares) {
    Json::Value entry(Json::objectValue);
    entry["name"] = share.szName;
    entry["path"] = share.szPath;
    entry["ftp_privilege"] = share.ftp_privilege;
    entry["read_only"] = share.read_only;
    entry["encryption"] = share.encryption;
    entry["recycle_bin"] = share.recycle_bin;
    entry["hide_unreadable"] = share.hide_unreadable;
    list.append(entry);
  }
  return doc;
}

const ShareInfo* FindShareHolding(const std::vector<ShareInfo>& shares,
                                  const std::string& full_path) {
  for (const ShareInfo& share : shares) {
    if (IsInside(full_path, share.szPath)) return &share;
  }
  return nullptr;
}

const ShareInfo* FindShareByName(const std::vector<ShareInfo>& shares, const std::string& name) {
  for (const ShareInfo& share : shares) {
    if (share.szName == name) return &share;
  }
  return nullptr;
}

bool LoadShareRegistry(std::vector<ShareInfo>* shares) {
  std::string file = RegistryFile();
  Cache& cache = RegistryCache();
  std::lock_guard<std::mutex> lock(cache.mu);
  struct stat st;
  if (stat(file.c_str(), &st) != 0) {
    if (errno != ENOENT) return false;
    shares->clear();
    return true;
  }
  if (cache.valid && cache.file == file && cache.dev == st.st_dev && cache.ino == st.st_ino &&
      cache.size == st.st_size && cache.mtime.tv_sec == st.st_mtim.tv_sec &&
      cache.mtime.tv_nsec == st.st_mtim.tv_nsec) {
    *shares = cache.shares;
    return true;
  }
  Json::Value doc;
  std::string problem;
  if (!JsonFromFile(doc, file)) {
    if (errno == 0) errno = EINVAL;
    return false;
  }
  if (!ParseShareRegistry(doc, shares, &problem)) {
    errno = EINVAL;
    return false;
  }
  cache.valid = true;
  cache.file = file;
  cache.dev = st.st_dev;
  cache.ino = st.st_ino;
  cache.size = st.st_size;
  cache.mtime = st.st_mtim;
  cache.shares = *shares;
  return true;
}

void RegisterShare(const ShareInfo& share) {
  std::string bad = ShareNameProblem(share.szName);
  if (bad.empty()) bad = SharePathProblem(share.szName, share.szPath);
  VELLIS_THROW_IF(!bad.empty(), kErrBadArgument, bad);
  struct stat st;
  VELLIS_THROW_IF(lstat(share.szPath.c_str(), &st) != 0 || !S_ISDIR(st.st_mode), kErrBadArgument,
                  "share path is not a directory: " + share.szPath);
  // A share reached through a link would make every path in it fail the
  // canonical-form rule of indexing, and could point anywhere.
  VELLIS_THROW_IF(RealPath(share.szPath) != share.szPath, kErrBadArgument,
                  "share path leads through a symbolic link: " + share.szPath);

  LockFile lock(RootPath(kShareRegistryLockPath), true);
  std::vector<ShareInfo> shares;
  LoadForUpdate(&shares);
  bad = ClashProblem(shares, share);
  VELLIS_THROW_IF(!bad.empty(), kErrBadArgument, bad);
  shares.push_back(share);
  Save(shares);
}

void UnregisterShare(const std::string& name) {
  LockFile lock(RootPath(kShareRegistryLockPath), true);
  std::vector<ShareInfo> shares;
  LoadForUpdate(&shares);
  const ShareInfo* found = FindShareByName(shares, name);
  VELLIS_THROW_IF(!found, kErrShareNotFound, "no such share: \"" + name + "\"");
  shares.erase(shares.begin() + (found - shares.data()));
  Save(shares);
}

}  // namespace vellis::sdk
