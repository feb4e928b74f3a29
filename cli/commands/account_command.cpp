#include <iostream>
#include <map>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/folder_lock.h"
#include "cli/indexing.h"
#include "cli/output.h"
#include "cli/problem.h"
#include "cli/share_plan.h"
#include "common/file_util.h"
#include "fileindex/index_mgr.h"
#include "platform/include/recycle.h"
#include "platform/linux/share_move.h"

namespace quarry::cli {
namespace {

constexpr const char* kHomes = "homes";

const std::map<std::string, AUTH_TYPE> kAccounts{
    {"local", AUTH_TYPE_LOCAL}, {"domain", AUTH_TYPE_DOMAIN}, {"ldap", AUTH_TYPE_LDAP}};

void Home(void (*change)(AUTH_TYPE), const std::string& accounts, bool json) {
  const FolderLock lock;
  RequireIndexed(kHomes);
  change(kAccounts.at(accounts));
  Json::Value result;
  result["share"] = kHomes;
  result["accounts"] = accounts;
  PrintDone(json, "The recycle bins in the home folders are looked at anew.", result);
}

void RequireAccountName(const std::string& name) {
  if (name.empty() || name == "." || name == ".." || name.find('/') != std::string::npos) {
    throw Problem("\"" + name + "\" is no account's name.");
  }
}

void RenameUser(const std::string& from, const std::string& to, bool json) {
  RequireAccountName(from);
  RequireAccountName(to);
  const FolderLock lock;
  RequireIndexed(kHomes);
  const std::string homes = RequireShare(platform::ReadShares(), kHomes).path;
  const std::string home = homes + "/" + to;
  if (!IsDirExist(home, false)) {
    throw Problem("There is no home folder \"" + home + "\". Rename the account with its home " +
                  "folder first (usermod --login " + to + " --home " + home + " --move-home " +
                  from + ").");
  }
  platform::MoveWatches(homes, homes + "/" + from, home);
  fileindex::UserRename(from, to);
  Json::Value result;
  result["old_name"] = from;
  result["name"] = to;
  result["path"] = home;
  PrintDone(json, "The home folder of " + from + " is indexed as " + to + "'s.", result);
}

void AddHome(CLI::App& home, const char* name, const char* help, void (*change)(AUTH_TYPE)) {
  CLI::App* command = home.add_subcommand(name, help);
  auto accounts = std::make_shared<std::string>("local");
  command->add_option("--accounts", *accounts, "The kind of accounts that are concerned")
      ->check(CLI::IsMember({"local", "domain", "ldap"}));
  const bool& json = JsonOption(*command);
  Examples(*command, std::string("  quarry home ") + name + " --accounts domain");
  command->callback([change, accounts, &json] { Home(change, *accounts, json); });
}

}  // namespace

void AddHomeCommand(CLI::App& app) {
  CLI::App* home =
      app.add_subcommand("home", "The recycle bins of users' home folders were switched on or off");
  home->require_subcommand(1);
  Examples(*home, "  quarry home disable");
  AddHome(*home, "enable", "Index the recycle bins of the home folders anew",
          fileindex::HomeEnable);
  AddHome(*home, "disable", "Take the recycle bins of the home folders out of the index",
          fileindex::HomeDisable);
}

void AddUserCommand(CLI::App& app) {
  CLI::App* user = app.add_subcommand("user", "Accounts whose home folders are indexed");
  user->require_subcommand(1);
  CLI::App* rename = user->add_subcommand(
      "rename", "An account, and its home folder in the share homes, has got another name");
  auto from = std::make_shared<std::string>();
  auto to = std::make_shared<std::string>();
  rename->add_option("OLD", *from, "The account's old name")->required();
  rename->add_option("NEW", *to, "Its new name")->required();
  const bool& json = JsonOption(*rename);
  Examples(*user, "  quarry user rename first second");
  Examples(*rename,
           "  quarry user rename first second     when /srv/homes/first has become "
           "/srv/homes/second");
  rename->callback([from, to, &json] { RenameUser(*from, *to, json); });
}

}  // namespace quarry::cli
