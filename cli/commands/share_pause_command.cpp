#include <iostream>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/indexing.h"
#include "cli/output.h"

namespace quarry::cli {
namespace {

void Report(const std::string& sentence, const std::string& name, const char* state, bool json) {
  Json::Value result;
  result["name"] = name;
  result["state"] = state;
  PrintDone(json, sentence, result);
}

std::shared_ptr<std::string> NameOption(CLI::App& command) {
  auto name = std::make_shared<std::string>();
  command.add_option("NAME", *name, "The share's name")->required();
  return name;
}

void AddPause(CLI::App& share) {
  CLI::App* pause = share.add_subcommand(
      "pause", "Stop indexing a share; what is indexed is still found, what changes is not seen");
  const auto name = NameOption(*pause);
  const bool& json = JsonOption(*pause);
  Examples(*pause, "  quarry share pause Music");
  pause->callback([name, &json] {
    PauseShare(*name);
    Report("Paused the share " + *name + ".", *name, "paused", json);
  });
}

void AddResume(CLI::App& share) {
  CLI::App* resume =
      share.add_subcommand("resume", "Index a paused share again, and what has changed meanwhile");
  const auto name = NameOption(*resume);
  const bool& json = JsonOption(*resume);
  Examples(*resume, "  quarry share resume Music");
  resume->callback([name, &json] {
    ResumeShare(*name);
    Report("Indexing the share " + *name + " again.", *name, "indexing", json);
  });
}

void AddClear(CLI::App& share) {
  CLI::App* clear = share.add_subcommand(
      "clear", "Drop a paused share from the index for good; its files and the share itself stay");
  const auto name = NameOption(*clear);
  auto path = std::make_shared<std::string>();
  clear->add_option("PATH", *path, "Where it lived, for a share that is not known any more");
  const bool& json = JsonOption(*clear);
  Examples(*clear, "  quarry share pause Music && quarry share clear Music");
  clear->callback([name, path, &json] {
    ClearShare(*name, *path);
    Report("Dropped the share " + *name + " from the index.", *name, "cleared", json);
  });
}

}  // namespace

void AddSharePauseCommands(CLI::App& share) {
  AddPause(share);
  AddResume(share);
  AddClear(share);
}

}  // namespace quarry::cli
