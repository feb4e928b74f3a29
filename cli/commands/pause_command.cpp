#include <ctime>
#include <iostream>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/output.h"
#include "cli/system.h"
#include "common/error.h"
#include "daemons/common/client.h"
#include "fileindex/config/status_mgr.h"

namespace quarry::cli {
namespace {

constexpr int kHoursMax = 8760;  // a year

// The state is saved before the index daemon is told. One that does not run, as while nothing is
// indexed, takes it up when it starts.
template <typename Change>
void ChangeStatus(Change change) {
  try {
    change();
  } catch (const Error& error) {
    if (error.code() != kErrorSystem || daemon::IsListening(IndexDaemonSocket())) throw;
  }
}

void Report(const std::string& sentence, bool json) {
  Json::Value result;
  result["resume_time"] = Json::Int64{fileindex::StatusMgr().GetPauseInfo()};
  PrintDone(json, sentence, result);
}

void Pause(int hours, bool json) {
  ChangeStatus([hours] { fileindex::StatusMgr().Pause(hours); });
  if (hours == 0) {
    Report("Indexing is paused until: quarry resume", json);
  } else {
    Report("Indexing is paused until " + HumanTime(fileindex::StatusMgr().GetPauseInfo()) + ".",
           json);
  }
}

void Resume(bool json) {
  ChangeStatus([] { fileindex::StatusMgr().Resume(); });
  Report("Indexing goes on.", json);
}

}  // namespace

void AddPauseCommands(CLI::App& app) {
  CLI::App* pause =
      app.add_subcommand("pause", "Stop all indexing, for some hours or until resume");
  auto hours = std::make_shared<int>(0);
  pause->add_option("HOURS", *hours, "For so many hours; without it until resumed")
      ->check(CLI::Range(1, kHoursMax));
  const bool& pause_json = JsonOption(*pause);
  Examples(*pause, "  quarry pause 8      until tomorrow morning\n  quarry pause");
  pause->callback([hours, &pause_json] { Pause(*hours, pause_json); });

  CLI::App* resume = app.add_subcommand("resume", "Let the indexing go on");
  const bool& resume_json = JsonOption(*resume);
  Examples(*resume, "  quarry resume");
  resume->callback([&resume_json] { Resume(resume_json); });
}

}  // namespace quarry::cli
