#include <chrono>
#include <iostream>
#include <memory>

#include "cli/background_system.h"
#include "cli/commands/commands.h"
#include "cli/folders.h"
#include "cli/output.h"
#include "cli/problem.h"
#include "cli/progress.h"
#include "cli/search.h"
#include "cli/shares.h"
#include "cli/system.h"
#include "common/file_util.h"
#include "common/sdk/share.h"
#include "fileindex/index_mgr.h"
#include "fileindex/queue/event.h"
#include "fileindex/util/custom_event.h"
#include "fileindex/util/util.h"

namespace quarry::cli {
namespace {

void AddFolder(const std::string& path) {
  Json::Value folder;
  folder["path"] = path;
  folder["name"] = Basename(path);
  for (const char* kind : {"document", "audio", "video", "photo"}) folder[kind] = true;
  Json::Value list(Json::arrayValue);
  list.append(folder);
  fileindex::FolderAdd(list, false);
}

// A share that cannot hold the folder after all does not stay behind.
void RegisterInNewShare(const Place& place) {
  AddShare(place);
  try {
    AddFolder(place.folder);
  } catch (const Error&) {
    RemoveShare(place);
    throw;
  }
}

// Makes sure that the place is indexed and that what changed since the last time is looked for.
void Register(const Place& place) {
  if (GoverningFolder(place.folder)) {
    fileindex::AddCustomEvent(fileindex::EVENT_REINDEX, fileindex::GetFullPath(place.folder), "",
                              Json::Value());
  } else {
    AddFolder(place.folder);
  }
}

double SecondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

void Index(const std::string& argument, const std::vector<std::string>& words) {
  // What is wrong with the directory is said before anything is started or changed.
  const std::string directory = ResolveDirectory(argument);
  const Place place = PlanPlace(directory, KnownShares());
  const BackgroundSystem system;
  RequireRunningSystem();
  const auto start = std::chrono::steady_clock::now();
  if (place.new_share) {
    RegisterInNewShare(place);
  } else {
    Register(place);
  }
  WaitUntilIndexed(place.folder);
  std::cerr << DocumentCount(place.share) << " documents in the index of " << Printable(place.share)
            << ", up to date after " << HumanDuration(SecondsSince(start)) << '\n';
  CollectWords(sdk::SDKShare(place.share).GetDBName());
  const std::string inside = fileindex::GetFullPath(place.folder);
  if (words.empty()) {
    SearchPrompt(inside);
  } else {
    PrintHits(std::cout, Search({QueryOf(words), inside}), 0, OutputIsTerminal());
  }
}

}  // namespace

void AddIndexCommand(CLI::App& app) {
  CLI::App* index = app.add_subcommand(
      "index", "Index a directory and search it, starting the system for as long as it takes");
  auto directory = std::make_shared<std::string>();
  auto words = std::make_shared<std::vector<std::string>>();
  index->add_option("DIRECTORY", *directory, "The directory")->required();
  index->add_option("WORDS", *words, "Print what matches and exit instead of asking");
  Examples(*index,
           "  quarry index ~/Documents               then asks for words to search\n"
           "  quarry index ~/Documents -- budget     prints what matches and exits");
  index->callback([directory, words] { Index(*directory, *words); });
}

}  // namespace quarry::cli
