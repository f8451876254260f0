// Output helpers of the `vellis` commands: aligned text tables for people,
// JSON for scripts.
#pragma once

#include <json/json.h>

#include <ostream>
#include <string>
#include <vector>

namespace vellis::cli {

// Writes `rows` under `header`, each column padded to its widest cell and
// separated by two spaces; the last column is not padded.
void PrintTable(std::ostream& out, const std::vector<std::string>& header,
                const std::vector<std::vector<std::string>>& rows);

// `value` as indented JSON followed by a newline.
void PrintJson(std::ostream& out, const Json::Value& value);

const char* YesNo(bool b);

}  // namespace vellis::cli
