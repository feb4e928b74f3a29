// tarnelasticd: the search engine's process.

#include <sqlite3.h>

#include <CLI/CLI.hpp>
#include <condition_variable>
#include <cstdint>
#include <cstdlib>
#include <mutex>
#include <string>
#include <thread>

#include "common/error.h"
#include "common/paths.h"
#include "daemons/common/command_line.h"
#include "daemons/common/heap.h"
#include "daemons/common/log.h"
#include "daemons/common/open_files.h"
#include "daemons/common/single_instance.h"
#include "daemons/common/socket_server.h"
#include "daemons/common/stop_signal.h"
#include "daemons/tarnelasticd/engine.h"

namespace quarry::engine {
namespace {

constexpr const char* kName = "tarnelasticd";
constexpr int kStepMs = 1000;
constexpr int kFinishMs = 10000;

constexpr const char* kHelp =
    "The search engine: keeps the indexes of all shares and answers requests on a local socket.\n"
    "Runs in the foreground until SIGTERM or SIGINT.";

constexpr const char* kExamples =
    "Files, below $QUARRY_ROOT where that is set:\n"
    "  /var/run/tarnelasticd.sock            requests (docs/engine-protocol.md)\n"
    "  /var/run/tarnelasticd.pid             locked while it runs\n"
    "  /var/lib/quarry/engine/indexes.json   the list of indexes\n"
    "\n"
    "Examples:\n"
    "  tarnelasticd\n"
    "  QUARRY_ROOT=$HOME/.local/state/quarry tarnelasticd --threads 8\n"
    "  tarnelasticd --quiet --memory 256\n"
    "\n"
    "\"quarry run\" starts it together with the other daemons.";

struct Settings {
  std::size_t threads = 4;
  std::size_t memory_mib = 512;
  bool quiet = false;
};

// Commits old work in the background, away from the thread that serves the socket: it waits for the
// disk.
class Ticker {
 public:
  explicit Ticker(Engine* engine) : thread_([this, engine] { Run(engine); }) {}
  ~Ticker() {
    {
      const std::lock_guard<std::mutex> lock(mutex_);
      stopping_ = true;
    }
    changed_.notify_one();
    thread_.join();
  }
  Ticker(const Ticker&) = delete;
  Ticker& operator=(const Ticker&) = delete;

 private:
  void Run(Engine* engine) {
    std::unique_lock<std::mutex> lock(mutex_);
    while (!changed_.wait_for(lock, std::chrono::seconds(1), [this] { return stopping_; })) {
      lock.unlock();
      engine->Tick();
      lock.lock();
    }
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  bool stopping_ = false;
  std::thread thread_;
};

// The database's caches shrink beyond half of what all may take, and allocations fail beyond all.
void BoundMemory(std::size_t bytes) {
  sqlite3_soft_heap_limit64(static_cast<sqlite3_int64>(bytes / 2));
  sqlite3_hard_heap_limit64(static_cast<sqlite3_int64>(bytes));
}

void Serve(const Settings& settings) {
  daemon::StopSignal stop;
  const daemon::SingleInstance instance(kName);
  const std::size_t memory = settings.memory_mib << 20;
  BoundMemory(memory);
  // Each index keeps a handful of files open, and there is one per share.
  daemon::AllowManyFiles();
  EngineOptions options;
  options.registry_path = RootedPath("/var/lib/quarry/engine/indexes.json");
  options.memory_bytes = memory;
  Engine engine(options);
  daemon::SocketServerOptions server_options;
  server_options.workers = settings.threads;
  daemon::SocketServer server(
      RootedPath("/var/run/tarnelasticd.sock"),
      [&engine](std::string request, const daemon::Peer&) {
        return engine.HandleText(std::move(request));
      },
      server_options);
  server.WakeOn(stop.Fd());
  const Ticker ticker(&engine);
  daemon::LogInfo("ready");
  while (!stop.Requested()) server.Step(kStepMs);
  server.Finish(kFinishMs);
  daemon::LogInfo("stopping");
}

int Main(int argc, char** argv) {
  Settings settings;
  CLI::App app(kHelp, kName);
  app.footer(kExamples);
  app.add_option("--threads", settings.threads, "Requests that are worked on at once")
      ->check(CLI::Range(1, 64))
      ->capture_default_str();
  app.add_option("--memory", settings.memory_mib, "What all may take together, in MiB")
      ->check(CLI::Range(64, 65536))
      ->capture_default_str();
  app.add_flag("--quiet", settings.quiet, "Log to the system log only");
  if (const auto status = daemon::ParseCommandLine(&app, argc, argv)) return *status;
  daemon::OpenLog(kName, !settings.quiet);
  daemon::KeepHeapSmall();
  try {
    Serve(settings);
    return EXIT_SUCCESS;
  } catch (const Error& error) {
    daemon::LogError(error.reason());
  } catch (const std::exception& failure) {
    daemon::LogError(failure.what());
  }
  return EXIT_FAILURE;
}

}  // namespace
}  // namespace quarry::engine

int main(int argc, char** argv) {
  return quarry::engine::Main(argc, argv);
}
