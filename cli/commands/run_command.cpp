#include "cli/commands/commands.h"
#include "cli/system.h"
#include "fileindex/index_mgr.h"

namespace quarry::cli {

void AddRunCommand(CLI::App& app) {
  CLI::App* run = app.add_subcommand("run", "Start and supervise the daemons, in the foreground");
  Examples(*run,
           "  quarry run                                   the system of this machine (as root)\n"
           "  QUARRY_ROOT=~/.local/state/quarry quarry run a private one");
  run->callback(RunSystem);

  CLI::App* prepare =
      app.add_subcommand("prepare-services", "Start or stop the services as the folder list needs");
  prepare->group("");
  prepare->callback([] { fileindex::PrepareServices(); });
}

}  // namespace quarry::cli
