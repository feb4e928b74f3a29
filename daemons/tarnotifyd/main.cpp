// tarnotifyd: writes changes of the file system into the queues that are registered for them.

#include <CLI/CLI.hpp>
#include <exception>
#include <map>
#include <string>

#include "daemons/common/command_line.h"
#include "daemons/common/log.h"
#include "daemons/common/single_instance.h"
#include "daemons/common/status_file.h"
#include "daemons/common/stop_signal.h"
#include "daemons/tarnotifyd/make_change_source.h"
#include "daemons/tarnotifyd/monitor.h"

namespace {

using namespace quarry;

constexpr char kName[] = "tarnotifyd";

constexpr char kExamples[] =
    "Examples:\n"
    "  tarnotifyd                                 the system's own daemon\n"
    "  QUARRY_ROOT=$HOME/quarry tarnotifyd        a private system's\n"
    "  tarnotifyd --source inotify                without the rights that fanotify needs\n"
    "\n"
    "The daemon stays in the foreground until it gets SIGTERM or SIGINT, and logs to the system "
    "log\n"
    "and to stderr. It follows what is registered in var/lib/quarry/monitor.\n"
    "\n"
    "Exit status: 0 after a signal, 1 when it cannot start (it runs already, for instance).";

void Serve(notify::SourceKind kind) {
  daemon::StopSignal stop;
  const daemon::SingleInstance single(kName);
  notify::Monitor monitor(notify::MakeChangeSource(kind));
  daemon::StatusFile status(kName);
  monitor.WakeOn(stop.Fd());
  monitor.ReportTo([&](const Json::Value& report) { status.Write(report); });
  daemon::LogInfo("Started");
  while (!stop.Requested()) monitor.Step(-1);
  monitor.Finish();
  daemon::LogInfo("Stopped");
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app("Writes changes of the file system into the queues that are registered for them.",
               kName);
  app.footer(kExamples);
  const std::map<std::string, notify::SourceKind> kinds{
      {"auto", notify::SourceKind::kAuto},
      {"inotify", notify::SourceKind::kInotify},
      {"fanotify", notify::SourceKind::kFanotify}};
  std::string source = "auto";
  app.add_option("--source", source,
                 "Where changes come from: \"fanotify\" needs the rights of root, \"inotify\" a\n"
                 "watch for each directory; \"auto\" takes fanotify where it can")
      ->check(CLI::IsMember({"auto", "inotify", "fanotify"}))
      ->capture_default_str();
  if (const auto status = daemon::ParseCommandLine(&app, argc, argv)) return *status;
  daemon::OpenLog(kName, true);
  try {
    Serve(kinds.at(source));
  } catch (const std::exception& error) {
    daemon::LogError(std::string("Cannot run: ") + error.what());
    return EXIT_FAILURE;
  }
  return EXIT_SUCCESS;
}
