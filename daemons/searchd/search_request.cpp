#include "daemons/searchd/search_request.h"

#include "daemons/searchd/args.h"
#include "daemons/searchd/categories.h"
#include "daemons/searchd/error_codes.h"

namespace vellis::searchd {

SearchQuery ParseSearchRequest(const Json::Value& data) {
  const std::string w = "data";
  SearchQuery q;
  q.terms = ParseQueryText(OptionalString(data, w, "query").value_or(""));
  q.name = OptionalString(data, w, "name").value_or("");
  q.path_prefix = OptionalString(data, w, "path").value_or("");
  q.categories = StringList(data, w, "category");
  for (const std::string& c : q.categories) {
    if (CategoryQueryText(c) == nullptr) {
      throw Error(kErrBadQuery, "Unknown category \"" + c + "\" (document, audio, video, image)");
    }
  }
  q.extensions = StringList(data, w, "extension");
  if (data.isMember("size")) {
    const Json::Value& size = RequireObject(data, w, "size");
    q.size_min = OptionalInt(size, "data.size", "min");
    q.size_max = OptionalInt(size, "data.size", "max");
  }
  if (data.isMember("modified")) {
    const Json::Value& mod = RequireObject(data, w, "modified");
    q.modified_from = OptionalInt(mod, "data.modified", "from");
    q.modified_to = OptionalInt(mod, "data.modified", "to");
  }
  std::string sort = OptionalString(data, w, "sort").value_or("relevance");
  if (sort == "relevance") {
    q.sort = SortKey::kRelevance;
  } else if (sort == "name") {
    q.sort = SortKey::kName;
  } else if (sort == "size") {
    q.sort = SortKey::kSize;
  } else if (sort == "modified") {
    q.sort = SortKey::kModified;
  } else {
    throw Error(kErrBadQuery,
                "Unknown sort key \"" + sort + "\" (relevance, name, size, modified)");
  }
  std::string order = OptionalString(data, w, "order").value_or("asc");
  if (order != "asc" && order != "desc") {
    throw Error(kErrBadQuery, "data.order must be \"asc\" or \"desc\"");
  }
  q.descending = order == "desc";
  q.offset = OptionalInt(data, w, "offset").value_or(0);
  q.limit = OptionalInt(data, w, "limit").value_or(q.limit);
  if (q.offset < 0) throw Error(kErrBadQuery, "data.offset must not be negative");
  if (q.limit < 0 || q.limit > kMaxSearchLimit) {
    throw Error(kErrBadQuery, "data.limit must be 0 to " + std::to_string(kMaxSearchLimit));
  }
  q.fields = StringList(data, w, "fields");
  if (data.isMember("highlight")) {
    const Json::Value& h = RequireObject(data, w, "highlight");
    q.highlight_pre = OptionalString(h, "data.highlight", "pre").value_or(q.highlight_pre);
    q.highlight_post = OptionalString(h, "data.highlight", "post").value_or(q.highlight_post);
  }
  return q;
}

Json::Value SearchResultToJson(const SearchResult& result, const SearchQuery& query) {
  Json::Value out(Json::objectValue);
  out["total"] = static_cast<Json::Int64>(result.total);
  out["offset"] = static_cast<Json::Int64>(query.offset);
  out["ranked"] = result.ranked;
  out["hits"] = Json::Value(Json::arrayValue);
  for (const SearchHit& hit : result.hits) {
    Json::Value h(Json::objectValue);
    h["id"] = hit.id;
    h["score"] = hit.score;
    h["fields"] = hit.fields;
    h["snippet"] = hit.snippet;
    out["hits"].append(h);
  }
  return out;
}

}  // namespace vellis::searchd
