#include <syslog.h>

#include <exception>
#include <iostream>
#include <string>
#include <vector>

#include "cli/commands/commands.h"
#include "cli/layout.h"
#include "cli/output.h"
#include "cli/problem.h"
#include "common/error.h"

namespace {

using quarry::cli::kExitFailed;
using quarry::cli::kExitUsage;

bool WantsJson(int argc, char** argv) {
  for (int i = 1; i < argc; ++i) {
    const std::string word = argv[i];
    if (word == "--") return false;
    if (word == "--json") return true;
  }
  return false;
}

int Fail(bool json, int code, const std::string& reason, const std::string& sentence) {
  if (json) {
    Json::Value report;
    report["error"]["code"] = code;
    report["error"]["reason"] = reason;
    quarry::cli::PrintJson(std::cout, report);
  }
  std::cerr << "quarry: " << quarry::cli::Printable(sentence) << '\n';
  return kExitFailed;
}

// Prints help, or what is wrong with the command line.
int Exit(const CLI::App& app, const CLI::ParseError& error) {
  return app.exit(error) == 0 ? quarry::cli::kExitDone : kExitUsage;
}

int Run(CLI::App& app, int argc, char** argv) {
  const bool json = WantsJson(argc, argv);
  try {
    quarry::cli::CheckRoot();
    app.parse(argc, argv);
    return quarry::cli::kExitDone;
  } catch (const CLI::RequiredError& error) {
    // Where a word is no command's name, that says more than that a command is missing.
    const std::vector<std::string> unknown = app.remaining(true);
    return unknown.empty() ? Exit(app, error) : Exit(app, CLI::ExtrasError({unknown.front()}));
  } catch (const CLI::ParseError& error) {
    return Exit(app, error);
  } catch (const quarry::cli::Unwell&) {
    return kExitFailed;
  } catch (const quarry::Error& error) {
    return Fail(json, error.code(), error.reason(), quarry::cli::Explain(error));
  } catch (const quarry::cli::Problem& problem) {
    return Fail(json, 0, problem.what(), problem.what());
  } catch (const std::exception& error) {
    return Fail(json, 0, error.what(), error.what());
  }
}

}  // namespace

int main(int argc, char** argv) {
  openlog("quarry", LOG_PID, LOG_USER);
  // The library's debug lines are for daemons.
  quarry::fileindex::log_level = LOG_ERR;

  CLI::App app("Quarry: search for the files of this machine", "quarry");
  app.require_subcommand(1);
  app.set_version_flag("--version", QUARRY_VERSION);
  quarry::cli::Examples(app,
                        "  quarry run                       start the system\n"
                        "  quarry share add ~/Music         then index it:\n"
                        "  quarry folder add /Music\n"
                        "  quarry search 'live type:audio'\n"
                        "State lies below QUARRY_ROOT where it is set; the exit code is 0 when all "
                        "is well,\n1 when something failed, 2 when the command line was wrong.");
  quarry::cli::AddRunCommand(app);
  quarry::cli::AddIndexCommand(app);
  quarry::cli::AddShareCommand(app);
  quarry::cli::AddFolderCommand(app);
  quarry::cli::AddSearchCommand(app);
  quarry::cli::AddStatusCommand(app);
  quarry::cli::AddQueueCommand(app);
  quarry::cli::AddDoctorCommand(app);
  quarry::cli::AddPauseCommands(app);
  quarry::cli::AddVolumeCommand(app);
  quarry::cli::AddHomeCommand(app);
  quarry::cli::AddUserCommand(app);
  quarry::cli::AddSuggestCommand(app);
  quarry::cli::AddCompletionCommand(app);
  return Run(app, argc, argv);
}
