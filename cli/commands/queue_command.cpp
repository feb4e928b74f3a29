#include <unistd.h>

#include <cerrno>
#include <iostream>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/output.h"
#include "cli/problem.h"
#include "cli/share_plan.h"
#include "common/file_util.h"
#include "common/sdk/share.h"
#include "fileindex/queue/queue_mgr.h"

namespace quarry::cli {
namespace {

const char* KindName(fileindex::FileIndexOP kind) {
  switch (kind) {
    case fileindex::OP_NONE:
      return "none";
    case fileindex::OP_DELETE:
      return "delete";
    case fileindex::OP_INDEX:
      return "index";
    case fileindex::OP_ATTR:
      return "attributes";
    case fileindex::OP_UPDATE_CFG:
      return "update configuration";
    case fileindex::OP_RENAME:
      return "rename";
    case fileindex::OP_REINDEX:
      return "reindex";
    case fileindex::OP_FULL_REINDEX:
      return "reindex share";
  }
  return "unknown";
}

Json::Value Describe(const fileindex::OP& operation, bool in_work) {
  Json::Value entry;
  entry["operation"] = KindName(operation.op);
  entry["path"] = operation.node->GetPath();
  if (!operation.src.empty()) entry["path_old"] = operation.src;
  if (!operation.data.isNull()) entry["data"] = operation.data;
  entry["in_work"] = in_work;
  return entry;
}

// A queue in a directory that may not be searched would look as if it was not there.
void RequireReadable(const std::string& directory) {
  if (access(directory.c_str(), X_OK) == 0 || errno == ENOENT) return;
  throw Problem("You may not read what waits in " + directory +
                ". Run as the user who started the system, or as root.");
}

// The operations of the snapshot that the index daemon works on, and then those of the live queue.
Json::Value Operations(const std::string& queue_path) {
  Json::Value list(Json::arrayValue);
  bool in_work = true;
  const auto take = [&](const std::shared_ptr<fileindex::OP>& operation) {
    list.append(Describe(*operation, in_work));
  };
  RequireReadable(Dirname(queue_path));
  const fileindex::QueueMgr queue(queue_path);
  if (IsFileExist(queue_path + ".tmp")) queue.GetOPTreeTmp()->ProcessOP(take);
  in_work = false;
  if (IsFileExist(queue_path)) queue.GetOPTree()->ProcessOP(take);
  return list;
}

void Show(const std::string& share, bool json) {
  RequireArrived(RequireShare(platform::ReadShares(), share));
  const Json::Value list = Operations(sdk::SDKShare(share).GetQueuePath());
  if (json) {
    PrintJson(std::cout, list);
    return;
  }
  if (list.empty()) {
    std::cout << "Nothing is waiting.\n";
    return;
  }
  std::vector<std::vector<std::string>> rows{{"OPERATION", "IN WORK", "PATH"}};
  for (const Json::Value& entry : list) {
    std::string path = Printable(entry["path"].asString());
    if (entry.isMember("path_old")) {
      path = Printable(entry["path_old"].asString()) + " -> " + path;
    }
    rows.push_back({entry["operation"].asString(), entry["in_work"].asBool() ? "yes" : "no", path});
  }
  PrintTable(std::cout, rows);
}

}  // namespace

void AddQueueCommand(CLI::App& app) {
  CLI::App* queue = app.add_subcommand("queue", "What is waiting to be done");
  queue->require_subcommand(1);
  CLI::App* show = queue->add_subcommand(
      "show", "List a share's waiting operations, coalesced, in the order in which they are done");
  auto share = std::make_shared<std::string>();
  show->add_option("SHARE", *share, "The share's name")->required();
  const bool& json = JsonOption(*show);
  Examples(*queue, "  quarry queue show Music");
  Examples(*show, "  quarry queue show Music --json");
  show->callback([share, &json] { Show(*share, json); });
}

}  // namespace quarry::cli
