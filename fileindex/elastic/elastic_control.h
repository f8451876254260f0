// Requests to the search daemon about share indexes and their documents.
//
// One index per share, named by GetFileIndexID. Every request goes through
// SendRequestRetryOnBusy: a busy daemon (codes 1400/1401) is waited out
// without limit, so these calls may block the calling thread for a long
// time; every other failure is thrown as the transport's vellis::Error
// (comm.h). Paths are full paths ("/volume1/share/dir/file") without a
// trailing "/". The request formats are in docs/protocol.md. No state is
// kept; callers serialise work on one share themselves.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

#include "fileindex/elastic/schema.h"

namespace vellis::fileindex::elastic {

// --- Transport with busy retry ---

// SendRequestImpl until it returns or fails with a code other than
// 1400/1401, which is rethrown. Each busy answer is logged with the retry
// count ("Retry[<n>] since qoruelasticd is busy. Command: ..., db: ...") and
// waited out for (Rand() % 5) * 60 + 900 seconds through the platform. After
// the eleventh busy answer of one call the administrators are told once that
// indexing is short of memory (NotifyLackOfMemory of fileindex/util.h).
void SendRequestRetryOnBusy(Json::Value& res, const Json::Value& req);

// SendRequestRetryOnBusy with the answer dropped.
void SendRequestDiscardResult(const Json::Value& req);

// --- Index lifecycle ---

// "fileindex_" followed by the share name, byte for byte.
std::string GetFileIndexID(const std::string& share);

// Creates the share's index with the schema of schema.h at the share's index
// database path. Throws Error 800 (before sending) when the platform does not
// know the share.
void ShareIndexCreate(const std::string& share);
void ShareIndexDelete(const std::string& share);
void ShareIndexPause(const std::string& share);
void ShareIndexResume(const std::string& share);
// Gives the index of `old_share` the identifier of `new_share` and the
// database path `new_path`. Documents are not moved.
void ShareIndexRename(const std::string& old_share, const std::string& new_share,
                      const std::string& new_path);
// Moves the share's index database to `new_path`.
void ShareIndexMigrate(const std::string& share, const std::string& new_path);

// --- Documents ---

// Replaces (or creates) the document of `path` with what content extraction
// reads from the file; with `need_meta` content metadata is read as well.
// Throws Error 914 "Parse failed, path=<path>" when extraction fails; nothing
// is sent then.
void IndexUpsert(const std::string& share, const std::string& path, bool need_meta);

// Updates the file-system fields of the existing document of `path`. Errors
// as IndexUpsert.
void IndexAttr(const std::string& share, const std::string& path);

// Deletes the document of `path`.
void IndexDel(const std::string& share, const std::string& path);

// Deletes every document below the directory `dir` (not that of `dir`
// itself, nor those of siblings such as dir + "2"). Throws Error 120 for an
// empty `dir` or one ending in "/".
void IndexDelDir(const std::string& share, const std::string& dir);

// A file or directory moved from `old_path` to `new_path` in the share: its
// document gets the new path, parent and name fields, and every document
// below `old_path` gets its path and parent rewritten (one compound request;
// failed sub-requests are only logged). Throws Error 120 for paths that are
// empty or end in "/", Error 916 when the query answer has no "data" array.
void IndexRename(const std::string& share, const std::string& new_path,
                 const std::string& old_path);

// Appends to `paths`, in the daemon's order, the path of every document
// below `dir` (as IndexDelDir selects them). Throws Error 916 when the answer
// has no "data" array, Error 120 for a bad `dir`.
void IndexGetByPrefixPath(const std::string& share, const std::string& dir,
                          std::vector<std::string>& paths);

// Commits the share's index. When the commit fails and the share's volume is
// short of space, sets the share's status bit 1 (need reindex) and throws
// Error 1003 "Share (<share>) space not enough"; otherwise the commit's error
// is rethrown unchanged.
void IndexCommit(const std::string& share);

// One compound request of "update_term_suggestion" sub-requests, one per
// document identifier in order (sent even when the list is empty).
void UpdateTermSuggestion(const std::string& db_name, const std::vector<std::string>& doc_ids);

}  // namespace vellis::fileindex::elastic
