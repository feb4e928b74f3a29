#include "daemons/fileindexd/index_daemon.h"

#include <ctime>
#include <functional>
#include <utility>

#include "common/error.h"
#include "common/paths.h"
#include "daemons/common/log.h"
#include "daemons/fileindexd/elastic_index.h"
#include "daemons/fileindexd/failure.h"
#include "daemons/fileindexd/stray_queues.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"

namespace quarry::fileindexd {
namespace {

constexpr int kLastAnswersMs = 100;
constexpr std::chrono::minutes kSweepEvery{1};

daemon::SocketServerOptions ServerOptions() {
  daemon::SocketServerOptions options;
  options.max_request_bytes = std::size_t{1} << 20;
  options.max_buffered_bytes = std::size_t{64} << 20;
  return options;
}

// Loading a state file fails as long as somebody has made nonsense of it: what was known before
// goes on until the file changes again.
void Guarded(const char* what, const std::function<void()>& load) {
  try {
    load();
  } catch (const Error& error) {
    daemon::LogError(std::string("Cannot load the ") + what + ": " + Describe(error));
  }
}

}  // namespace

const std::string& CommandSocketPath() {
  static const std::string path = RootedPath("/var/run/fileindexd.sock");
  return path;
}

IndexDaemon::IndexDaemon(std::size_t threads, bool full_speed)
    : threads_(threads),
      full_speed_(full_speed),
      slots_(threads),
      folders_watch_(fileindex::kFileIndexFoldersCfgPath),
      status_watch_(fileindex::kFileIndexStatusCfgPath),
      workers_([this](const std::string& share) { return MakeWorker(share); }),
      server_(std::make_unique<daemon::SocketServer>(
          CommandSocketPath(),
          [this](const std::string& request, const daemon::Peer& peer) {
            return HandleCommand(*this, request, peer.pid);
          },
          ServerOptions())) {}

std::unique_ptr<Worker> IndexDaemon::MakeWorker(const std::string& share) {
  WorkerParts parts;
  parts.host = MakeShareHost(share);
  parts.index = std::make_unique<ElasticIndex>(share, *parts.gate);
  parts.files = std::make_unique<PosixFileSystem>();
  parts.slots = &slots_;
  parts.threads = threads_;
  parts.full_speed = full_speed_;
  return std::make_unique<Worker>(share, std::move(parts));
}

void IndexDaemon::Step(int timeout_ms) {
  FollowStatus();
  FollowFolders();
  workers_.Tend();
  SweepQueues();
  server_->Step(timeout_ms);
}

void IndexDaemon::FollowFolders() {
  if (!folders_watch_.HasChanged()) return;
  Guarded("folder list", [this] { workers_.SetShares(LoadIndexedShares()); });
  workers_.Reload();
}

void IndexDaemon::FollowStatus() {
  if (status_watch_.HasChanged()) {
    Guarded("status", [this] { pause_.Set(LoadResumeTime()); });
    workers_.CheckStatus();
  }
  ApplyPause();
}

// Also called when nothing has changed: a pause for some hours ends by itself.
void IndexDaemon::ApplyPause() {
  const bool paused = pause_.IsPaused(std::time(nullptr));
  if (paused == paused_) return;
  paused_ = paused;
  daemon::LogInfo(paused ? "Indexing is paused" : "Indexing goes on");
  workers_.SetPaused(paused);
}

// Now and then is enough: what is queued for such shares is little, but never worked off.
void IndexDaemon::SweepQueues() {
  const auto now = std::chrono::steady_clock::now();
  if (now < next_sweep_) return;
  next_sweep_ = now + kSweepEvery;
  Guarded("folder list", RemoveStrayQueues);
}

void IndexDaemon::SettingChanged(const std::string& share, bool is_upsert) {
  Guarded("folder list", [this] { workers_.SetShares(LoadIndexedShares()); });
  if (is_upsert) workers_.Allow(share);
  workers_.Reload();
}

void IndexDaemon::Pause(long long resume_time) {
  pause_.Set(resume_time);
  ApplyPause();
}

void IndexDaemon::Resume() {
  pause_.Set(-1);
  ApplyPause();
  workers_.Reload();
}

void IndexDaemon::CreateWorker(const std::string& share) {
  Guarded("folder list", [this] { workers_.SetShares(LoadIndexedShares()); });
  workers_.Allow(share);
  workers_.Reload();
}

void IndexDaemon::DeleteWorker(const std::string& share, pid_t while_running) {
  Guarded("folder list", [this] { workers_.SetShares(LoadIndexedShares()); });
  workers_.Delete(share, while_running);
}

Json::Value IndexDaemon::Status() const {
  Json::Value status;
  status["paused"] = paused_;
  status["resume_time"] = Json::Int64(pause_.ResumeTime());
  status["shares"] = workers_.Report();
  return status;
}

bool IndexDaemon::Stop(std::chrono::milliseconds time) {
  server_->Finish(kLastAnswersMs);
  server_.reset();
  return workers_.StopAll(time);
}

}  // namespace quarry::fileindexd
