#include "daemons/fileindexd/worker_table.h"

#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "daemons/common/system_error.h"

namespace quarry::fileindexd {
namespace {

constexpr std::chrono::milliseconds kLook(10);

Json::Value WithoutWorker(const std::string& share, const char* state) {
  Json::Value report;
  report["share"] = share;
  report["state"] = state;
  for (const char* count : {"waiting", "done", "failed"}) report[count] = 0;
  report["rate"] = 0.0;
  report["path"] = "";
  report["last_error"] = "";
  report["folders"] = Json::Value(Json::arrayValue);
  report["set_aside"] = Json::Value(Json::arrayValue);
  return report;
}

// A descriptor that becomes readable at the process's end; invalid where the kernel has none.
UniqueFd Watch(pid_t process) {
  return UniqueFd(static_cast<int>(syscall(SYS_pidfd_open, process, 0)));
}

bool IsShortage(int error) {
  return error == EMFILE || error == ENFILE || error == ENOMEM;
}

bool HasEnded(const UniqueFd& process) {
  pollfd poller{process.get(), POLLIN, 0};
  return process.valid() && poll(&poller, 1, 0) > 0;
}

}  // namespace

WorkerTable::~WorkerTable() {
  for (auto& [share, running] : workers_) running->worker->Stop();
  for (auto* all : {&workers_, &leaving_}) {
    for (auto& [share, running] : *all) running->thread.join();
  }
}

void WorkerTable::SetShares(const std::set<std::string>& shares) {
  shares_ = shares;
  std::set<std::string> gone;
  for (const auto& [share, running] : workers_) {
    if (shares_.count(share) == 0) gone.insert(share);
  }
  for (const std::string& share : gone) Retire(share);
  std::erase_if(deleted_, [&](const auto& entry) { return shares_.count(entry.first) == 0; });
  Tend();
}

void WorkerTable::Delete(const std::string& share, pid_t while_running) {
  if (shares_.count(share) == 0) return;
  UniqueFd process;
  if (while_running > 0) {
    process = Watch(while_running);
    if (!process.valid() && errno == ESRCH) return;
    if (!process.valid() && IsShortage(errno)) {
      daemon::ThrowSystemError("A process cannot be watched");
    }
  }
  deleted_[share] = std::move(process);
  Retire(share);
}

void WorkerTable::Allow(const std::string& share) {
  deleted_.erase(share);
  Tend();
}

void WorkerTable::SetPaused(bool paused) {
  paused_ = paused;
  for (auto& [share, running] : workers_) running->worker->SetPaused(paused);
}

void WorkerTable::Reload() {
  for (auto& [share, running] : workers_) running->worker->Reload();
}

void WorkerTable::CheckStatus() {
  for (auto& [share, running] : workers_) running->worker->CheckStatus();
}

void WorkerTable::Retire(const std::string& share) {
  const auto found = workers_.find(share);
  if (found == workers_.end()) return;
  found->second->worker->Stop();
  leaving_[share] = std::move(found->second);
  workers_.erase(found);
}

void WorkerTable::Start(const std::string& share) {
  auto running = std::make_unique<Running>();
  running->worker = factory_(share);
  running->worker->SetPaused(paused_);
  Running* const self = running.get();
  running->thread = std::thread([self] {
    self->worker->Run();
    self->ended = true;
  });
  workers_[share] = std::move(running);
}

void WorkerTable::Tend() {
  std::erase_if(deleted_, [](const auto& entry) { return HasEnded(entry.second); });
  for (auto it = leaving_.begin(); it != leaving_.end();) {
    if (it->second->ended) {
      it->second->thread.join();
      it = leaving_.erase(it);
    } else {
      ++it;
    }
  }
  for (const std::string& share : shares_) {
    const bool taken = workers_.count(share) + leaving_.count(share) + deleted_.count(share) > 0;
    if (!taken) Start(share);
  }
}

Json::Value WorkerTable::Report() const {
  std::map<std::string, Json::Value> reports;
  for (const auto& [share, process] : deleted_) {
    if (shares_.count(share) > 0) reports[share] = WithoutWorker(share, "stopped");
  }
  for (const auto& [share, running] : leaving_) reports[share] = WithoutWorker(share, "stopping");
  for (const auto& [share, running] : workers_) reports[share] = running->worker->Report();
  Json::Value all(Json::arrayValue);
  for (auto& [share, report] : reports) all.append(report);
  return all;
}

bool WorkerTable::StopAll(std::chrono::milliseconds time) {
  const auto end = std::chrono::steady_clock::now() + time;
  SetShares({});
  while (!leaving_.empty() && std::chrono::steady_clock::now() < end) {
    std::this_thread::sleep_for(kLook);
    Tend();
  }
  return leaving_.empty();
}

}  // namespace quarry::fileindexd
