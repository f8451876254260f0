// JSON text and file operations and the typed property helpers.
//
// All JSON of the library is a Json::Value (jsoncpp). Text is compact on one
// line and keeps UTF-8 as it is; objects are written in key order (the
// library's map order).
#pragma once

#include <json/json.h>

#include <string>
#include <string_view>
#include <vector>

#include "common/error.h"

namespace vellis {

// Parses `text` into `out`. Returns false, leaving `out` unspecified, on any
// syntax error, on trailing text after the value, on comments, on a NUL byte,
// on text that is not well-formed UTF-8, and on nesting deeper than 1000.
// Never throws. Thread-safe.
bool JsonFromString(Json::Value& out, const std::string& text);
// The same for text that is not held in a std::string (a line of a file
// being read, say), without copying it.
bool JsonFromChars(Json::Value& out, std::string_view text);

// `v` as compact JSON text on one line (no newline), UTF-8 not escaped.
std::string JsonToString(const Json::Value& v);

// Reads and parses a whole file (a regular file of at most 64 MiB; a link to
// one is followed). Returns false when it cannot be read or parsed.
bool JsonFromFile(Json::Value& out, const std::string& path);

// Writes `v`, indented, to `path` atomically: a temporary file in the same
// folder is written, flushed to disk, given mode 0644 and renamed over
// `path`. On failure the old file is left as it was, the temporary file is
// removed and false is returned (errno says why).
bool JsonToFile(const Json::Value& v, const std::string& path);

// True when `v` converts to T by the JSON library's rules
// (Json::Value::isConvertibleTo): T is std::string, bool, int, unsigned int,
// long long or double.
template <typename T>
bool isJsonType(const Json::Value& v);

// The JSON library's conversion of `v` to T (asString, asBool, ...).
template <typename T>
T asJsonType(const Json::Value& v);

// Reads obj[key] into `out`.
// Throws Error 120 "Not an object" + AppendData(obj) when obj is not an
// object. With `required`: a missing key throws 120 "Missing property: <key>"
// + AppendData(obj); an unconvertible value throws 120 "Not a string" +
// AppendData(obj) (for every T). Without `required`, a missing or
// unconvertible member leaves `out` untouched. For T = Json::Value the member
// is copied as it is.
template <typename T>
void GetJsonValue(T& out, const Json::Value& obj, const std::string& key, bool required);

// ", data=" followed by the value's JSON text.
std::string AppendData(const Json::Value& v);

template <typename T>
Json::Value Vec2JsonArr(const std::vector<T>& vec);

template <typename T>
std::vector<T> JsonArr2Vec(const Json::Value& arr);

// Applies a change set to `target` in place, member by member: null removes
// the key, an object recurses into target[key] (creating it), anything else
// (arrays included) replaces target[key] whole.
void JsonApplyChanges(Json::Value& target, const Json::Value& changes);

}  // namespace vellis
