// fileindexd: keeps the search indexes of all indexed shares up to date.

#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <chrono>
#include <cstddef>
#include <exception>
#include <iostream>
#include <string>
#include <thread>

#include "daemons/common/command_line.h"
#include "daemons/common/heap.h"
#include "daemons/common/log.h"
#include "daemons/common/single_instance.h"
#include "daemons/common/stop_signal.h"
#include "daemons/fileindexd/index_daemon.h"

namespace {

using namespace quarry;

constexpr char kName[] = "fileindexd";
constexpr int kStepMs = 200;
constexpr std::chrono::milliseconds kStopTime(700);

constexpr char kExamples[] =
    "Examples:\n"
    "  fileindexd                                 the system's own daemon\n"
    "  QUARRY_ROOT=$HOME/quarry fileindexd        a private system's\n"
    "  fileindexd --threads 8 --full-speed        for a machine that does nothing else\n"
    "\n"
    "The daemon stays in the foreground until it gets SIGTERM or SIGINT, and logs to the system "
    "log\n"
    "and to stderr. It expects tarnelasticd and tarncontentextractd to run; while one of them "
    "does\n"
    "not, work waits and nothing is lost.\n"
    "\n"
    "Exit status: 0 after a signal, 1 when it cannot start (it runs already, for instance).";

void Serve(std::size_t threads, bool full_speed) {
  daemon::StopSignal stop;
  const daemon::SingleInstance single(kName);
  fileindexd::IndexDaemon daemon(threads, full_speed);
  daemon.WakeOn(stop.Fd());
  daemon::LogInfo("Started");
  while (!stop.Requested()) daemon.Step(kStepMs);
  if (daemon.Stop(kStopTime)) {
    daemon::LogInfo("Stopped");
    return;
  }
  // A worker may wait for an answer of the engine. Everything that it has not finished is in its
  // snapshot, which the next start begins with.
  daemon::LogInfo("Stopped in the middle of a pass, which the next start will do again");
  _exit(EXIT_SUCCESS);
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app("Keeps the search indexes of all indexed shares up to date.", kName);
  app.footer(kExamples);
  // While one half is read, the other half is stored.
  std::size_t threads = std::clamp(2 * std::thread::hardware_concurrency(), 2U, 64U);
  app.add_option("--threads", threads,
                 "Documents in work at a time (default: twice the machine's cores)")
      ->check(CLI::Range(1, 64));
  bool full_speed = false;
  app.add_flag("--full-speed", full_speed,
               "Do not leave the processors and disks to others (default: nice 10, idle I/O)");
  if (const auto status = daemon::ParseCommandLine(&app, argc, argv)) return *status;
  daemon::OpenLog(kName, true);
  daemon::KeepHeapSmall();
  try {
    Serve(threads, full_speed);
  } catch (const std::exception& error) {
    daemon::LogError(std::string("Cannot run: ") + error.what());
    return EXIT_FAILURE;
  }
  return EXIT_SUCCESS;
}
