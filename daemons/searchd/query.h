// A search as the engine receives it, and the parser of the user's query
// text. docs/search.md describes the request members that fill it.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace vellis::searchd {

// One piece of the query text.
struct QueryTerm {
  enum class Kind { kWord, kPrefix, kPhrase };
  Kind kind = Kind::kWord;
  std::string field;  // "field:value" form; empty for the catch-all
  std::string text;   // without quotes or the trailing '*'

  bool operator==(const QueryTerm& o) const {
    return kind == o.kind && field == o.field && text == o.text;
  }
};

// Splits the user's query text into terms; all must match.
//   word          a word of the catch-all fields
//   rep*          words beginning with "rep"
//   "two words"   the words next to each other (an unclosed quote runs to
//                 the end of the text)
//   field:value   (also field:"a b", field:pre*) a value of one field; the
//                 field name is letters, digits and '_' not starting with a
//                 digit
// A lone '*' or an empty phrase is dropped. Never throws.
std::vector<QueryTerm> ParseQueryText(const std::string& text);

enum class SortKey { kRelevance, kName, kSize, kModified };

struct SearchQuery {
  std::vector<QueryTerm> terms;
  std::string name;                     // substring of the file name
  std::string path_prefix;              // identity (path) prefix
  std::vector<std::string> categories;  // any of them (extension lists)
  std::vector<std::string> extensions;  // any of them (lower case)
  std::optional<int64_t> size_min, size_max;
  std::optional<int64_t> modified_from, modified_to;
  SortKey sort = SortKey::kRelevance;
  bool descending = false;
  int64_t offset = 0;
  int64_t limit = 20;
  std::vector<std::string> fields;  // stored fields per hit; empty: all
  std::string highlight_pre = "<em>";
  std::string highlight_post = "</em>";
};

struct SearchHit {
  std::string id;
  double score = 0;  // larger is better; 0 without query words
  Json::Value fields;
  std::string snippet;
};

struct SearchResult {
  int64_t total = 0;
  // True when the hits are in relevance order: query words were given, the
  // sort is by relevance and the matches were few enough to score all of
  // them (otherwise the most recently indexed documents come first).
  bool ranked = false;
  std::vector<SearchHit> hits;
};

}  // namespace vellis::searchd
