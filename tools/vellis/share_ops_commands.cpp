// vellis share pause|resume|clear|rename|migrate|check-recycle: the share
// operations of the index, added to the `share` group.
#include <iostream>
#include <memory>
#include <string>

#include "fileindex/index_mgr.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {
namespace {

struct ShareOpArgs {
  std::string name;
  std::string other;  // a path or the new name
};

}  // namespace

void AddShareOpsCommands(CLI::App& app, Context& ctx) {
  CLI::App* share = app.get_subcommand("share");
  share->description(
      "Register, list and remove shared folders, and keep the index in step with them");
  auto args = std::make_shared<ShareOpArgs>();

  CLI::App* pause = share->add_subcommand(
      "pause",
      "Take a share out of indexing: stop its worker, its monitoring and its index; its "
      "folders show as paused (nothing happens for a share without indexed folders)");
  pause->add_option("NAME", args->name, "Share name")->required();
  pause->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::SharePause(args->name);
      std::cout << "paused " << args->name << "\n";
    };
  });

  CLI::App* resume = share->add_subcommand(
      "resume", "Bring a paused share back: its index, its monitoring, then its worker");
  resume->add_option("NAME", args->name, "Share name")->required();
  resume->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::ShareResume(args->name);
      std::cout << "resumed " << args->name << "\n";
    };
  });

  CLI::App* clear = share->add_subcommand(
      "clear", "Forget a share that is gone for good: its queue, index data, index and folders");
  clear->add_option("NAME", args->name, "Share name")->required();
  clear->add_option("SHARE_PATH", args->other, "The share's full path (/volume1/photo)")
      ->required();
  clear->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::ShareClearPaused(args->name, args->other);
      std::cout << "cleared " << args->name << "\n";
    };
  });

  CLI::App* rename = share->add_subcommand(
      "rename",
      "After a share was renamed (it exists under NEW_NAME): move its folders, its index and "
      "its documents to the new name");
  rename->add_option("OLD_NAME", args->name, "The share's former name")->required();
  rename->add_option("NEW_NAME", args->other, "Its name now")->required();
  rename->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::ShareRename(args->name, args->other);
      std::cout << "renamed " << args->name << " to " << args->other << "\n";
    };
  });

  CLI::App* migrate = share->add_subcommand(
      "migrate",
      "After a share moved to another volume: move its index and monitoring to the new "
      "place and queue the move and a reindex of its folders");
  migrate->add_option("NAME", args->name, "Share name")->required();
  migrate->add_option("OLD_PATH", args->other, "The share's full path before the move")->required();
  migrate->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::ShareMigrate(args->name, args->other);
      std::cout << "migrated " << args->name << "\n";
    };
  });

  CLI::App* recycle = share->add_subcommand(
      "check-recycle", "Queue a reindex of the share's recycle bin (after its setting changed)");
  recycle->add_option("NAME", args->name, "Share name")->required();
  recycle->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::ShareCheckRecycle(args->name);
      std::cout << "checked " << args->name << "\n";
    };
  });
}

}  // namespace vellis::cli
