// vellis path check|type|share
#include <iostream>
#include <memory>
#include <string>

#include "common/json_util.h"
#include "fileindex/util.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {
namespace {

const char* FileTypeName(fileindex::FileType type) {
  switch (type) {
    case fileindex::kDocument:
      return "document";
    case fileindex::kAudio:
      return "audio";
    case fileindex::kVideo:
      return "video";
    case fileindex::kImage:
      return "image";
    case fileindex::kUnknownFileType:
      break;
  }
  return "unknown";
}

}  // namespace

void AddPathCommands(CLI::App& app, Context& ctx) {
  auto path = std::make_shared<std::string>();
  CLI::App* group = app.add_subcommand("path", "Ask the indexing rules about a path");
  group->require_subcommand(1);

  auto json = std::make_shared<bool>(false);
  CLI::App* check = group->add_subcommand(
      "check",
      "Tell whether FULL_PATH may be indexed, and if not, which rule refuses it; exit status 0 "
      "when it may, 1 when not");
  check->add_option("FULL_PATH", *path, "Full path (/volume1/photo/a.jpg)")->required();
  check->add_flag("--json", *json,
                  "Print {\"path\", \"indexable\", \"rule\"} (rule: the refusing rule, or "
                  "\"indexable\")");
  check->callback([&ctx, path, json] {
    ctx.action = [&ctx, path, json] {
      fileindex::IndexRule rule = fileindex::CheckFullPathIndexable(*path);
      const bool indexable = rule == fileindex::IndexRule::kIndexable;
      ctx.exit_status = indexable ? 0 : 1;
      if (*json) {
        Json::Value out(Json::objectValue);
        out["path"] = *path;
        out["indexable"] = indexable;
        out["rule"] = fileindex::IndexRuleName(rule);
        std::cout << JsonToString(out) << "\n";
      } else if (indexable) {
        std::cout << "indexable\n";
      } else {
        std::cout << "not indexable: " << fileindex::IndexRuleName(rule) << "\n";
      }
    };
  });

  CLI::App* type = group->add_subcommand("type", "Print the file type of PATH by its extension");
  type->add_option("PATH", *path, "Any path; the file is not read")->required();
  type->callback([&ctx, path] {
    ctx.action = [path] {
      fileindex::FileType t = fileindex::GetFileTypeByFullPath(*path);
      std::cout << static_cast<int>(t) << " " << FileTypeName(t) << "\n";
    };
  });

  CLI::App* share = group->add_subcommand("share", "Print the share that holds FULL_PATH");
  share->add_option("FULL_PATH", *path, "Full path")->required();
  share->callback([&ctx, path] {
    ctx.action = [path] {
      std::string name;
      std::string share_path;
      fileindex::GetShareNamePathByFullPath(name, share_path, *path);
      std::cout << name << "\t" << share_path << "\n";
    };
  });
}

}  // namespace vellis::cli
