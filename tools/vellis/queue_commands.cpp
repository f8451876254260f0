// vellis queue fold|rotate|pending|add
#include <iostream>
#include <memory>
#include <string>
#include <utility>

#include "common/error.h"
#include "fileindex/optree.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/util.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {
namespace {

struct QueueArgs {
  std::string file;
  std::string path;
  std::string event;
  std::string old_path;
};

// The changes a user may report, by the names `queue add` takes.
constexpr std::pair<const char*, int> kEventNames[] = {
    {"create", fileindex::kEventCreate}, {"modify", fileindex::kEventModify},
    {"attr", fileindex::kEventAttr},     {"delete", fileindex::kEventDelete},
    {"rename", fileindex::kEventRename}, {"reindex", fileindex::kEventReindex},
};

// Appends one change to the queue of the share that holds the path, as the
// file-change monitor does.
void AddEvent(const QueueArgs& args) {
  int event = 0;
  for (const auto& [name, value] : kEventNames) {
    if (args.event == name) event = value;
  }
  if (event == 0) throw Error(kErrBadArgument, "Unknown event: " + args.event);
  if ((event == fileindex::kEventRename) != !args.old_path.empty()) {
    throw Error(kErrBadArgument, "--old goes with rename, and only with it");
  }
  // Fails here, with its reason, for a path that no share holds.
  std::string share, share_path;
  fileindex::GetShareNamePathByFullPath(share, share_path, args.path);
  fileindex::AddCustomEvent(event, args.path, args.old_path, Json::Value());
}

}  // namespace

void AddQueueCommands(CLI::App& app, Context& ctx) {
  auto args = std::make_shared<QueueArgs>();
  CLI::App* queue = app.add_subcommand("queue", "Inspect and rotate a share's event queue");
  queue->require_subcommand(1);

  CLI::App* fold = queue->add_subcommand(
      "fold", "Fold a queue file and print each surviving operation, then the count");
  fold->add_option("FILE", args->file, "Queue file")->required();
  fold->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::OPTree tree(args->file);
      unsigned int count =
          tree.ProcessOP([](std::shared_ptr<fileindex::OP> op) { std::cout << op << "\n"; });
      std::cout << count << "\n";
    };
  });

  CLI::App* rotate = queue->add_subcommand(
      "rotate", "Move the live queue aside to QUEUE.tmp (kept if one is still there)");
  rotate->add_option("QUEUE", args->file, "Live queue file")->required();
  rotate->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::QueueMgr mgr(args->file);
      mgr.PrepareTmpQueue();
      std::cout << mgr.queue_path_tmp() << "\n";
    };
  });

  CLI::App* pending = queue->add_subcommand(
      "pending", "Tell whether events for PATH wait in QUEUE or its side file");
  pending->add_option("QUEUE", args->file, "Live queue file")->required();
  pending->add_option("PATH", args->path, "Full path")->required();
  pending->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::QueueMgr mgr(args->file);
      std::cout << "processing: " << (mgr.IsFullPathProcessing(args->path) ? "yes" : "no") << "\n";
      std::cout << "reindex: " << (mgr.IsFullPathHasReindex(args->path) ? "yes" : "no") << "\n";
    };
  });

  CLI::App* add = queue->add_subcommand(
      "add",
      "Report a change of PATH to its share's queue, as the file-change monitor does; EVENT is "
      "create, modify, attr, delete, rename (with --old) or reindex");
  add->add_option("EVENT", args->event, "What changed")->required();
  add->add_option("PATH", args->path, "Full path")->required();
  add->add_option("--old", args->old_path, "The path before a rename");
  add->callback([&ctx, args] { ctx.action = [args] { AddEvent(*args); }; });
}

}  // namespace vellis::cli
