#include <ctime>
#include <iostream>

#include "cli/commands/commands.h"
#include "cli/folder_status.h"
#include "cli/folders.h"
#include "cli/monitor_status.h"
#include "cli/output.h"
#include "cli/problem.h"
#include "cli/system.h"
#include "daemons/common/client.h"
#include "fileindex/config/status_mgr.h"

namespace quarry::cli {
namespace {

Json::Value Services() {
  if (!daemon::IsListening(SupervisorSocket())) return Json::Value(Json::arrayValue);
  try {
    return AskSupervisor("status", Json::Value(Json::objectValue))["services"];
  } catch (const Problem&) {
    return Json::Value(Json::arrayValue);
  }
}

Json::Value Folders(const Json::Value& report) {
  Json::Value list(Json::arrayValue);
  for (const auto& folder : AllFolders()) list.append(FolderStatus(*folder, report));
  return list;
}

Json::Value Collect() {
  Json::Value status;
  status["resume_time"] = Json::Int64{fileindex::StatusMgr().GetPauseInfo()};
  status["running"] = ServicesAreManaged();
  status["services"] = Services();
  status["monitor"] = MonitorStatus();
  const Json::Value report = IndexDaemonReport();
  status["folders"] = Folders(report);
  status["set_aside"] = WorkSetAside(report);
  status["unusable_indexes"] = UnusableIndexes();
  return status;
}

void PrintPause(std::int64_t resume_time) {
  if (resume_time == 0) {
    std::cout << "Indexing is paused.\n";
  } else if (resume_time > std::time(nullptr)) {
    std::cout << "Indexing is paused until " << HumanTime(resume_time) << ".\n";
  }
}

void PrintServices(const Json::Value& status) {
  if (!status["running"].asBool()) {
    std::cout << WhyNotManaged() << '\n';
  }
  for (const Json::Value& service : status["services"]) {
    if (service["state"] != "restarting" && service["restarts"].asUInt() == 0) continue;
    std::cout << service["name"].asString() << " is " << service["state"].asString()
              << ", started again " << service["restarts"].asUInt()
              << " times (last: " << Printable(service["last_end"].asString()) << ")\n";
  }
}

std::string Rate(const Json::Value& folder) {
  const double rate = folder["rate"].asDouble();
  return rate > 0 ? std::to_string(static_cast<long long>(rate + 0.5)) + "/s" : "-";
}

void PrintSetAside(const Json::Value& list) {
  if (list.empty()) return;
  std::cout << "\nSet aside, since it failed again and again (tried again once an hour, or by: "
               "quarry folder reindex FOLDER):\n";
  for (const Json::Value& work : list) {
    std::cout << "  " << Printable(work["path"].asString()) << ": "
              << Printable(work["error"].asString()) << "\n";
  }
}

void PrintUnusable(const Json::Value& list) {
  for (const Json::Value& index : list) {
    std::cout << "\nThe index of the share " << Printable(index["share"].asString())
              << " cannot be used (" << Printable(index["problem"].asString())
              << "). Mend it with: quarry doctor\n";
  }
}

void Print(const Json::Value& status) {
  PrintServices(status);
  if (status["running"].asBool() || status["monitor"]["running"].asBool()) {
    PrintMonitor(std::cout, status["monitor"]);
  }
  PrintPause(status["resume_time"].asInt64());
  if (status["folders"].empty()) {
    std::cout << "No folder is indexed.\n";
    return;
  }
  std::vector<std::vector<std::string>> rows{
      {"FOLDER", "WAITING", "DONE", "FAILED", "RATE", "STATE"}};
  for (const Json::Value& folder : status["folders"]) {
    rows.push_back({Printable(folder["path"].asString()), folder["waiting"].asString(),
                    folder["done"].asString(), folder["failed"].asString(), Rate(folder),
                    Printable(StateInWords(folder))});
  }
  PrintTable(std::cout, rows);
  PrintUnusable(status["unusable_indexes"]);
  PrintSetAside(status["set_aside"]);
}

}  // namespace

void AddStatusCommand(CLI::App& app) {
  CLI::App* command =
      app.add_subcommand("status", "Show per folder what is indexed, what waits, and how fast");
  const bool& json = JsonOption(*command);
  Examples(*command, "  quarry status\n  quarry status --json");
  command->callback([&json] {
    const Json::Value status = Collect();
    if (json) {
      PrintJson(std::cout, status);
    } else {
      Print(status);
    }
  });
}

}  // namespace quarry::cli
