#include "daemons/searchd/categories.h"

#include <algorithm>

#include "fileindex/util.h"

namespace vellis::searchd {

const char* CategoryQueryText(const std::string& category) {
  // The library's own table: the indexer and the daemon agree on it.
  for (const auto& c : fileindex::kCategoryQueries) {
    if (category == c.category) return c.query;
  }
  return nullptr;
}

std::vector<std::string> CategoryExtensions(const std::string& category) {
  std::vector<std::string> out;
  const char* text = CategoryQueryText(category);
  if (text == nullptr) return out;
  static const std::string kSep = " OR ";
  std::string all = text;
  size_t pos = 0;
  while (pos <= all.size()) {
    size_t next = all.find(kSep, pos);
    std::string ext = all.substr(pos, next == std::string::npos ? std::string::npos : next - pos);
    if (std::find(out.begin(), out.end(), ext) == out.end()) out.push_back(ext);
    if (next == std::string::npos) break;
    pos = next + kSep.size();
  }
  return out;
}

}  // namespace vellis::searchd
