// Content extraction on an ordinary Linux machine: the document of a file
// from its file-system attributes and, for plain-text files, its text.
// LinuxPlatform::ParseFile is built from these pieces; docs/document.md says
// which field gets what. The pure functions are thread-safe.
#pragma once

#include <json/json.h>

#include <cstddef>
#include <cstdint>
#include <string>

namespace vellis::sdk {

// At most this many bytes of a file's text are indexed: 1 MiB, cut back to
// the last whole UTF-8 character.
inline constexpr size_t kMaxTextContentBytes = 1u << 20;

// What the file system says about one directory entry (not following a
// symbolic link).
struct FileFacts {
  uint32_t mode = 0;  // st_mode: type and permission bits
  uint64_t size = 0;
  uint64_t blocks = 0;  // 512-byte blocks allocated
  int64_t mtime = 0;    // content change, seconds since the epoch
  int64_t ctime = 0;    // attribute change
  bool has_btime = false;
  int64_t btime = 0;  // creation, when the file system records it
  uint32_t uid = 0;
  uint32_t gid = 0;
};

// Sets the file-system fields of the document of `path` in *doc (an object;
// other members are kept).
void FillFileSystemFields(const std::string& path, const FileFacts& facts, Json::Value* doc);

// True when files with this lower-case extension are read as plain text.
bool IsPlainTextExtension(const std::string& lower_extension);

// The text to index from the first bytes of a file. `bytes` holds what was
// read; when it is longer than kMaxTextContentBytes it is cut to that size,
// then back to a character boundary. Returns false (no text) when the result
// is not well-formed UTF-8 or contains a NUL byte.
bool TextContentFromBytes(const std::string& bytes, std::string* text);

// The whole extraction, as LinuxPlatform::ParseFile. 0 on success, -1 when
// the path cannot be examined or leads through a symbolic link (errno set).
int ExtractDocument(const std::string& path, const Json::Value& options, Json::Value* doc);

}  // namespace vellis::sdk
