// vellis queue fold|rotate|pending
#include <iostream>
#include <memory>
#include <string>

#include "fileindex/optree.h"
#include "fileindex/queue_mgr.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {
namespace {

struct QueueArgs {
  std::string file;
  std::string path;
};

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
      unsigned int count = tree.ProcessOP(
          [](std::shared_ptr<fileindex::OP> op) { std::cout << op << "\n"; });
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
      std::cout << "processing: " << (mgr.IsFullPathProcessing(args->path) ? "yes" : "no")
                << "\n";
      std::cout << "reindex: " << (mgr.IsFullPathHasReindex(args->path) ? "yes" : "no") << "\n";
    };
  });
}

}  // namespace vellis::cli
