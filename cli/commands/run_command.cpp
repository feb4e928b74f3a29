#include <memory>

#include "cli/commands/commands.h"
#include "cli/system.h"
#include "common/lock_file.h"
#include "common/paths.h"
#include "fileindex/index_mgr.h"

namespace quarry::cli {

void AddRunCommand(CLI::App& app) {
  CLI::App* run = app.add_subcommand("run", "Start and supervise the daemons, in the foreground");
  Examples(*run,
           "  quarry run                                   the system of this machine (as root)\n"
           "  QUARRY_ROOT=~/.local/state/quarry quarry run a private one");
  auto full_speed = std::make_shared<bool>(false);
  run->add_flag("--full-speed", *full_speed,
                "Do not leave the processors and disks to others while indexing");
  run->callback([full_speed] { RunSystem(*full_speed); });

  CLI::App* prepare =
      app.add_subcommand("prepare-services", "Start or stop the services as the folder list needs");
  prepare->group("");
  prepare->callback([] {
    // A folder that is being added meanwhile starts the services, which an older list would stop.
    const LockFile lock(RootedPath("/tmp/quarry_cfg_folder.lock"), true);
    fileindex::PrepareServices();
  });
}

}  // namespace quarry::cli
