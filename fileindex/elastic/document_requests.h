// The requests on a share's index as values, for callers that send many of
// them in one compound request (the indexer), and the paged listing of a
// subtree's documents. elastic_control.h sends the same requests one at a
// time. Reentrant: nothing is kept between calls.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

namespace vellis::fileindex::elastic {

// The search daemon's error code for a request on a document that its index
// does not hold (a rename of a path already renamed, say).
inline constexpr int kErrNoSuchDocument = 1107;

// {"command": command, "data": data}.
Json::Value MakeRequest(const char* command, Json::Value data);
// {"id": GetFileIndexID(share)}.
Json::Value IndexData(const std::string& share);
// {"qsl": {"prefix": {"QORUMDPath": dir + "/"}}}: the directory's own
// document and siblings that merely begin with its name never match.
Json::Value PrefixQuery(const std::string& dir);

// The document of `path` from content extraction, with the file name copied
// into the field searched by name parts. Throws Error 914 "Parse failed,
// path=<path>" when the extraction fails or throws.
Json::Value ExtractDocument(const std::string& path, bool need_meta);

// "document_upsert_by_id" / "document_set_by_id" of `path` with its
// extracted document (need_meta false for the set), and the same with a
// document the caller extracted.
Json::Value UpsertRequest(const std::string& share, const std::string& path, bool need_meta);
Json::Value AttrRequest(const std::string& share, const std::string& path);
Json::Value DocumentRequest(const char* command, const std::string& share, const std::string& path,
                            Json::Value doc);
// "document_del_by_id" of `path`; "document_del_by_query" of everything
// below `dir` (not `dir` itself). Throws Error 120 for an empty path or
// one ending in "/".
Json::Value DelRequest(const std::string& share, const std::string& path);
Json::Value DelDirRequest(const std::string& share, const std::string& dir);

// One page of the documents below `dir` in path (byte) order: those whose
// path is above `after` (all when empty), at most `limit`, each with
// "QORUMDPath" and the stored `fields`. Busy answers are waited out. Throws
// Error 916 when the answer has no data array, and the transport's errors.
Json::Value IndexGetPage(const std::string& share, const std::string& dir, const std::string& after,
                         int limit, const std::vector<std::string>& fields);

// The "data" array of a query answer; Error 916 when there is none.
const Json::Value& QueryResults(const Json::Value& res);

}  // namespace vellis::fileindex::elastic
