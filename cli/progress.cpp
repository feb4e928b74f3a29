#include "cli/progress.h"

#include <chrono>
#include <thread>

#include "cli/folder_status.h"
#include "cli/folders.h"
#include "cli/moving_line.h"
#include "cli/output.h"
#include "cli/problem.h"
#include "cli/system.h"
#include "common/sdk/share.h"

namespace quarry::cli {
namespace {

using std::chrono::milliseconds;

// Where nothing has changed all is done within a second, of which little is to be waited away.
constexpr milliseconds kLookEvery{100};
constexpr milliseconds kLookAtFirstEvery{20};
constexpr std::chrono::seconds kAtFirst{2};
// A daemon that died is back well within this time.
constexpr std::chrono::seconds kSilence{60};

std::shared_ptr<fileindex::Folder> Governing(const std::string& share_path) {
  auto folder = GoverningFolder(share_path);
  if (!folder) throw Problem("\"" + share_path + "\" is not indexed any longer.");
  return folder;
}

std::string Progress(const Json::Value& status) {
  return status["done"].asString() + " done, " + status["waiting"].asString() + " waiting, " +
         std::to_string(static_cast<long long>(status["rate"].asDouble() + 0.5)) + "/s  " +
         Printable(status["current"].asString());
}

void RefuseToWaitForEver(const Json::Value& status) {
  const std::string state = status["state"].asString();
  if (state == "paused") {
    throw Problem("Indexing is paused; what is not indexed yet waits until it is resumed.");
  }
  if (state == "error" || state == "invalid_path" || state == "need_reindex") {
    throw Problem("The folder " + status["path"].asString() + " " + StateInWords(status) + ".");
  }
}

}  // namespace

void WaitUntilIndexed(const std::string& share_path) {
  const MovingLine line;
  const auto begin = std::chrono::steady_clock::now();
  auto heard = begin;
  for (;;) {
    const Json::Value report = IndexDaemonReport();
    const Json::Value status = FolderStatus(*Governing(share_path), report);
    if (status["state"] == "finished") return;
    RefuseToWaitForEver(status);
    const auto now = std::chrono::steady_clock::now();
    if (!report.isNull()) heard = now;
    if (now - heard > kSilence) {
      throw Problem("The index daemon (fileindexd) does not answer; see \"quarry status\".");
    }
    line.Show(Progress(status));
    std::this_thread::sleep_for(now - begin < kAtFirst ? kLookAtFirstEvery : kLookEvery);
  }
}

std::uint64_t DocumentCount(const std::string& share) {
  const std::string id = sdk::SDKShare(share).GetDBName();
  const Json::Value status = AskEngine("engine_status", Json::Value(Json::objectValue));
  for (const Json::Value& index : status["indexes"]) {
    if (index["id"] == id) return index["documents"].asUInt64();
  }
  return 0;
}

}  // namespace quarry::cli
