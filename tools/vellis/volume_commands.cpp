// vellis volume pause|resume|clear
#include <iostream>
#include <memory>
#include <string>

#include "fileindex/index_mgr.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {

void AddVolumeCommands(CLI::App& app, Context& ctx) {
  CLI::App* group =
      app.add_subcommand("volume", "Pause, resume and forget the indexed shares of a volume");
  group->require_subcommand(1);
  auto mount = std::make_shared<std::string>();

  struct Op {
    const char* name;
    const char* help;
    void (*fn)(const std::string&);
    const char* done;
  };
  static const Op kOps[] = {
      {"pause",
       "Pause every indexed folder on the volume and stop its shares' workers, monitoring "
       "and indexes",
       fileindex::VolumePause, "paused"},
      {"resume", "Resume the paused folders on the volume and their shares",
       fileindex::VolumeResume, "resumed"},
      {"clear",
       "Forget the folders that a pause of this volume left paused (the volume is gone for good)",
       fileindex::VolumeClearPaused, "cleared"},
  };
  for (const Op& op : kOps) {
    CLI::App* cmd = group->add_subcommand(op.name, op.help);
    cmd->add_option("MOUNT_POINT", *mount, "The volume's mount point (/volume1)")->required();
    cmd->callback([&ctx, mount, &op] {
      ctx.action = [mount, &op] {
        op.fn(*mount);
        std::cout << op.done << " " << *mount << "\n";
      };
    });
  }
}

}  // namespace vellis::cli
