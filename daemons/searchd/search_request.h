// The members of "document_search" (docs/search.md) to and from the
// engine's SearchQuery and SearchResult.
#pragma once

#include <json/json.h>

#include "daemons/searchd/query.h"

namespace vellis::searchd {

// The largest page of hits one request may ask for.
inline constexpr int64_t kMaxSearchLimit = 1000;

// Reads the search members of `data` ("query", "name", "path", "category",
// "extension", "size", "modified", "sort", "order", "offset", "limit",
// "fields", "highlight"). Throws Error kErrBadMember for a missing or
// mistyped member and kErrBadQuery for a value out of range (unknown sort
// key or category, negative offset, limit above kMaxSearchLimit).
SearchQuery ParseSearchRequest(const Json::Value& data);

// {"total", "offset", "ranked", "hits": [{"id", "score", "fields", "snippet"}]}.
Json::Value SearchResultToJson(const SearchResult& result, const SearchQuery& query);

}  // namespace vellis::searchd
