#include <iostream>

#include "cli/commands/commands.h"

namespace quarry::cli {
namespace {

constexpr const char* kBash =
#include "cli/completion/quarry.bash.inc"
    ;

}  // namespace

void AddCompletionCommand(CLI::App& app) {
  CLI::App* completion = app.add_subcommand("completion", "Print the completion script for bash");
  Examples(*completion, "  source <(quarry completion)");
  completion->callback([] { std::cout << kBash; });
}

}  // namespace quarry::cli
