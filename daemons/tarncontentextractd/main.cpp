// tarncontentextractd: turns files into documents for the index.

#include <sys/prctl.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <string_view>
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
#include "daemons/tarncontentextractd/sandbox.h"
#include "daemons/tarncontentextractd/service.h"
#include "daemons/tarncontentextractd/worker.h"

namespace {

using namespace quarry;

constexpr char kName[] = "tarncontentextractd";
constexpr char kWorkerOption[] = "--worker";
constexpr std::size_t kMaxRequestBytes = std::size_t{4} << 20;
// Of the second that stopping may take, what requests in work get to end by themselves.
constexpr int kFinishMilliseconds = 400;

int Serve(std::size_t workers) {
  // Each client has a few files open at a time, and machines with many processors many clients.
  daemon::AllowManyFiles();
  const daemon::SingleInstance instance(kName);
  daemon::StopSignal stop;
  extract::WorkerPoolOptions pool_options;
  pool_options.command = {"/proc/self/exe", kWorkerOption};
  pool_options.workers = workers;
  extract::WorkerPool pool(pool_options);
  extract::ExtractService service(pool);

  daemon::SocketServerOptions options;
  options.max_request_bytes = kMaxRequestBytes;
  // More threads than workers: attributes are not to wait behind slow contents.
  options.workers = workers * 2 + 2;
  daemon::SocketServer server(
      RootedPath("/var/run/tarncontentextractd.sock"),
      [&service](const std::string& request, const daemon::Peer&) {
        return service.Handle(request);
      },
      options);
  server.WakeOn(stop.Fd());
  if (!extract::kSandboxed) {
    daemon::LogWarning("Built with a sanitizer: workers keep their rights. Use it for tests alone");
  }
  daemon::LogInfo("Ready, with up to " + std::to_string(workers) + " workers");
  while (!stop.Requested()) server.Step(-1);
  server.Finish(kFinishMilliseconds);
  pool.Stop();
  daemon::LogInfo("Stopped");
  return 0;
}

int RunDaemon(int argc, char** argv) {
  std::size_t workers = std::max(1u, std::thread::hardware_concurrency());
  CLI::App app(
      "Reads files and directories into documents for the index: attributes of all of them, text\n"
      "and titles of plain text, source code, Markdown, HTML and XML. Content is parsed in worker\n"
      "processes without any rights. Runs in the foreground until SIGTERM.");
  app.add_option("--workers", workers, "Worker processes at most")
      ->check(CLI::Range(1, 256))
      ->capture_default_str();
  app.footer(
      "Examples:\n"
      "  tarncontentextractd                                one worker for each processor\n"
      "  tarncontentextractd --workers 1                    leave the other processors alone\n"
      "  QUARRY_ROOT=$HOME/q tarncontentextractd            in a private system\n\n"
      "The socket is $QUARRY_ROOT/var/run/tarncontentextractd.sock; docs/extractor-protocol.md\n"
      "says what may be asked there.");
  if (const auto status = daemon::ParseCommandLine(&app, argc, argv)) return *status;
  daemon::OpenLog(kName, true);
  daemon::KeepHeapSmall();
  try {
    return Serve(workers);
  } catch (const Error& error) {
    daemon::LogError(error.reason());
    return 1;
  }
}

}  // namespace

int main(int argc, char** argv) {
  if (argc == 2 && std::string_view(argv[1]) == kWorkerOption) {
    prctl(PR_SET_NAME, "tarnce-worker", 0, 0, 0);
    return extract::RunWorker(extract::StandardRegistry(), extract::kWorkerChannel);
  }
  return RunDaemon(argc, argv);
}
