// The four file categories of a search filter, each a fixed query text of
// extensions joined with " OR ", read from the library's category query
// table (fileindex/util.h) and used as they stand (the document list holds
// "msgc", for one); they are not derived from the extension table.
#pragma once

#include <string>
#include <vector>

namespace vellis::searchd {

inline constexpr char kCategoryDocument[] = "document";
inline constexpr char kCategoryAudio[] = "audio";
inline constexpr char kCategoryVideo[] = "video";
inline constexpr char kCategoryImage[] = "image";

// The query text of a category name; nullptr for any other name.
const char* CategoryQueryText(const std::string& category);

// The extensions of a category (the query text split at " OR ", repeats
// dropped, in order). Throws nothing; empty for an unknown name.
std::vector<std::string> CategoryExtensions(const std::string& category);

}  // namespace vellis::searchd
