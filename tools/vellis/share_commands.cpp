// vellis share add|list|remove
#include <iostream>
#include <memory>
#include <string>

#include "sdk/linux/share_registry.h"
#include "sdk/share.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {
namespace {

struct ShareArgs {
  std::string name;
  std::string path;
  bool read_only = false;
  bool encrypted = false;
  bool recycle_bin = false;
  bool hide_unreadable = false;
};

const char* YesNo(bool b) { return b ? "yes" : "no"; }

}  // namespace

void AddShareCommands(CLI::App& app, Context& ctx) {
  auto args = std::make_shared<ShareArgs>();
  CLI::App* share = app.add_subcommand("share", "Register, list and remove shared folders");
  share->require_subcommand(1);

  CLI::App* add = share->add_subcommand(
      "add", "Register the share NAME at PATH (an existing folder whose last component is NAME)");
  add->add_option("NAME", args->name, "Share name")->required();
  add->add_option("PATH", args->path, "Absolute path of the share's folder")->required();
  add->add_flag("--read-only", args->read_only, "Files may not be changed through the share");
  add->add_flag("--encrypted", args->encrypted,
                "The share is encrypted (locked while its path is not a mount point)");
  add->add_flag("--recycle-bin", args->recycle_bin, "Deleted files go to #recycle");
  add->add_flag("--hide-unreadable", args->hide_unreadable, "Hide what a user may not read");
  add->callback([&ctx, args] {
    ctx.action = [args] {
      sdk::ShareInfo info;
      info.szName = args->name;
      info.szPath = args->path;
      info.read_only = args->read_only;
      info.encryption = args->encrypted;
      info.recycle_bin = args->recycle_bin;
      info.hide_unreadable = args->hide_unreadable;
      sdk::RegisterShare(info);
      std::cout << "added " << info.szName << " " << info.szPath << "\n";
    };
  });

  CLI::App* list = share->add_subcommand("list", "List the shares with their settings");
  list->callback([&ctx] {
    ctx.action = [] {
      for (const std::string& name : sdk::SDKShare::Enum()) {
        sdk::SDKShare s(name);
        std::cout << s.GetName() << "\t" << s.GetPath() << "\tindexable=" << YesNo(s.CanBeIndexed())
                  << " encryption=" << YesNo(s.IsEncryption())
                  << " recycle-bin=" << YesNo(s.IsEnableRecycleBin())
                  << " hide-unreadable=" << YesNo(s.IsHideUnReadable()) << "\n";
      }
    };
  });

  CLI::App* remove =
      share->add_subcommand("remove", "Unregister the share NAME (its folder stays as it is)");
  remove->add_option("NAME", args->name, "Share name")->required();
  remove->callback([&ctx, args] {
    ctx.action = [args] {
      sdk::UnregisterShare(args->name);
      std::cout << "removed " << args->name << "\n";
    };
  });
}

}  // namespace vellis::cli
