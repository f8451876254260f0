// vellis user rename, vellis home enable|disable
#include <iostream>
#include <map>
#include <memory>
#include <string>

#include "fileindex/index_mgr.h"
#include "sdk/platform.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {
namespace {

struct UserArgs {
  std::string from;
  std::string to;
  std::string auth = "local";
};

const std::map<std::string, int> kAuthTypes = {
    {"local", sdk::kAuthLocal}, {"domain", sdk::kAuthDomain}, {"ldap", sdk::kAuthLdap}};

}  // namespace

void AddUserCommands(CLI::App& app, Context& ctx) {
  auto args = std::make_shared<UserArgs>();
  CLI::App* user = app.add_subcommand("user", "Keep the index in step with user accounts");
  user->require_subcommand(1);
  CLI::App* rename = user->add_subcommand(
      "rename", "After a user was renamed: move the indexed folders of the home folder");
  rename->add_option("OLD_NAME", args->from, "The user's former name")->required();
  rename->add_option("NEW_NAME", args->to, "Its name now")->required();
  rename->callback([&ctx, args] {
    ctx.action = [args] {
      fileindex::UserRename(args->from, args->to);
      std::cout << "renamed " << args->from << " to " << args->to << "\n";
    };
  });

  CLI::App* home =
      app.add_subcommand("home", "Reindex home recycle bins when the home service changes");
  home->require_subcommand(1);
  for (bool enable : {true, false}) {
    CLI::App* cmd = home->add_subcommand(
        enable ? "enable" : "disable",
        enable ? "Homes were enabled for an account source: reindex their recycle bins"
               : "Homes were disabled: reindex the recycle bins of every home");
    cmd->add_option("--auth", args->auth, "Account source: local, domain or ldap")
        ->check(CLI::IsMember({"local", "domain", "ldap"}))
        ->capture_default_str();
    cmd->callback([&ctx, args, enable] {
      ctx.action = [args, enable] {
        int auth = kAuthTypes.at(args->auth);
        if (enable) {
          fileindex::HomeEnable(auth);
        } else {
          fileindex::HomeDisable(auth);
        }
        std::cout << "queued home recycle-bin reindex (" << args->auth << ")\n";
      };
    });
  }
}

}  // namespace vellis::cli
