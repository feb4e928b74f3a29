#include "cli/worker_break.h"

#include <json/json.h>

#include <chrono>
#include <exception>
#include <thread>

#include "cli/problem.h"
#include "cli/system.h"
#include "daemons/common/client.h"

namespace quarry::cli {
namespace {

constexpr std::chrono::seconds kPatience{60};
constexpr std::chrono::milliseconds kLookEvery{20};

Json::Value ShareData(const std::string& share) {
  Json::Value data;
  data["share_name"] = share;
  return data;
}

// Whether the daemon works on the share, by its own report.
bool HasWorker(const std::string& share) {
  const Json::Value report = AskIndexDaemon("status", Json::Value());
  for (const Json::Value& entry : report["shares"]) {
    if (entry["share"] == share) return entry["state"] != "stopped";
  }
  return false;
}

void TellToGoOn(const std::string& share) noexcept {
  try {
    if (daemon::IsListening(IndexDaemonSocket())) {
      AskIndexDaemon("worker_create", ShareData(share));
    }
  } catch (const std::exception&) {
    // A daemon that is started anew begins with all workers.
  }
}

}  // namespace

WorkerBreak::WorkerBreak(const std::string& share) : share_(share) {
  Json::Value data = ShareData(share_);
  // Nobody else would tell the daemon to go on if this process were killed.
  data["while_running"] = true;
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (daemon::IsListening(IndexDaemonSocket())) {
    AskIndexDaemon("worker_delete", data);
    if (!HasWorker(share_)) return;
    if (std::chrono::steady_clock::now() > deadline) {
      TellToGoOn(share_);
      throw Problem("The index daemon (fileindexd) is still busy with the share \"" + share_ +
                    "\". Try again later, or pause the indexing first: quarry pause");
    }
    std::this_thread::sleep_for(kLookEvery);
  }
}

WorkerBreak::~WorkerBreak() {
  TellToGoOn(share_);
}

}  // namespace quarry::cli
