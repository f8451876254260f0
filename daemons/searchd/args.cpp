#include "daemons/searchd/args.h"

#include "daemons/searchd/error_codes.h"

namespace vellis::searchd {
namespace {

[[noreturn]] void Bad(const std::string& where, const char* key, const std::string& what) {
  throw Error(kErrBadMember, where + "." + key + " " + what);
}

}  // namespace

std::string RequireString(const Json::Value& obj, const std::string& where, const char* key,
                          bool non_empty) {
  if (!obj.isMember(key)) Bad(where, key, "is missing");
  const Json::Value& v = obj[key];
  if (!v.isString()) Bad(where, key, "must be a string");
  std::string s = v.asString();
  if (non_empty && s.empty()) Bad(where, key, "must not be empty");
  return s;
}

std::optional<std::string> OptionalString(const Json::Value& obj, const std::string& where,
                                          const char* key) {
  if (!obj.isMember(key)) return std::nullopt;
  if (!obj[key].isString()) Bad(where, key, "must be a string");
  return obj[key].asString();
}

const Json::Value& RequireObject(const Json::Value& obj, const std::string& where,
                                 const char* key) {
  if (!obj.isMember(key)) Bad(where, key, "is missing");
  if (!obj[key].isObject()) Bad(where, key, "must be an object");
  return obj[key];
}

std::optional<int64_t> OptionalInt(const Json::Value& obj, const std::string& where,
                                   const char* key) {
  if (!obj.isMember(key)) return std::nullopt;
  const Json::Value& v = obj[key];
  if (v.isBool() || !v.isInt64()) Bad(where, key, "must be an integer");
  return v.asInt64();
}

std::vector<std::string> StringList(const Json::Value& obj, const std::string& where,
                                    const char* key) {
  std::vector<std::string> out;
  if (!obj.isMember(key)) return out;
  const Json::Value& v = obj[key];
  if (v.isString()) {
    out.push_back(v.asString());
    return out;
  }
  if (!v.isArray()) Bad(where, key, "must be a string or an array of strings");
  for (const Json::Value& e : v) {
    if (!e.isString()) Bad(where, key, "must hold strings only");
    out.push_back(e.asString());
  }
  return out;
}

}  // namespace vellis::searchd
