// The command line of a daemon.

#ifndef QUARRY_DAEMONS_COMMON_COMMAND_LINE_H_
#define QUARRY_DAEMONS_COMMON_COMMAND_LINE_H_

#include <CLI/CLI.hpp>
#include <optional>

namespace quarry::daemon {

constexpr int kExitWrongCommandLine = 2;

// Reads the command line into the options of `app`. Returns the status with which the program is to
// end at once: 0 when it was asked for its help, which has been printed, kExitWrongCommandLine when
// it was asked for what it does not know, which has been said on standard error. Nothing: go on.
inline std::optional<int> ParseCommandLine(CLI::App* app, int argc, char** argv) {
  try {
    app->parse(argc, argv);
    return std::nullopt;
  } catch (const CLI::ParseError& error) {
    return app->exit(error) == 0 ? 0 : kExitWrongCommandLine;
  }
}

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_COMMAND_LINE_H_
