#include "daemons/searchd/query.h"

#include <cctype>

namespace vellis::searchd {
namespace {

bool IsBlank(char c) {
  return c == ' ' || c == '\t' || c == '\r' || c == '\n' || c == '\f' || c == '\v';
}

bool IsFieldChar(char c, bool first) {
  unsigned char u = static_cast<unsigned char>(c);
  return u < 0x80 && (isalpha(u) || c == '_' || (!first && isdigit(u)));
}

// The length of a "field:" prefix at `pos` (0 when there is none). The
// colon must be followed by something other than a blank.
size_t FieldPrefix(const std::string& s, size_t pos) {
  size_t i = pos;
  while (i < s.size() && IsFieldChar(s[i], i == pos)) ++i;
  if (i == pos || i + 1 >= s.size() || s[i] != ':' || IsBlank(s[i + 1])) return 0;
  return i - pos;
}

}  // namespace

std::vector<QueryTerm> ParseQueryText(const std::string& text) {
  std::vector<QueryTerm> terms;
  size_t pos = 0;
  while (pos < text.size()) {
    if (IsBlank(text[pos])) {
      ++pos;
      continue;
    }
    QueryTerm term;
    size_t field_len = FieldPrefix(text, pos);
    if (field_len > 0) {
      term.field = text.substr(pos, field_len);
      pos += field_len + 1;
    }
    if (text[pos] == '"') {
      size_t close = text.find('"', pos + 1);
      size_t end = close == std::string::npos ? text.size() : close;
      term.kind = QueryTerm::Kind::kPhrase;
      term.text = text.substr(pos + 1, end - pos - 1);
      pos = close == std::string::npos ? text.size() : close + 1;
    } else {
      size_t end = pos;
      while (end < text.size() && !IsBlank(text[end])) ++end;
      term.text = text.substr(pos, end - pos);
      pos = end;
      if (!term.text.empty() && term.text.back() == '*') {
        while (!term.text.empty() && term.text.back() == '*') term.text.pop_back();
        term.kind = QueryTerm::Kind::kPrefix;
      }
    }
    bool blank_only = true;
    for (char c : term.text) blank_only = blank_only && IsBlank(c);
    if (!blank_only) terms.push_back(std::move(term));
  }
  return terms;
}

}  // namespace vellis::searchd
