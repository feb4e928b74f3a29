#include <iostream>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/folder_lock.h"
#include "cli/folders.h"
#include "cli/layout.h"
#include "cli/output.h"
#include "cli/problem.h"
#include "cli/share_plan.h"
#include "cli/shares.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder_mgr.h"
#include "platform/linux/share_move.h"

namespace quarry::cli {
namespace {

void Add(const std::string& directory, bool json) {
  EnsureLayout();
  const std::string path = ResolveDirectory(directory);
  const Place place = PlanPlace(path, KnownShares());
  if (!place.new_share) {
    throw Problem(place.share_path == path
                      ? "The share \"" + place.share + "\" is there already."
                      : "\"" + path + "\" lies in the share \"" + place.share +
                            "\" already. Index it with: quarry folder add " + place.folder);
  }
  AddShare(place);
  if (json) {
    Json::Value result;
    result["name"] = place.share;
    result["path"] = place.share_path;
    PrintJson(std::cout, result);
  } else {
    std::cout << "Added the share " << Printable(place.share)
              << ". Index it with: quarry folder add " << Printable(place.folder) << '\n';
  }
}

Json::Value Describe(const std::string& name, const fileindex::FolderMgr& folders) {
  Json::Value entry;
  entry["name"] = name;
  entry["indexed"] = folders.IsShareIndexed(name);
  try {
    const sdk::SDKShare share(name);
    entry["path"] = share.GetPath();
    entry["can_be_indexed"] = share.CanBeIndexed();
  } catch (const Error& error) {
    const std::string move = UnfinishedMove(platform::ReadShares(), name);
    entry["error"] = move.empty() ? Explain(error) : "on its way; end that with: " + move;
  }
  return entry;
}

void List(bool json) {
  const fileindex::FolderMgr folders;
  Json::Value list(Json::arrayValue);
  for (const std::string& name : sdk::SDKShare::Enum()) list.append(Describe(name, folders));
  if (json) {
    PrintJson(std::cout, list);
    return;
  }
  if (list.empty()) {
    std::cout << "There are no shares. Add one with: quarry share add DIRECTORY\n";
    return;
  }
  std::vector<std::vector<std::string>> rows{{"SHARE", "INDEXED", "PATH"}};
  for (const Json::Value& entry : list) {
    const std::string place =
        entry.isMember("error") ? entry["error"].asString() : entry["path"].asString();
    rows.push_back({Printable(entry["name"].asString()), entry["indexed"].asBool() ? "yes" : "no",
                    Printable(place)});
  }
  PrintTable(std::cout, rows);
}

// What still needs the share is named, not taken away with it.
void Remove(const std::string& name, bool json) {
  const FolderLock lock;
  const auto shares = platform::ReadShares();
  const platform::ShareRecord& share = RequireShare(shares, name);
  RequireArrived(share);
  std::string paths;
  for (const auto& folder : AllFolders()) {
    if (folder->GetShare() == name) paths += " " + folder->GetPath();
  }
  if (!paths.empty()) {
    throw Problem("The share \"" + name +
                  "\" is indexed. Delete its folders first: " + "quarry folder delete" + paths);
  }
  platform::RemoveShare(name);
  platform::RemoveQueue(share.path);
  Json::Value result;
  result["name"] = name;
  result["path"] = share.path;
  PrintDone(json, "Removed the share " + name + "; its files stay at " + share.path + ".", result);
}

}  // namespace

void AddShareCommand(CLI::App& app) {
  CLI::App* share =
      app.add_subcommand("share", "Shares: directories that can hold indexed folders");
  share->require_subcommand(1);
  Examples(*share, "  quarry share add ~/Music\n  quarry share list --json");

  CLI::App* add = share->add_subcommand("add", "Make a directory known as a share of its name");
  auto directory = std::make_shared<std::string>();
  add->add_option("DIRECTORY", *directory, "The directory")->required();
  const bool& add_json = JsonOption(*add);
  Examples(*add, "  quarry share add /srv/photo      adds the share \"photo\"");
  add->callback([directory, &add_json] { Add(*directory, add_json); });

  CLI::App* list = share->add_subcommand("list", "List the shares");
  const bool& list_json = JsonOption(*list);
  Examples(*list, "  quarry share list");
  list->callback([&list_json] { List(list_json); });

  CLI::App* remove = share->add_subcommand("remove", "Forget a share; its files stay");
  auto name = std::make_shared<std::string>();
  remove->add_option("NAME", *name, "The share's name")->required();
  const bool& remove_json = JsonOption(*remove);
  Examples(*remove, "  quarry share remove Music");
  remove->callback([name, &remove_json] { Remove(*name, remove_json); });

  AddShareMoveCommands(*share);
  AddSharePauseCommands(*share);
}

}  // namespace quarry::cli
