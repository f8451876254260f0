#include "tools/vellis/table.h"

#include <algorithm>

namespace vellis::cli {

void PrintTable(std::ostream& out, const std::vector<std::string>& header,
                const std::vector<std::vector<std::string>>& rows) {
  std::vector<size_t> width(header.size(), 0);
  auto measure = [&](const std::vector<std::string>& row) {
    for (size_t i = 0; i < row.size() && i < width.size(); ++i) {
      width[i] = std::max(width[i], row[i].size());
    }
  };
  measure(header);
  for (const auto& row : rows) measure(row);
  auto print = [&](const std::vector<std::string>& row) {
    for (size_t i = 0; i < row.size(); ++i) {
      out << row[i];
      if (i + 1 < row.size()) out << std::string(width[i] - row[i].size() + 2, ' ');
    }
    out << "\n";
  };
  print(header);
  for (const auto& row : rows) print(row);
}

void PrintJson(std::ostream& out, const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  out << Json::writeString(builder, value) << "\n";
}

const char* YesNo(bool b) { return b ? "yes" : "no"; }

}  // namespace vellis::cli
