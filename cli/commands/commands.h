// The commands of the program. Each function adds one to the application; parsing a command line
// then runs it. A command throws Problem or Error when it cannot do its work.

#ifndef QUARRY_CLI_COMMANDS_COMMANDS_H_
#define QUARRY_CLI_COMMANDS_COMMANDS_H_

#include <CLI/CLI.hpp>

namespace quarry::cli {

void AddRunCommand(CLI::App& app);
void AddShareCommand(CLI::App& app);
void AddFolderCommand(CLI::App& app);
void AddSearchCommand(CLI::App& app);
void AddStatusCommand(CLI::App& app);
void AddQueueCommand(CLI::App& app);
void AddDoctorCommand(CLI::App& app);
void AddIndexCommand(CLI::App& app);
void AddVolumeCommand(CLI::App& app);
void AddHomeCommand(CLI::App& app);
void AddUserCommand(CLI::App& app);
void AddPauseCommands(CLI::App& app);
void AddSuggestCommand(CLI::App& app);
void AddCompletionCommand(CLI::App& app);

// Parts of the commands "folder" and "share".
void AddFolderWorkCommands(CLI::App& folder);
void AddShareMoveCommands(CLI::App& share);
void AddSharePauseCommands(CLI::App& share);

// A "--json" option of `command`. The reference stays valid as long as the application.
const bool& JsonOption(CLI::App& command);

// Ends the command's help with examples.
void Examples(CLI::App& command, const std::string& lines);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_COMMANDS_COMMANDS_H_
