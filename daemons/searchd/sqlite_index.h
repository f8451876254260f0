// One index in its own SQLite database file, with FTS5 tables for the
// catch-all words (unicode61, diacritics removed), whole keyword values and
// file-name substrings (trigram).
//
// Durability: the database runs in WAL mode with synchronous=FULL. Writes
// collect in one open transaction that Commit() ends; a committed
// transaction survives a crash of the process and a power cut, uncommitted
// writes do not.
//
// Failed writes: a document is checked whole (types, required fields,
// identity) before anything is written, so a bad document changes nothing.
// Should the storage itself fail in the middle of a write (disk full, I/O
// error), the open transaction is rolled back, so no half-written document
// remains, and the next Commit() throws kErrStorage to tell that writes since
// the previous commit were lost.
//
// Not thread-safe: one caller at a time.
#pragma once

#include <json/json.h>

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemons/searchd/backend.h"
#include "daemons/searchd/schema.h"
#include "daemons/searchd/sqlite_db.h"

namespace vellis::searchd {

class SqliteIndex {
 public:
  // Opens `file`; creates it when missing only when `config` is given. A
  // database without a stored
  // schema takes the mappings, settings and event handler of `config`;
  // kErrStorage when there is neither a stored schema nor a config.
  // kErrBadMappings for unusable mappings.
  // `busy_timeout_ms`: see Db.
  SqliteIndex(const std::string& file, const IndexConfig* config,
              int busy_timeout_ms = kBusyTimeoutMs);
  // Rolls back uncommitted writes (Commit() first to keep them).
  ~SqliteIndex();

  const Schema& schema() const { return schema_; }

  void Upsert(const std::string& doc_id, const Json::Value& doc);
  void Update(const std::string& doc_id, const Json::Value& fields);
  bool Delete(const std::string& doc_id);
  int64_t DeleteByPrefix(const std::string& field, const std::string& prefix);
  Json::Value GetByPrefix(const std::string& field, const std::string& prefix,
                          const std::vector<std::string>& load_fields,
                          const std::string& after = "", int64_t limit = 0);
  // Ends the open transaction. Throws kErrStorage after a rolled-back
  // failure (see above), having committed the writes made since.
  void Commit();
  int64_t CountDocuments();
  // One step of idle-time upkeep: merges full-text segments, writing about
  // `pages` pages, in a transaction of its own (nothing is done while
  // writes are uncommitted). Fewer segments make searches faster. Returns
  // true while there is more to merge now.
  bool Merge(int pages);
  bool merge_pending() const { return merge_pending_; }
  SearchResult Search(const SearchQuery& query);
  void UpdateTermSuggestion(const std::string& doc_id);
  std::vector<TermCount> SuggestTerms(const std::string& prefix, int64_t limit);

 private:
  struct Stored {
    int64_t rid = 0;
    Json::Value doc;
  };

  void CreateTables();
  void BeginWrite();
  std::optional<Stored> Load(const std::string& doc_id);
  // Writes `doc` (normalised) under `doc_id`, replacing row `rid` when not 0.
  void WriteRow(int64_t rid, const std::string& doc_id, Json::Value doc);
  void DeleteRow(int64_t rid);
  // Runs `fn` in the open write transaction; on a failure rolls the
  // transaction back and remembers the loss for Commit().
  template <typename Fn>
  void Atomically(Fn&& fn);
  // The document of a row as stored (body plus the text content).
  Json::Value RowDocument(const std::string& body, bool has_content, int64_t rid);
  Json::Value Project(const Json::Value& doc, const std::vector<std::string>& fields,
                      bool include_content) const;
  void CheckPrefixField(const std::string& field) const;
  // A prepared statement for `sql`, kept for reuse, reset and unbound.
  Stmt& Cached(const std::string& sql);

  std::unique_ptr<Db> db_;
  // Declared after db_: statements are finalised before the connection.
  std::map<std::string, std::unique_ptr<Stmt>> cache_;
  Schema schema_;
  bool lost_writes_ = false;
  // Opened databases may hold unmerged segments from before.
  bool merge_pending_ = true;
};

}  // namespace vellis::searchd
