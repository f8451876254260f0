#include "daemons/searchd/sqlite_engine.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>

#include "daemons/searchd/error_codes.h"

namespace vellis::searchd {
namespace {

namespace fs = std::filesystem;

// Pages written per index by one idle-time merge step: a few tens of
// milliseconds, the longest a request waits for upkeep.
constexpr int kMergePagesPerStep = 64;

// SQLite's companion files of a WAL database.
constexpr const char* kCompanions[] = {"", "-wal", "-shm"};

bool Exists(const std::string& path) {
  struct stat st;
  return lstat(path.c_str(), &st) == 0;
}

int64_t FileSize(const std::string& path) {
  struct stat st;
  return stat(path.c_str(), &st) == 0 ? static_cast<int64_t>(st.st_size) : 0;
}

// Moves one file, copying across file systems.
void MoveFile(const std::string& from, const std::string& to) {
  if (rename(from.c_str(), to.c_str()) == 0) return;
  if (errno != EXDEV) {
    throw Error(kErrStorage, "Cannot move " + from + " to " + to + ": " + strerror(errno));
  }
  std::error_code ec;
  fs::copy_file(from, to, fs::copy_options::none, ec);
  if (ec) {
    fs::remove(to, ec);
    throw Error(kErrStorage, "Cannot copy " + from + " to " + to + ": " + ec.message());
  }
  fs::remove(from, ec);
}

// The folder without trailing slashes, so "/a/b/" and "/a/b" are one folder.
std::string NormalFolder(const std::string& path) {
  std::string f = fs::path(path).lexically_normal().string();
  while (f.size() > 1 && f.back() == '/') f.pop_back();
  return f;
}

void MakeFolder(const std::string& path) {
  std::error_code ec;
  fs::create_directories(path, ec);
  if (ec) throw Error(kErrStorage, "Cannot create folder " + path + ": " + ec.message());
}

}  // namespace

SqliteEngine::SqliteEngine(const std::string& registry_file, int busy_timeout_ms)
    : registry_([&registry_file] {
        MakeFolder(fs::path(registry_file).parent_path().string());
        return registry_file;
      }()),
      busy_timeout_ms_(busy_timeout_ms) {}

SqliteEngine::~SqliteEngine() = default;

std::string SqliteEngine::DbFile(const std::string& folder, const std::string& id) {
  std::string f = folder;
  while (f.size() > 1 && f.back() == '/') f.pop_back();
  return (f == "/" ? "" : f) + "/" + id + kDbSuffix;
}

const RegistryEntry& SqliteEngine::Entry(const std::string& id) const {
  const RegistryEntry* e = registry_.Find(id);
  if (e == nullptr) throw Error(kErrIndexNotFound, "No index " + id);
  return *e;
}

SqliteIndex& SqliteEngine::Open(const std::string& id) {
  const RegistryEntry& e = Entry(id);
  auto it = open_.find(id);
  if (it == open_.end()) {
    it = open_
             .emplace(id,
                      std::make_unique<SqliteIndex>(DbFile(e.path, id), nullptr, busy_timeout_ms_))
             .first;
  }
  return *it->second;
}

SqliteIndex& SqliteEngine::OpenForWrite(const std::string& id) {
  if (Entry(id).paused) throw Error(kErrIndexPaused, "Index " + id + " is paused");
  return Open(id);
}

void SqliteEngine::CreateIndex(const IndexConfig& config) {
  std::string folder = NormalFolder(config.path);
  if (const RegistryEntry* e = registry_.Find(config.id)) {
    if (e->path == folder) return;
    throw Error(kErrIndexExists, "Index " + config.id + " exists in another folder: " + e->path);
  }
  Schema::FromMappings(config.mappings);  // refuse bad mappings before touching files
  MakeFolder(folder);
  std::string file = DbFile(folder, config.id);
  bool existed = Exists(file);
  auto index = std::make_unique<SqliteIndex>(file, &config, busy_timeout_ms_);
  try {
    registry_.Put(config.id, RegistryEntry{folder, false});
  } catch (...) {
    index.reset();
    if (!existed) {
      for (const char* c : kCompanions) unlink((file + c).c_str());
    }
    throw;
  }
  open_[config.id] = std::move(index);
}

void SqliteEngine::DeleteIndex(const std::string& id) {
  std::string file = DbFile(Entry(id).path, id);
  open_.erase(id);
  registry_.Remove(id);
  for (const char* c : kCompanions) unlink((file + c).c_str());
}

void SqliteEngine::SetPaused(const std::string& id, bool paused) {
  RegistryEntry e = Entry(id);
  if (paused) Open(id).Commit();
  e.paused = paused;
  registry_.Put(id, e);
}

void SqliteEngine::Reconfigure(const std::string& id, const std::string& new_id,
                               const std::string& new_path) {
  RegistryEntry e = Entry(id);
  std::string target_id = new_id.empty() ? id : new_id;
  std::string target_path = new_path.empty() ? e.path : NormalFolder(new_path);
  if (target_id != id && registry_.Find(target_id) != nullptr) {
    throw Error(kErrIndexExists, "Index " + target_id + " exists");
  }
  std::string from = DbFile(e.path, id);
  std::string to = DbFile(target_path, target_id);
  if (from != to) {
    if (Exists(to)) throw Error(kErrIndexExists, "Database file " + to + " exists");
    MakeFolder(target_path);
    // Closing the last connection checkpoints the log into the main file,
    // so the database travels as one file.
    Open(id).Commit();
    open_.erase(id);
    for (const char* c : kCompanions) {
      if (Exists(from + c)) MoveFile(from + c, to + c);
    }
  }
  e.path = target_path;
  registry_.Replace(id, target_id, e);
}

IndexInfo SqliteEngine::Stats(const std::string& id) {
  const RegistryEntry& e = Entry(id);
  IndexInfo info;
  info.id = id;
  info.path = e.path;
  info.paused = e.paused;
  info.documents = Open(id).CountDocuments();
  info.maintenance_pending = Open(id).merge_pending();
  std::string file = DbFile(e.path, id);
  for (const char* c : kCompanions) info.disk_bytes += FileSize(file + c);
  return info;
}

std::vector<IndexInfo> SqliteEngine::ListIndexes() {
  std::vector<IndexInfo> out;
  for (const auto& [id, e] : registry_.entries()) {
    IndexInfo info;
    info.id = id;
    info.path = e.path;
    info.paused = e.paused;
    out.push_back(info);
  }
  return out;
}

void SqliteEngine::Upsert(const std::string& id, const std::string& doc_id,
                          const Json::Value& doc) {
  OpenForWrite(id).Upsert(doc_id, doc);
}

void SqliteEngine::Update(const std::string& id, const std::string& doc_id,
                          const Json::Value& fields) {
  OpenForWrite(id).Update(doc_id, fields);
}

bool SqliteEngine::DeleteDocument(const std::string& id, const std::string& doc_id) {
  return OpenForWrite(id).Delete(doc_id);
}

int64_t SqliteEngine::DeleteByPrefix(const std::string& id, const std::string& field,
                                     const std::string& prefix) {
  return OpenForWrite(id).DeleteByPrefix(field, prefix);
}

Json::Value SqliteEngine::GetByPrefix(const std::string& id, const std::string& field,
                                      const std::string& prefix,
                                      const std::vector<std::string>& load_fields,
                                      const std::string& after, int64_t limit) {
  return Open(id).GetByPrefix(field, prefix, load_fields, after, limit);
}

void SqliteEngine::Commit(const std::string& id) { Open(id).Commit(); }

void SqliteEngine::CommitAll() {
  // One index failing must not keep the others from committing.
  std::string failed;
  for (auto& [id, index] : open_) {
    try {
      index->Commit();
    } catch (const Error& e) {
      failed += (failed.empty() ? "" : "; ") + id + ": " + e.what();
    }
  }
  if (!failed.empty()) throw Error(kErrStorage, "Commit failed for " + failed);
}

void SqliteEngine::UpdateTermSuggestion(const std::string& id, const std::string& doc_id) {
  OpenForWrite(id).UpdateTermSuggestion(doc_id);
}

std::vector<TermCount> SqliteEngine::SuggestTerms(const std::string& id, const std::string& prefix,
                                                  int64_t limit) {
  return Open(id).SuggestTerms(prefix, limit);
}

bool SqliteEngine::Maintain() {
  bool more = false;
  for (auto& [id, index] : open_) {
    if (registry_.Find(id) != nullptr && registry_.Find(id)->paused) continue;
    if (index->Merge(kMergePagesPerStep)) more = true;
  }
  return more;
}

SearchResult SqliteEngine::Search(const std::string& id, const SearchQuery& query) {
  return Open(id).Search(query);
}

}  // namespace vellis::searchd
