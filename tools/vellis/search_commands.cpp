// vellis search: asks the search daemon and prints the hits with snippets.
#include <iostream>
#include <memory>
#include <string>

#include "common/error.h"
#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "sdk/domain_socket.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {
namespace {

struct SearchArgs {
  std::string query;
  std::string category;
  std::string path;
  std::string name;
  std::string index;
  int limit = 20;
  bool json = false;
};

// Sends one request; a failed answer becomes an Error with the daemon's code.
Json::Value Ask(const std::string& command, const Json::Value& data) {
  Json::Value req(Json::objectValue);
  req["command"] = command;
  req["data"] = data;
  Json::Value answer = sdk::Exchange(RootPath(kElasticSocketPath), req);
  if (!answer["success"].asBool()) {
    throw Error(static_cast<ErrorCode>(answer["error"]["code"].asInt()),
                answer["error"]["msg"].asString());
  }
  return answer["data"];
}

void RunSearch(const SearchArgs& args) {
  std::vector<std::string> indexes;
  if (!args.index.empty()) {
    indexes.push_back(args.index);
  } else {
    for (const Json::Value& info : Ask("index_list", Json::Value(Json::objectValue))) {
      indexes.push_back(info["id"].asString());
    }
  }
  Json::Value all(Json::arrayValue);
  int64_t total = 0;
  size_t shown = 0;
  for (const std::string& id : indexes) {
    Json::Value data(Json::objectValue);
    data["id"] = id;
    data["query"] = args.query;
    if (!args.category.empty()) data["category"] = args.category;
    if (!args.path.empty()) data["path"] = args.path;
    if (!args.name.empty()) data["name"] = args.name;
    data["limit"] = args.limit;
    data["fields"].append("QORUMDPath");
    data["highlight"]["pre"] = "[";
    data["highlight"]["post"] = "]";
    Json::Value result = Ask("document_search", data);
    result["index"] = id;
    total += result["total"].asInt64();
    if (args.json) {
      all.append(result);
      continue;
    }
    for (const Json::Value& hit : result["hits"]) {
      std::cout << hit["id"].asString() << "\n";
      std::string snippet = hit["snippet"].asString();
      for (char& c : snippet) {
        if (c == '\n' || c == '\r' || c == '\t') c = ' ';
      }
      if (!snippet.empty()) std::cout << "    " << snippet << "\n";
      ++shown;
    }
  }
  if (args.json) {
    std::cout << JsonToString(all) << "\n";
  } else {
    std::cout << total << (total == 1 ? " hit" : " hits") << " (" << shown << " shown)\n";
  }
}

}  // namespace

void AddSearchCommands(CLI::App& app, Context& ctx) {
  auto args = std::make_shared<SearchArgs>();
  CLI::App* search = app.add_subcommand(
      "search", "Search the indexed files: words, \"phrases\", prefix*, field:value");
  search->add_option("QUERY", args->query, "Query text")->required();
  search->add_option("--category", args->category, "Only this kind of file")
      ->check(CLI::IsMember({"document", "audio", "video", "image"}));
  search->add_option("--path", args->path, "Only files below this path prefix");
  search->add_option("--name", args->name, "Only files whose name contains this text");
  search->add_option("--index", args->index, "Search this index only (default: all)");
  search->add_option("--limit", args->limit, "Hits per index")->check(CLI::Range(1, 1000));
  search->add_flag("--json", args->json, "Print the daemon's answers as JSON");
  search->callback([&ctx, args] { ctx.action = [args] { RunSearch(*args); }; });
}

}  // namespace vellis::cli
