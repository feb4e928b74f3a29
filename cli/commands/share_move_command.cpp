#include <iostream>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/folder_lock.h"
#include "cli/output.h"
#include "cli/place.h"
#include "cli/share_mover.h"

namespace quarry::cli {
namespace {

void Report(const char* done, const SharePlan& plan, bool json) {
  Json::Value result;
  result["name"] = plan.to;
  result["path"] = plan.new_path;
  result["old_name"] = plan.from;
  result["old_path"] = plan.old_path;
  PrintDone(json, std::string(done) + " the share " + plan.to + ": it is at " + plan.new_path + ".",
            result);
}

void Rename(const std::string& from, const std::string& to, bool json) {
  const FolderLock lock;
  const SharePlan plan = PlanRename(platform::ReadShares(), from, to);
  MoveShare(plan, false);
  Report("Renamed", plan, json);
}

void Migrate(const std::string& name, const std::string& parent, bool copied, bool json) {
  const FolderLock lock;
  const SharePlan plan = PlanMigration(platform::ReadShares(), name, ResolveDirectory(parent));
  MoveShare(plan, copied);
  Report("Moved", plan, json);
}

constexpr const char* kAboutRename =
    "  quarry share rename Music Sound     /srv/Music becomes /srv/Sound\n\n"
    "The share's directory is renamed, unless it was already. Folders, index and waiting work "
    "come\n"
    "along, and no file is read again. When it is cut short, the same command ends it.";

constexpr const char* kAboutMigrate =
    "  quarry share migrate Music /srv/large       /srv/Music becomes /srv/large/Music\n"
    "  cp -a /srv/Music /mnt/disk2/ && quarry share migrate Music /mnt/disk2 --copied\n\n"
    "The share's directory is moved where both places are on one file system. Nothing is ever\n"
    "copied: to another file system move the files yourself first, or copy them and say --copied.\n"
    "Index and waiting work come along. When it is cut short, the same command ends it.";

void AddRename(CLI::App& share) {
  CLI::App* rename =
      share.add_subcommand("rename", "Give a share, and its directory, another name");
  auto from = std::make_shared<std::string>();
  auto to = std::make_shared<std::string>();
  rename->add_option("OLD", *from, "The share's name")->required();
  rename->add_option("NEW", *to, "Its new name")->required();
  const bool& json = JsonOption(*rename);
  Examples(*rename, kAboutRename);
  rename->callback([from, to, &json] { Rename(*from, *to, json); });
}

void AddMigrate(CLI::App& share) {
  CLI::App* migrate =
      share.add_subcommand("migrate", "Take a share to another directory, or another disk");
  auto name = std::make_shared<std::string>();
  auto parent = std::make_shared<std::string>();
  auto copied = std::make_shared<bool>(false);
  migrate->add_option("NAME", *name, "The share's name")->required();
  migrate->add_option("NEW_PARENT", *parent, "The directory that is to hold the share's")
      ->required();
  migrate->add_flag("--copied", *copied, "The files are copied; leave the old ones alone");
  const bool& json = JsonOption(*migrate);
  Examples(*migrate, kAboutMigrate);
  migrate->callback([name, parent, copied, &json] { Migrate(*name, *parent, *copied, json); });
}

}  // namespace

void AddShareMoveCommands(CLI::App& share) {
  AddRename(share);
  AddMigrate(share);
}

}  // namespace quarry::cli
