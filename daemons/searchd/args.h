// Typed reads of request members. Every failure throws Error kErrBadMember
// with a message naming the member ("data.doc_id is missing", "data.limit
// must be an integer"), so clients see which part of a request was wrong.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace vellis::searchd {

// `obj`[key], which must be a string (and not empty when `non_empty`).
std::string RequireString(const Json::Value& obj, const std::string& where, const char* key,
                          bool non_empty = true);
// The string member when present; nullopt when absent.
std::optional<std::string> OptionalString(const Json::Value& obj, const std::string& where,
                                          const char* key);
// `obj`[key], which must be an object.
const Json::Value& RequireObject(const Json::Value& obj, const std::string& where, const char* key);
std::optional<int64_t> OptionalInt(const Json::Value& obj, const std::string& where,
                                   const char* key);
// A string or an array of strings, as a list; empty when absent.
std::vector<std::string> StringList(const Json::Value& obj, const std::string& where,
                                    const char* key);

}  // namespace vellis::searchd
