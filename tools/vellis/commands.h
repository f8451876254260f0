// Command groups of the `vellis` command line.
//
// Each Add*Commands registers its subcommands on the app. A subcommand's
// CLI11 callback only stores its action in Context::action; main() runs the
// action after parsing, in its one try/catch that turns vellis::Error into
// "error <code>: <reason>" on stderr and exit status 1. An action that
// answers a yes/no question sets exit_status (1 for no), so that scripts
// can branch on it.
#pragma once

#include <CLI/CLI.hpp>
#include <functional>

namespace vellis::cli {

struct Context {
  std::function<void()> action;
  int exit_status = 0;
};

void AddQueueCommands(CLI::App& app, Context& ctx);
void AddShareCommands(CLI::App& app, Context& ctx);
void AddPathCommands(CLI::App& app, Context& ctx);
// `vellis search`: a search through the search daemon (daemons/searchd).
void AddSearchCommands(CLI::App& app, Context& ctx);
// `vellis index load`: fills a share's index through the library's requests.
void AddIndexCommands(CLI::App& app, Context& ctx);
// Index management: folders, the index side of shares (added to the `share`
// group, so AddShareCommands comes first), volumes, users and homes, and the
// related services.
void AddFolderCommands(CLI::App& app, Context& ctx);
void AddShareOpsCommands(CLI::App& app, Context& ctx);
void AddVolumeCommands(CLI::App& app, Context& ctx);
void AddUserCommands(CLI::App& app, Context& ctx);
void AddServicesCommands(CLI::App& app, Context& ctx);
// `vellis status`: the daemons, the pause and each indexed folder's progress.
void AddStatusCommands(CLI::App& app, Context& ctx);

}  // namespace vellis::cli
