#include <algorithm>
#include <array>
#include <iostream>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/output.h"
#include "cli/problem.h"
#include "cli/shares.h"
#include "cli/system.h"
#include "common/file_util.h"
#include "common/json.h"
#include "fileindex/index_mgr.h"

namespace quarry::cli {
namespace {

constexpr std::array<const char*, 4> kKinds{"document", "audio", "video", "photo"};

// What the options say about a folder. Kinds that are not named stay as they are.
struct Choice {
  std::string path;
  std::string name;
  std::vector<std::string> only;
  std::vector<std::string> with;
  std::vector<std::string> without;
};

void ApplyChoice(const Choice& choice, Json::Value& folder) {
  if (!choice.name.empty()) folder["name"] = choice.name;
  if (!choice.only.empty()) {
    for (const char* kind : kKinds) folder[kind] = false;
  }
  for (const std::string& kind : choice.only) folder[kind] = true;
  for (const std::string& kind : choice.with) folder[kind] = true;
  for (const std::string& kind : choice.without) folder[kind] = false;
}

Json::Value ListOf(const Json::Value& folder) {
  Json::Value list(Json::arrayValue);
  list.append(folder);
  return list;
}

std::string Kinds(const Json::Value& folder) {
  std::string text;
  for (const char* kind : kKinds) {
    if (folder[kind].asBool()) text += (text.empty() ? "" : ",") + std::string(kind);
  }
  return text.empty() ? "names only" : text;
}

void Report(const std::string& done, const Json::Value& folder, bool json) {
  if (json) {
    PrintJson(std::cout, folder);
  } else {
    std::cout << done << ' ' << Printable(folder["path"].asString()) << " (" << Kinds(folder)
              << ")\n";
  }
}

void Add(const Choice& choice, bool json) {
  RequireRunningSystem();
  Json::Value folder;
  folder["path"] = SharePathOf(choice.path);
  folder["name"] = Basename(folder["path"].asString());
  for (const char* kind : kKinds) folder[kind] = true;
  ApplyChoice(choice, folder);
  fileindex::FolderAdd(ListOf(folder), false);
  Report("Indexing", folder, json);
}

// The library does not name what it has not found.
Json::Value FolderAt(const std::string& argument) {
  const std::string path = SharePathOf(argument);
  Json::Value folder;
  try {
    fileindex::FolderGet(folder, path);
  } catch (const Error& error) {
    if (error.code() != kErrorFolderNotFound) throw;
    throw Error(error.code(), path);
  }
  return folder;
}

void Set(const Choice& choice, bool json) {
  RequireRunningSystem();
  Json::Value folder = FolderAt(choice.path);
  ApplyChoice(choice, folder);
  fileindex::FolderSet(ListOf(folder), false);
  Report("Changed", folder, json);
}

void Get(const std::string& path, bool json) {
  const Json::Value folder = FolderAt(path);
  if (json) {
    PrintJson(std::cout, folder);
    return;
  }
  std::vector<std::vector<std::string>> rows;
  for (const char* key : {"path", "name"}) {
    rows.push_back({key, Printable(folder[key].asString())});
  }
  for (const char* key : kKinds) rows.push_back({key, folder[key].asBool() ? "yes" : "no"});
  rows.push_back({"paused", folder["paused"].asBool() ? "yes" : "no"});
  PrintTable(std::cout, rows);
}

struct Page {
  unsigned int offset = 0;
  unsigned int limit = 1000;
  std::string sort = "path";
  bool descending = false;
  bool status = false;
};

void List(const Page& page, bool json) {
  Json::Value result;
  Json::Value additional(Json::arrayValue);
  if (page.status) additional.append("status");
  fileindex::FolderList(result, page.offset, page.limit, page.sort,
                        page.descending ? "desc" : "asc", additional);
  if (json) {
    PrintJson(std::cout, result);
    return;
  }
  if (result["total"].asInt() == 0) {
    std::cout << "No folder is indexed. Add one with: quarry folder add /SHARE/DIRECTORY\n";
    return;
  }
  std::vector<std::vector<std::string>> rows{{"FOLDER", "NAME", "CONTENT", "PAUSED"}};
  if (page.status) rows.front().emplace_back("STATUS");
  for (const Json::Value& folder : result["folder"]) {
    rows.push_back({Printable(folder["path"].asString()), Printable(folder["name"].asString()),
                    Kinds(folder), folder["paused"].asBool() ? "yes" : "no"});
    if (page.status) rows.back().push_back(folder["additional"]["status"]["text"].asString());
  }
  PrintTable(std::cout, rows);
}

std::shared_ptr<Choice> ChoiceOptions(CLI::App& command) {
  auto choice = std::make_shared<Choice>();
  const CLI::IsMember kinds(std::vector<std::string>(kKinds.begin(), kKinds.end()));
  command.add_option("PATH", choice->path, "/SHARE/DIRECTORY, or an existing directory in a share")
      ->required();
  command.add_option("--name", choice->name, "A name for the folder");
  command.add_option("--only", choice->only, "Index the content of these kinds only")
      ->delimiter(',')
      ->check(kinds);
  command.add_option("--with", choice->with, "Index the content of these kinds too")
      ->delimiter(',')
      ->check(kinds);
  command.add_option("--without", choice->without, "Do not index the content of these kinds")
      ->delimiter(',')
      ->check(kinds);
  return choice;
}

void AddListCommand(CLI::App& folder) {
  CLI::App* list = folder.add_subcommand("list", "List the indexed folders");
  auto page = std::make_shared<Page>();
  list->add_option("--offset", page->offset, "Leave out so many at the start");
  list->add_option("--limit", page->limit, "List so many at most");
  list->add_option("--sort", page->sort, "Sort by this property")
      ->check(CLI::IsMember({"path", "name", "document", "audio", "video", "photo"}));
  list->add_flag("--desc", page->descending, "Sort descending");
  list->add_flag("--status", page->status, "Add each folder's status");
  const bool& json = JsonOption(*list);
  Examples(*list, "  quarry folder list --sort name --json");
  list->callback([page, &json] { List(*page, json); });
}

}  // namespace

void AddFolderCommand(CLI::App& app) {
  CLI::App* folder = app.add_subcommand("folder", "Folders: what is indexed, and of what kinds");
  folder->require_subcommand(1);
  Examples(
      *folder,
      "  quarry folder add /Music/live --only audio\n  quarry folder set /Music/live --with photo\n"
      "  quarry folder list");

  CLI::App* add = folder->add_subcommand("add", "Index a folder; all kinds unless said otherwise");
  const auto add_choice = ChoiceOptions(*add);
  const bool& add_json = JsonOption(*add);
  Examples(
      *add,
      "  quarry folder add /photo/2019 --only photo,video\n  quarry folder add ~/Documents/work");
  add->callback([add_choice, &add_json] { Add(*add_choice, add_json); });

  CLI::App* set = folder->add_subcommand("set", "Change a folder; what is not named stays");
  const auto set_choice = ChoiceOptions(*set);
  const bool& set_json = JsonOption(*set);
  Examples(*set, "  quarry folder set /photo/2019 --without video --name holidays");
  set->callback([set_choice, &set_json] { Set(*set_choice, set_json); });

  CLI::App* get = folder->add_subcommand("get", "Show one folder");
  auto path = std::make_shared<std::string>();
  get->add_option("PATH", *path, "/SHARE/DIRECTORY, or an existing directory in a share")
      ->required();
  const bool& get_json = JsonOption(*get);
  Examples(*get, "  quarry folder get /photo/2019");
  get->callback([path, &get_json] { Get(*path, get_json); });

  AddListCommand(*folder);
  AddFolderWorkCommands(*folder);
}

}  // namespace quarry::cli
