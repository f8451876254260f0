// vellis: the command line of the file-indexing service.
#include <syslog.h>

#include <iostream>

#include "common/error.h"
#include "common/root_path.h"
#include "tools/vellis/commands.h"

int main(int argc, char** argv) {
  CLI::App app{"vellis: manage and inspect the file-indexing service"};
  app.require_subcommand(1);
  bool verbose = false;
  app.add_flag("-v,--verbose", verbose, "Copy the system-log lines of this run to stderr");

  vellis::cli::Context ctx;
  vellis::cli::AddQueueCommands(app, ctx);
  vellis::cli::AddShareCommands(app, ctx);
  vellis::cli::AddPathCommands(app, ctx);
  vellis::cli::AddSearchCommands(app, ctx);
  vellis::cli::AddIndexCommands(app, ctx);
  vellis::cli::AddFolderCommands(app, ctx);
  vellis::cli::AddShareOpsCommands(app, ctx);
  vellis::cli::AddVolumeCommands(app, ctx);
  vellis::cli::AddUserCommands(app, ctx);
  vellis::cli::AddServicesCommands(app, ctx);
  vellis::cli::AddStatusCommands(app, ctx);

  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& e) {
    return app.exit(e);
  }

  vellis::PrepareRoot();
  openlog("vellis", LOG_PID | (verbose ? LOG_PERROR : 0), LOG_USER);
  try {
    if (ctx.action) ctx.action();
  } catch (const vellis::Error& e) {
    std::cerr << "error " << static_cast<int>(e.GetCode()) << ": " << e.what() << "\n";
    return 1;
  } catch (const std::exception& e) {
    std::cerr << "error: " << e.what() << "\n";
    return 1;
  }
  return ctx.exit_status;
}
