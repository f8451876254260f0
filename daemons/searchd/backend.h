// The storage engine behind the daemon's protocol.
//
// The protocol handler (handler.h) only talks to this interface, so another
// engine (a server-based one, say) can replace the embedded SQLite engine
// without touching the protocol code.
//
// Every method throws vellis::Error with a code of error_codes.h (or
// kErrBusy when the engine cannot take a write now) and leaves no
// half-applied change behind: a failed document write changes nothing.
// Writes of an index become durable at Commit(). Implementations need not
// be thread-safe; the handler serialises calls.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>
#include <vector>

#include "daemons/searchd/query.h"

namespace vellis::searchd {

// What "index_create" hands over.
struct IndexConfig {
  std::string id;
  std::string path;  // the database folder (absolute)
  Json::Value settings;
  Json::Value mappings;
  Json::Value event_handler;
};

struct IndexInfo {
  std::string id;
  std::string path;
  bool paused = false;
  int64_t documents = 0;
  int64_t disk_bytes = 0;            // the index's files in its folder
  bool maintenance_pending = false;  // background upkeep still to do
};

struct TermCount {
  std::string term;
  int64_t documents = 0;
};

class Engine {
 public:
  virtual ~Engine() = default;

  // Creates the index, or does nothing when `config.id` exists with the same
  // path. kErrIndexExists for the id at another path, kErrBadIndexId for an
  // id or path that cannot name its files safely, kErrBadMappings.
  virtual void CreateIndex(const IndexConfig& config) = 0;
  // Removes the index and its files. kErrIndexNotFound.
  virtual void DeleteIndex(const std::string& id) = 0;
  // Pausing commits pending writes; a paused index refuses writes with
  // kErrIndexPaused and still answers reads.
  virtual void SetPaused(const std::string& id, bool paused) = 0;
  // Renames the index and/or moves its files to another folder (empty
  // strings keep the old value). Pending writes are committed first.
  virtual void Reconfigure(const std::string& id, const std::string& new_id,
                           const std::string& new_path) = 0;
  virtual std::vector<IndexInfo> ListIndexes() = 0;
  virtual IndexInfo Stats(const std::string& id) = 0;

  // Creates or replaces the whole document.
  virtual void Upsert(const std::string& id, const std::string& doc_id, const Json::Value& doc) = 0;
  // Replaces the given fields of an existing document (null removes one);
  // a new identity value moves the document to that identity.
  // kErrDocumentNotFound.
  virtual void Update(const std::string& id, const std::string& doc_id,
                      const Json::Value& fields) = 0;
  // False when there was no such document.
  virtual bool DeleteDocument(const std::string& id, const std::string& doc_id) = 0;
  // Deletes the documents whose `field` value begins with `prefix`; returns
  // how many.
  virtual int64_t DeleteByPrefix(const std::string& id, const std::string& field,
                                 const std::string& prefix) = 0;
  // The documents whose `field` value begins with `prefix`, in identity
  // order, each with the stored fields named in `load_fields` (all when
  // empty). With `after`, only identities above it; with `limit` above 0, at
  // most that many: a caller pages through a large subtree.
  virtual Json::Value GetByPrefix(const std::string& id, const std::string& field,
                                  const std::string& prefix,
                                  const std::vector<std::string>& load_fields,
                                  const std::string& after, int64_t limit) = 0;
  // Makes the index's writes so far durable.
  virtual void Commit(const std::string& id) = 0;
  // Commits every index (on a clean stop), all of them even when one fails;
  // then throws naming those that failed.
  virtual void CommitAll() = 0;

  // Records the suggestion terms of one document, replacing its earlier
  // ones. kErrDocumentNotFound.
  virtual void UpdateTermSuggestion(const std::string& id, const std::string& doc_id) = 0;
  // Recorded terms beginning with `prefix`, most documents first.
  virtual std::vector<TermCount> SuggestTerms(const std::string& id, const std::string& prefix,
                                              int64_t limit) = 0;

  virtual SearchResult Search(const std::string& id, const SearchQuery& query) = 0;

  // One short step of background upkeep, run when no request is waiting
  // (the SQLite engine merges full-text segments). Returns true while more
  // work remains.
  virtual bool Maintain() = 0;
};

}  // namespace vellis::searchd
