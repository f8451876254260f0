// vellis folder add|set|list|get|delete|reindex
#include <iostream>
#include <iterator>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/index_mgr.h"
#include "tools/vellis/commands.h"
#include "tools/vellis/table.h"

namespace vellis::cli {
namespace {

constexpr const char* kCategories[] = {"document", "audio", "video", "photo"};

struct FolderArgs {
  std::vector<std::string> paths;
  std::string name;
  std::string categories = "document,audio,video,photo";
  std::string from_json;
  bool updater = false;
  bool json = false;
  bool status = false;
  bool desc = false;
  unsigned int offset = 0;
  unsigned int limit = 1000;
  std::string sort_by = "path";
};

// The folder list that the library takes: the --from-json text ("-" reads
// standard input), or one folder per path with the categories asked for.
Json::Value FolderListFromArgs(const FolderArgs& args) {
  if (!args.from_json.empty()) {
    std::string text = args.from_json;
    if (text == "-") {
      text.assign(std::istreambuf_iterator<char>(std::cin), std::istreambuf_iterator<char>());
    }
    Json::Value list;
    if (!JsonFromString(list, text)) throw Error(kErrBadArgument, "Not JSON: " + text);
    if (!args.paths.empty()) throw Error(kErrBadArgument, "Give paths or --from-json, not both");
    return list;
  }
  if (args.paths.empty()) throw Error(kErrBadArgument, "Missing path");
  Json::Value flags(Json::objectValue);
  for (const char* c : kCategories) flags[c] = false;
  std::stringstream in(args.categories);
  for (std::string item; std::getline(in, item, ',');) {
    if (item.empty()) continue;
    if (!flags.isMember(item)) throw Error(kErrBadArgument, "Unknown category: " + item);
    flags[item] = true;
  }
  Json::Value list(Json::arrayValue);
  for (const std::string& path : args.paths) {
    Json::Value folder = flags;
    folder["path"] = path;
    std::string name = args.name;
    if (name.empty()) name = path.substr(path.rfind('/') + 1);
    folder["name"] = name;
    list.append(folder);
  }
  return list;
}

std::vector<std::string> FolderRow(const Json::Value& f, bool status) {
  std::vector<std::string> row = {f["path"].asString(),          f["name"].asString(),
                                  YesNo(f["document"].asBool()), YesNo(f["audio"].asBool()),
                                  YesNo(f["video"].asBool()),    YesNo(f["photo"].asBool()),
                                  YesNo(f["paused"].asBool())};
  if (status) {
    const Json::Value& s = f["additional"]["status"];
    std::string text = s["text"].asString();
    if (s.isMember("desc")) text += " (" + s["desc"].asString() + ")";
    row.push_back(text);
  }
  return row;
}

void AddUpsertCommand(CLI::App* group, Context& ctx, const char* name, const char* help,
                      bool create) {
  auto args = std::make_shared<FolderArgs>();
  CLI::App* cmd = group->add_subcommand(name, help);
  cmd->add_option("PATH", args->paths, "Share paths of the folders (/photo/2019)");
  cmd->add_option("--name", args->name, "Display name (default: the last path component)");
  cmd->add_option("--categories", args->categories,
                  "Content to index, comma-separated: document,audio,video,photo")
      ->capture_default_str();
  cmd->add_option("--from-json", args->from_json,
                  "A JSON array of folder objects instead of paths (\"-\": standard input)");
  cmd->add_flag("--updater", args->updater,
                "Restoring a configuration: keep paths that cannot be indexed now, queue nothing");
  cmd->callback([&ctx, args, create] {
    ctx.action = [args, create] {
      Json::Value list = FolderListFromArgs(*args);
      fileindex::FolderUpsert(list, create, args->updater);
      std::cout << (create ? "added " : "set ") << list.size() << " folder"
                << (list.size() == 1 ? "" : "s") << "\n";
    };
  });
}

}  // namespace

void AddFolderCommands(CLI::App& app, Context& ctx) {
  CLI::App* group = app.add_subcommand("folder", "Add, change, list and remove indexed folders");
  group->require_subcommand(1);

  AddUpsertCommand(group, ctx, "add",
                   "Index new folders: create the share's index when needed, watch the folders "
                   "and queue their indexing (error 901 for a folder already indexed)",
                   true);
  AddUpsertCommand(group, ctx, "set",
                   "Add or change indexed folders; only the changed categories are reindexed",
                   false);

  auto list_args = std::make_shared<FolderArgs>();
  CLI::App* list = group->add_subcommand("list", "List the indexed folders");
  list->add_option("--offset", list_args->offset, "Skip this many folders");
  list->add_option("--limit", list_args->limit, "Show at most this many")->capture_default_str();
  list->add_option("--sort-by", list_args->sort_by, "path, name, document, audio, video or photo")
      ->capture_default_str();
  list->add_flag("--desc", list_args->desc, "Reverse the order");
  list->add_flag("--status", list_args->status, "Show each folder's indexing status");
  list->add_flag("--json", list_args->json, "Print the JSON result");
  list->callback([&ctx, list_args] {
    ctx.action = [list_args] {
      Json::Value additional(Json::arrayValue);
      if (list_args->status) additional.append("status");
      Json::Value result;
      fileindex::FolderList(result, list_args->offset, list_args->limit, list_args->sort_by,
                            list_args->desc ? "desc" : "asc", additional);
      if (list_args->json) {
        PrintJson(std::cout, result);
        return;
      }
      std::vector<std::string> header = {"PATH",  "NAME",  "DOCUMENT", "AUDIO",
                                         "VIDEO", "PHOTO", "PAUSED"};
      if (list_args->status) header.push_back("STATUS");
      std::vector<std::vector<std::string>> rows;
      for (const Json::Value& f : result["folder"]) rows.push_back(FolderRow(f, list_args->status));
      PrintTable(std::cout, header, rows);
      std::cout << "total " << result["total"].asUInt() << "\n";
    };
  });

  auto get_args = std::make_shared<FolderArgs>();
  CLI::App* get = group->add_subcommand("get", "Show one indexed folder");
  get->add_option("PATH", get_args->paths, "Share path of the folder")->required()->expected(1);
  get->add_flag("--json", get_args->json, "Print the JSON record");
  get->callback([&ctx, get_args] {
    ctx.action = [get_args] {
      Json::Value folder;
      fileindex::FolderGet(folder, get_args->paths[0]);
      if (get_args->json) {
        PrintJson(std::cout, folder);
        return;
      }
      PrintTable(std::cout, {"PATH", "NAME", "DOCUMENT", "AUDIO", "VIDEO", "PHOTO", "PAUSED"},
                 {FolderRow(folder, false)});
    };
  });

  auto delete_args = std::make_shared<FolderArgs>();
  CLI::App* del = group->add_subcommand(
      "delete", "Stop indexing a folder; the share's index is dropped with its last folder");
  del->add_option("PATH", delete_args->paths, "Share path of the folder")->required()->expected(1);
  del->callback([&ctx, delete_args] {
    ctx.action = [delete_args] {
      fileindex::FolderDelete(delete_args->paths[0]);
      std::cout << "deleted " << delete_args->paths[0] << "\n";
    };
  });

  auto reindex_args = std::make_shared<FolderArgs>();
  CLI::App* reindex = group->add_subcommand("reindex", "Index indexed folders again from scratch");
  reindex->add_option("PATH", reindex_args->paths, "Share paths of the folders")->required();
  reindex->callback([&ctx, reindex_args] {
    ctx.action = [reindex_args] {
      Json::Value paths(Json::arrayValue);
      for (const std::string& p : reindex_args->paths) paths.append(p);
      fileindex::FolderReindex(paths);
      std::cout << "queued reindex of " << paths.size() << " folder"
                << (paths.size() == 1 ? "" : "s") << "\n";
    };
  });
}

}  // namespace vellis::cli
