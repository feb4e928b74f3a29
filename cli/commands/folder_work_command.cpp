#include <iostream>
#include <memory>
#include <vector>

#include "cli/commands/commands.h"
#include "cli/indexing.h"
#include "cli/output.h"
#include "cli/shares.h"
#include "cli/system.h"
#include "common/json.h"
#include "fileindex/index_mgr.h"

namespace quarry::cli {
namespace {

using Paths = std::vector<std::string>;

Paths SharePathsOf(const Paths& arguments) {
  Paths paths;
  for (const std::string& argument : arguments) paths.push_back(SharePathOf(argument));
  return paths;
}

void Report(const std::string& done, const Paths& paths, bool json) {
  std::string names;
  for (const std::string& path : paths) names += (names.empty() ? "" : ", ") + path;
  Json::Value result;
  result["paths"] = Vec2JsonArr<std::string>(paths);
  PrintDone(json, done + names, result);
}

void Reindex(const Paths& arguments, bool json) {
  const Paths paths = SharePathsOf(arguments);
  ReindexFolders(paths);
  Report("Looking anew at ", paths, json);
}

void Delete(const Paths& arguments, bool json) {
  RequireRunningSystem();
  const Paths paths = SharePathsOf(arguments);
  fileindex::FolderDelete(Vec2JsonArr<std::string>(paths));
  Report("Not indexed any longer: ", paths, json);
}

CLI::App* AddCommand(CLI::App& folder, const char* name, const char* help, const char* example,
                     void (*run)(const Paths&, bool)) {
  CLI::App* command = folder.add_subcommand(name, help);
  auto paths = std::make_shared<Paths>();
  command
      ->add_option("PATHS", *paths,
                   "/SHARE/DIRECTORY, or an existing directory in a share; several")
      ->required();
  const bool& json = JsonOption(*command);
  Examples(*command, example);
  command->callback([run, paths, &json] { run(*paths, json); });
  return command;
}

}  // namespace

void AddFolderWorkCommands(CLI::App& folder) {
  AddCommand(folder, "reindex",
             "Compare places with the index and read what differs; a damaged index is made anew",
             "  quarry folder reindex /photo/2019 /Music", Reindex);
  AddCommand(folder, "delete", "Index folders no longer; their files stay",
             "  quarry folder delete /photo/2019", Delete);
}

}  // namespace quarry::cli
