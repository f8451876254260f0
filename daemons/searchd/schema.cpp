#include "daemons/searchd/schema.h"

#include <cerrno>
#include <cstdlib>

#include "common/json_util.h"
#include "daemons/searchd/error_codes.h"
#include "daemons/searchd/text_fold.h"

namespace vellis::searchd {
namespace {

[[noreturn]] void BadMappings(const std::string& what) {
  throw Error(kErrBadMappings, "Bad mappings: " + what);
}

FieldOptions ParseOptions(const Json::Value& obj, const FieldOptions& base,
                          const std::string& name) {
  if (!obj.isObject()) BadMappings("\"" + name + "\" is not an object");
  FieldOptions opts = base;
  if (obj.isMember("type")) {
    const Json::Value& t = obj["type"];
    std::string type = t.isString() ? t.asString() : "";
    if (type == "string") {
      opts.type = FieldType::kString;
    } else if (type == "text") {
      opts.type = FieldType::kText;
    } else if (type == "int" || type == "long" || type == "integer") {
      opts.type = FieldType::kInt;
    } else if (type == "double" || type == "float") {
      opts.type = FieldType::kDouble;
    } else if (type == "bool" || type == "boolean") {
      opts.type = FieldType::kBool;
    } else {
      BadMappings("unknown type " + JsonToString(t) + " of \"" + name + "\"");
    }
  }
  if (obj.isMember("analyzer")) {
    const Json::Value& a = obj["analyzer"];
    std::string analyzer = a.isString() ? a.asString() : "";
    if (analyzer == "qorustandard" || analyzer == "standard") {
      opts.analyzer = Analyzer::kStandard;
    } else if (analyzer == "keyword") {
      opts.analyzer = Analyzer::kKeyword;
    } else if (analyzer == "white space" || analyzer == "whitespace") {
      opts.analyzer = Analyzer::kWhiteSpace;
    } else {
      BadMappings("unknown analyzer " + JsonToString(a) + " of \"" + name + "\"");
    }
  }
  for (const char* flag : {"required", "stored", "_all"}) {
    if (!obj.isMember(flag)) continue;
    if (!obj[flag].isBool())
      BadMappings(std::string("\"") + flag + "\" of \"" + name + "\" is not a bool");
    bool value = obj[flag].asBool();
    if (flag[0] == 'r') opts.required = value;
    if (flag[0] == 's') opts.stored = value;
    if (flag[0] == '_') opts.in_all = value;
  }
  if (obj.isMember("preprocess")) {
    const Json::Value& steps = obj["preprocess"];
    if (!steps.isArray()) BadMappings("\"preprocess\" of \"" + name + "\" is not an array");
    for (const Json::Value& step : steps) {
      std::string s = step.isString() ? step.asString() : "";
      if (s == "tolower") {
        opts.lower = true;
      } else if (s == "ngram") {
        opts.ngram = true;
      } else {
        BadMappings("unknown preprocess step " + JsonToString(step) + " of \"" + name + "\"");
      }
    }
  }
  return opts;
}

// Converts `v` in place to the field's type; false when it does not fit.
bool FitType(Json::Value& v, FieldType type) {
  switch (type) {
    case FieldType::kInt:
      if (v.isString()) {
        const std::string s = v.asString();
        char* end = nullptr;
        errno = 0;
        long long n = strtoll(s.c_str(), &end, 10);
        if (s.empty() || *end != '\0' || errno != 0) return false;
        v = Json::Value(static_cast<Json::Int64>(n));
        return true;
      }
      if (v.isBool() || !v.isInt64()) return false;
      v = Json::Value(v.asInt64());
      return true;
    case FieldType::kDouble:
      if (v.isString()) {
        const std::string s = v.asString();
        char* end = nullptr;
        errno = 0;
        double d = strtod(s.c_str(), &end);
        if (s.empty() || *end != '\0' || errno != 0) return false;
        v = Json::Value(d);
        return true;
      }
      return v.isNumeric() && !v.isBool();
    case FieldType::kBool:
      if (v.isBool()) return true;
      if (v.isIntegral() && (v.asInt64() == 0 || v.asInt64() == 1)) {
        v = Json::Value(v.asInt64() == 1);
        return true;
      }
      if (v.isString() && (v.asString() == "true" || v.asString() == "false")) {
        v = Json::Value(v.asString() == "true");
        return true;
      }
      return false;
    case FieldType::kString:
    case FieldType::kText:
      if (v.isArray()) {
        for (const Json::Value& e : v) {
          if (!(e.isString() || (e.isNumeric() && !e.isBool()))) return false;
        }
        return true;
      }
      return v.isString() || (v.isNumeric() && !v.isBool());
  }
  return false;
}

const char* TypeName(FieldType type) {
  switch (type) {
    case FieldType::kString:
      return "string";
    case FieldType::kText:
      return "text";
    case FieldType::kInt:
      return "int";
    case FieldType::kDouble:
      return "double";
    case FieldType::kBool:
      return "bool";
  }
  return "?";
}

void Append(std::string& to, const std::string& text) {
  if (text.empty()) return;
  if (!to.empty()) to.push_back(' ');
  to += text;
}

}  // namespace

std::string ValueText(const Json::Value& v) {
  if (v.isString()) return v.asString();
  if (v.isBool()) return v.asBool() ? "true" : "false";
  if (v.isNumeric()) return JsonToString(v);
  if (v.isArray()) {
    std::string out;
    for (const Json::Value& e : v) Append(out, ValueText(e));
    return out;
  }
  return "";
}

Schema Schema::FromMappings(const Json::Value& mappings) {
  if (!mappings.isObject()) BadMappings("not an object");
  Schema schema;
  const Json::Value& pid = mappings["property_id"];
  if (!pid.isString() || pid.asString().empty()) BadMappings("\"property_id\" is not a field name");
  schema.property_id_ = pid.asString();
  if (mappings.isMember("default")) {
    schema.default_ = ParseOptions(mappings["default"], FieldOptions(), "default");
  }
  if (mappings.isMember("properties")) {
    const Json::Value& props = mappings["properties"];
    if (!props.isObject()) BadMappings("\"properties\" is not an object");
    for (const std::string& name : props.getMemberNames()) {
      schema.fields_[name] = ParseOptions(props[name], schema.default_, name);
    }
  }
  return schema;
}

const FieldOptions& Schema::Options(const std::string& field) const {
  auto it = fields_.find(field);
  return it == fields_.end() ? default_ : it->second;
}

Json::Value Schema::Normalize(Json::Value doc) const {
  if (!doc.isObject()) throw Error(kErrBadMember, "The document is not an object");
  for (const std::string& name : doc.getMemberNames()) {
    Json::Value& v = doc[name];
    if (v.isNull()) {
      doc.removeMember(name);
      continue;
    }
    const FieldOptions& opts = Options(name);
    // FitType leaves the value as it was when it does not fit.
    if (!FitType(v, opts.type)) {
      throw Error(kErrFieldType, "Field " + name + " must be of type " + TypeName(opts.type) +
                                     ", got " + JsonToString(v));
    }
  }
  for (const auto& [name, opts] : fields_) {
    if (opts.required && !doc.isMember(name)) {
      throw Error(kErrRequiredField, "Required field " + name + " is missing");
    }
  }
  return doc;
}

IndexedForms Schema::Analyze(const Json::Value& doc) const {
  IndexedForms forms;
  for (const std::string& name : doc.getMemberNames()) {
    const Json::Value& v = doc[name];
    const FieldOptions& opts = Options(name);
    std::string text = ValueText(v);
    if (opts.ngram) {
      Append(forms.name, opts.lower ? FoldCase(text) : text);
      // Its words also join the catch-all, so that a query word finds a file
      // by a word of its name ("0001" in IMG_0001.JPG); substrings go
      // through `name`.
      if (opts.in_all) Append(forms.std_all, text);
    }
    if (opts.analyzer == Analyzer::kKeyword) {
      // A keyword field matches whole values only, each element of an array
      // being a value of its own.
      Json::Value values = v;
      if (!v.isArray()) {
        values = Json::Value(Json::arrayValue);
        values.append(v);
      }
      for (const Json::Value& e : values) {
        std::string one = ValueText(e);
        // The identity has its own column; no need to index it twice.
        if (name != property_id_) Append(forms.kw, HexToken(name + ":" + one));
        if (opts.in_all) Append(forms.ws_all, HexToken(FoldCase(one)));
      }
      continue;
    }
    if (!opts.in_all) continue;
    if (name == kContentField) {
      Append(forms.content, text);
    } else if (opts.analyzer == Analyzer::kWhiteSpace) {
      for (const std::string& token : SplitBlanks(text))
        Append(forms.ws_all, HexToken(FoldCase(token)));
    } else {
      Append(forms.std_all, text);
    }
  }
  return forms;
}

}  // namespace vellis::searchd
