// An index's field mappings, as handed to "index_create", and what they mean
// for documents: which field is the identity, which values are checked and
// how each field is analysed for search.
#pragma once

#include <json/json.h>

#include <map>
#include <string>

namespace vellis::searchd {

enum class FieldType { kString, kText, kInt, kDouble, kBool };
enum class Analyzer { kStandard, kKeyword, kWhiteSpace };

struct FieldOptions {
  FieldType type = FieldType::kString;
  Analyzer analyzer = Analyzer::kStandard;
  bool required = false;
  bool stored = true;
  bool in_all = true;  // part of the catch-all search ("_all")
  bool lower = false;  // "preprocess" "tolower"
  bool ngram = false;  // "preprocess" "ngram": substring search of the value
};

// The text forms of one document that the full-text tables index.
struct IndexedForms {
  std::string std_all;  // catch-all text under the standard analyzer
  std::string content;  // the text-content field (snippets come from it)
  std::string ws_all;   // catch-all tokens of keyword and blank-split fields
  std::string kw;       // field:value tokens of keyword fields (exact match)
  std::string name;     // values of n-gram fields, for substring search
};

// The field whose text is the document's body: searched through the
// catch-all and the source of highlighted snippets.
inline constexpr char kContentField[] = "QORUMDTextContent";

class Schema {
 public:
  // Reads "property_id", "default" and "properties" of `mappings`.
  // Throws Error kErrBadMappings naming the member when the value is not an
  // object, "property_id" is missing or not a string, or a field names an
  // unknown "type", "analyzer" or "preprocess" step.
  static Schema FromMappings(const Json::Value& mappings);

  // The field holding the document identity ("property_id").
  const std::string& property_id() const { return property_id_; }

  // The options of `field`: its own entry, or the defaults.
  const FieldOptions& Options(const std::string& field) const;
  bool IsListed(const std::string& field) const { return fields_.count(field) != 0; }

  // Checks `doc` against the mappings and returns it with values in their
  // field's type: numeric strings of int/double fields become numbers,
  // "true"/"false" and 0/1 of bool fields become bools, null members are
  // dropped. Throws Error kErrBadMember when `doc` is not an object,
  // kErrFieldType naming the field for a value that does not fit its type,
  // and kErrRequiredField naming the first missing required field.
  Json::Value Normalize(Json::Value doc) const;

  // The indexed forms of a normalised document.
  IndexedForms Analyze(const Json::Value& doc) const;

 private:
  std::string property_id_;
  FieldOptions default_;
  std::map<std::string, FieldOptions> fields_;
};

// The text of a scalar or an array of scalars ("" for anything else):
// strings as they are, numbers in JSON form, array elements joined by blanks.
std::string ValueText(const Json::Value& v);

}  // namespace vellis::searchd
