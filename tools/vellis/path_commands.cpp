// vellis path check|type|share
#include <iostream>
#include <memory>
#include <string>

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

  CLI::App* check = group->add_subcommand(
      "check", "Tell whether FULL_PATH may be indexed, and if not, which rule refuses it");
  check->add_option("FULL_PATH", *path, "Full path (/volume1/photo/a.jpg)")->required();
  check->callback([&ctx, path] {
    ctx.action = [path] {
      fileindex::IndexRule rule = fileindex::CheckFullPathIndexable(*path);
      if (rule == fileindex::IndexRule::kIndexable) {
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
