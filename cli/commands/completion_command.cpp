#include <iostream>

#include "cli/commands/commands.h"
#include "cli/completion/completion.h"

namespace quarry::cli {

void AddCompletionCommand(CLI::App& app) {
  CLI::App* completion = app.add_subcommand("completion", "Print the completion script for bash");
  Examples(*completion, "  source <(quarry completion)");
  completion->callback([] { std::cout << kBashCompletion; });
}

}  // namespace quarry::cli
