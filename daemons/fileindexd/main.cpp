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
    "  fileindexd --threads 8                     for a machine with fast disks\n"
    "\n"
    "The daemon stays in the foreground until it gets SIGTERM or SIGINT, and logs to the system "
    "log\n"
    "and to stderr. It expects tarnelasticd and tarncontentextractd to run; while one of them "
    "does\n"
    "not, work waits and nothing is lost.\n"
    "\n"
    "Exit status: 0 after a signal, 1 when it cannot start (it runs already, for instance).";

void Serve(std::size_t threads) {
  daemon::StopSignal stop;
  const daemon::SingleInstance single(kName);
  fileindexd::IndexDaemon daemon(threads);
  daemon.WakeOn(stop.Fd());
  daemon::LogInfo("Started");
  while (!stop.Requested()) daemon.Step(kStepMs);
  if (daemon.Stop(kStopTime)) {
    daemon::LogInfo("Stopped");
    return;
  }
  // A worker may be asleep for a quarter of an hour until the engine is less busy. Everything that
  // it has not finished is in its snapshot, which the next start begins with.
  daemon::LogInfo("Stopped in the middle of a pass, which the next start will do again");
  _exit(EXIT_SUCCESS);
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app("Keeps the search indexes of all indexed shares up to date.", kName);
  app.footer(kExamples);
  std::size_t threads = std::max(1U, std::thread::hardware_concurrency());
  app.add_option("--threads", threads, "Documents in work at a time (default: the machine's cores)")
      ->check(CLI::Range(1, 64));
  CLI11_PARSE(app, argc, argv);
  daemon::OpenLog(kName, true);
  try {
    Serve(threads);
  } catch (const std::exception& error) {
    daemon::LogError(std::string("Cannot run: ") + error.what());
    return EXIT_FAILURE;
  }
  return EXIT_SUCCESS;
}
