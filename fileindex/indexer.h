// Carries out the operations of a queue round on a share's index: the part
// of the indexing daemon's work that decides, per path, what the index
// should hold, and says it with the document requests of
// fileindex/elastic/document_requests.h.
//
// What the index holds: under an indexed folder (the deepest covering one
// governs, FolderMgr), every directory and every regular file that the
// indexing rules admit (CheckFullPathIndexable) and whose category the
// governing folder indexes (a file of a type outside the four categories
// always counts). Symbolic links, FIFOs, sockets and devices are never
// indexed, nor the platform's hidden folders and preserved names, nor a
// name that is not UTF-8 (the search daemon's requests are UTF-8 JSON; a
// crawl counts such a name as failed and does not go below it). A path
// that stops qualifying leaves the index.
//
// Requests go out in compound batches; commits come every
// commit_every_ops operations or commit_every_seconds (platform clock) and
// at Finish(). Work is at-least-once: every operation is safe to repeat.
//
// Not thread-safe: one thread drives an Indexer; the batch hook runs on it.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "fileindex/folder_mgr.h"
#include "fileindex/optree.h"

namespace vellis::fileindex {

struct IndexerOptions {
  size_t batch_size = 200;           // sub-requests per compound request
  uint64_t commit_every_ops = 5000;  // operations between commits
  int64_t commit_every_seconds = 30;
  int page_size = 1000;     // stored documents per page while crawling
  size_t errors_kept = 20;  // the last failures kept in the stats
};

struct IndexerStats {
  uint64_t operations = 0;         // operations of the round carried out
  uint64_t upserted = 0;           // documents written
  uint64_t deleted = 0;            // documents (or subtrees) removed
  uint64_t renamed = 0;            // moves carried over in the index
  uint64_t crawled = 0;            // paths that crawls looked at
  uint64_t unchanged = 0;          // of those, skipped: size and time as stored
  uint64_t failed = 0;             // files indexed by their file-system fields only
  std::string crawling;            // the crawl's root while one runs, else empty
  std::deque<std::string> errors;  // "<path>: <reason>", newest last
};

class Indexer {
 public:
  // `share` names the share and its index; `folders` (not owned) is the
  // folder list to judge paths by and must outlive the indexer. Throws
  // Error 800 when the share does not exist.
  Indexer(const std::string& share, const FolderMgr& folders, IndexerOptions options = {});
  ~Indexer();
  Indexer(const Indexer&) = delete;
  Indexer& operator=(const Indexer&) = delete;

  // Carries out one operation of a round:
  // - delete: the document and everything below it;
  // - upsert, reindex of a file: the document when the path qualifies, else
  //   its removal;
  // - attribute: the document's file-system fields when it qualifies;
  // - rename: the move within the index when both places index alike, else
  //   removal at the old place and indexing at the new one;
  // - reindex of a directory, configuration update: a crawl of the folder;
  // - crash marker: a crawl of the whole share.
  // Throws the transport's errors (the search daemon unreachable): the round
  // stops and its side file stays. A file whose extraction fails is indexed
  // by its file-system fields and counted as failed.
  void Execute(const OP& op);

  // A crawl of `root`: upserts what qualifies below it (and `root` itself),
  // skipping files whose stored size and modification time match, and
  // removes the documents of paths that are gone or no longer qualify.
  // Memory is bounded by the widest directory and a page of stored
  // documents, however large the tree. Symbolic links are never followed.
  void Crawl(const std::string& root);

  // Sends what is batched and commits. Call at the end of a round.
  void Finish();

  // Called after each batch is sent: a daemon holds the worker there while
  // paused, snapshots the stats, or throws to stop the round.
  void SetBatchHook(std::function<void()> hook) { hook_ = std::move(hook); }

  const IndexerStats& stats() const { return stats_; }

 private:
  class Walker;
  struct Place;

  // Where a path stands: which folder governs it, whether it qualifies.
  Place Judge(const std::string& path, bool check_rules) const;
  void UpsertOne(const std::string& path);
  void Upsert(const std::string& path, bool is_dir);
  void Remove(const std::string& path);
  void Rename(const std::string& path, const std::string& old_path);
  // After the folder `old_path` was renamed to `path`: indexes the items
  // of lost_renames_ that are below it and exist there.
  void FindLostRenames(const std::string& path, const std::string& old_path);
  void Add(Json::Value request);
  void Flush();
  void MaybeCommit();
  void Failed(const std::string& path, const std::string& reason);

  std::string share_;
  std::string share_path_;
  const FolderMgr& folders_;
  IndexerOptions options_;
  IndexerStats stats_;
  // New names of renames whose item was gone when the rename ran; a later
  // rename of a folder above one indexes it at its last place.
  std::vector<std::string> lost_renames_;
  std::function<void()> hook_;
  Json::Value batch_;  // the pending sub-requests
  uint64_t ops_since_commit_ = 0;
  int64_t last_commit_ = 0;
  bool dirty_ = false;  // written since the last commit
};

}  // namespace vellis::fileindex
