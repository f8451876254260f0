// The embedded engine: every index an SQLite database file
// "<folder>/<id>.sqlite" (see sqlite_index.h), the list of indexes in the
// registry (registry.h). Indexes are opened on first use and kept open.
//
// Not thread-safe; the protocol handler serialises calls.
#pragma once

#include <map>
#include <memory>
#include <string>

#include "daemons/searchd/backend.h"
#include "daemons/searchd/registry.h"
#include "daemons/searchd/sqlite_index.h"

namespace vellis::searchd {

// The suffix of an index's database file in its folder.
inline constexpr char kDbSuffix[] = ".sqlite";

class SqliteEngine : public Engine {
 public:
  // Loads the registry at `registry_file` (its folder is created when
  // missing). A write waits up to `busy_timeout_ms` for another process's
  // lock on an index before it fails with kErrBusy. Throws Error kErrStorage
  // for an unreadable registry.
  explicit SqliteEngine(const std::string& registry_file, int busy_timeout_ms = kBusyTimeoutMs);
  // Commits nothing: call CommitAll() first to keep pending writes.
  ~SqliteEngine() override;

  void CreateIndex(const IndexConfig& config) override;
  void DeleteIndex(const std::string& id) override;
  void SetPaused(const std::string& id, bool paused) override;
  void Reconfigure(const std::string& id, const std::string& new_id,
                   const std::string& new_path) override;
  std::vector<IndexInfo> ListIndexes() override;
  IndexInfo Stats(const std::string& id) override;
  void Upsert(const std::string& id, const std::string& doc_id, const Json::Value& doc) override;
  void Update(const std::string& id, const std::string& doc_id, const Json::Value& fields) override;
  bool DeleteDocument(const std::string& id, const std::string& doc_id) override;
  int64_t DeleteByPrefix(const std::string& id, const std::string& field,
                         const std::string& prefix) override;
  Json::Value GetByPrefix(const std::string& id, const std::string& field,
                          const std::string& prefix, const std::vector<std::string>& load_fields,
                          const std::string& after, int64_t limit) override;
  void Commit(const std::string& id) override;
  void CommitAll() override;
  void UpdateTermSuggestion(const std::string& id, const std::string& doc_id) override;
  std::vector<TermCount> SuggestTerms(const std::string& id, const std::string& prefix,
                                      int64_t limit) override;
  SearchResult Search(const std::string& id, const SearchQuery& query) override;
  bool Maintain() override;

  // The database file of index `id` in `folder`.
  static std::string DbFile(const std::string& folder, const std::string& id);

 private:
  const RegistryEntry& Entry(const std::string& id) const;
  SqliteIndex& Open(const std::string& id);
  // Open() for a write: kErrIndexPaused when the index is paused.
  SqliteIndex& OpenForWrite(const std::string& id);

  Registry registry_;
  int busy_timeout_ms_;
  std::map<std::string, std::unique_ptr<SqliteIndex>> open_;
};

}  // namespace vellis::searchd
