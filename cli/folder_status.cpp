#include "cli/folder_status.h"

#include "cli/problem.h"
#include "cli/share_plan.h"
#include "cli/system.h"
#include "common/json.h"
#include "daemons/common/client.h"
#include "fileindex/config/folder_mgr.h"

namespace quarry::cli {
namespace {

// The daemon's numbers for the folder, zero where it has none.
Json::Value Numbers(const std::string& path, const Json::Value& report) {
  Json::Value numbers(Json::objectValue);
  for (const char* key : {"waiting", "done", "failed"}) numbers[key] = 0;
  numbers["rate"] = 0.0;
  for (const char* key : {"state", "current", "last_error"}) numbers[key] = "";
  for (const Json::Value& share : report["shares"]) {
    for (const Json::Value& folder : share["folders"]) {
      if (folder["path"] == path) JsonApplyChanges(numbers, folder);
    }
  }
  return numbers;
}

// A move that was cut short goes before everything else: nothing happens until it is ended.
void RequireNoMove(const fileindex::Folder& folder) {
  const std::string move = UnfinishedMove(platform::ReadShares(), folder.GetShare());
  if (!move.empty()) throw Problem("its share is being moved; end that with: " + move);
}

std::string State(const fileindex::Folder& folder, const std::string& daemon_state) {
  RequireNoMove(folder);
  if (folder.IsPaused()) return "paused";
  Json::Value status;
  folder.GetStatus(status);
  const std::string text = status["text"].asString();
  if (text == "error") return status["desc"].asString();
  // While work is queued the daemon knows better what becomes of it.
  return text == "processing" && daemon_state == "retrying" ? daemon_state : text;
}

}  // namespace

Json::Value IndexDaemonReport() {
  if (!daemon::IsListening(IndexDaemonSocket())) return {};
  try {
    return AskIndexDaemon("status", Json::Value());
  } catch (const Problem&) {
    return {};  // it stopped in between, or is being started again
  }
}

Json::Value FolderStatus(const fileindex::Folder& folder, const Json::Value& report) {
  Json::Value status = Numbers(folder.GetPath(), report);
  status["path"] = folder.GetPath();
  try {
    status["state"] = State(folder, status["state"].asString());
  } catch (const Problem& problem) {
    status["state"] = "error";
    status["last_error"] = problem.what();
  } catch (const Error& error) {
    status["state"] = "error";
    status["last_error"] = Explain(error);
  }
  return status;
}

Json::Value WorkSetAside(const Json::Value& report) {
  Json::Value list(Json::arrayValue);
  for (const Json::Value& share : report["shares"]) {
    for (Json::Value work : share["set_aside"]) {
      work["share"] = share["share"];
      list.append(work);
    }
  }
  return list;
}

Json::Value UnusableIndexes() {
  Json::Value list(Json::arrayValue);
  if (!daemon::IsListening(EngineSocket())) return list;
  try {
    const Json::Value status = AskEngine("engine_status", Json::Value(Json::objectValue));
    for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) {
      for (const Json::Value& index : status["indexes"]) {
        if (index["id"] != "fileindex_" + share || !index.isMember("problem")) continue;
        Json::Value entry;
        entry["share"] = share;
        entry["problem"] = index["problem"];
        list.append(entry);
      }
    }
  } catch (const Problem&) {
    // It stopped in between.
  }
  return list;
}

std::string StateInWords(const Json::Value& status) {
  const std::string state = status["state"].asString();
  const std::string error = status["last_error"].asString();
  const std::string path = status["path"].asString();
  if (state == "invalid_path")
    return "cannot be indexed any longer (moved, unmounted or read-only)";
  if (state == "need_reindex") return "needs a reindex: quarry folder reindex " + path;
  if (state == "finished") return "up to date";
  if (state == "processing") return "indexing";
  if (state == "retrying") return "will try again: " + error;
  return state == "error" ? "error: " + error : state;
}

}  // namespace quarry::cli
