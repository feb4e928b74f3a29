#include <iostream>
#include <memory>
#include <set>

#include "cli/commands/commands.h"
#include "cli/indexing.h"
#include "cli/output.h"
#include "common/json.h"

namespace quarry::cli {
namespace {

struct VolumeCommand {
  const char* name;
  const char* help;
  const char* example;
  const char* done;  // before the names of the shares
  std::set<std::string> (*run)(const std::string& mount_point);
};

void Run(const VolumeCommand& command, const std::string& mount_point, bool json) {
  Json::Value result;
  result["mount_point"] = mount_point;
  result["shares"] = Json::Value(Json::arrayValue);
  std::string names;
  for (const std::string& share : command.run(mount_point)) {
    names += (names.empty() ? "" : ", ") + share;
    result["shares"].append(share);
  }
  PrintDone(json, std::string(command.done) + names + ".", result);
}

void Add(CLI::App& volume, const VolumeCommand& command) {
  CLI::App* app = volume.add_subcommand(command.name, command.help);
  auto mount_point = std::make_shared<std::string>();
  app->add_option("MOUNT_POINT", *mount_point, "The directory at which the volume is mounted")
      ->required();
  const bool& json = JsonOption(*app);
  Examples(*app, command.example);
  app->callback([command, mount_point, &json] { Run(command, *mount_point, json); });
}

}  // namespace

void AddVolumeCommand(CLI::App& app) {
  CLI::App* volume = app.add_subcommand("volume", "All shares of a volume that goes or comes back");
  volume->require_subcommand(1);
  Examples(*volume,
           "  quarry volume pause /mnt/disk2      before it is unmounted\n"
           "  quarry volume resume /mnt/disk2     when it is back");
  Add(*volume, {"pause", "Stop indexing what is on a volume; it is still found",
                "  quarry volume pause /mnt/disk2", "Paused: ", PauseVolume});
  Add(*volume, {"resume", "Index what is on a volume again", "  quarry volume resume /mnt/disk2",
                "Indexing again: ", ResumeVolume});
  Add(*volume,
      {"clear",
       "Drop from the index for good what was paused with a volume that will not come back",
       "  quarry volume clear /mnt/disk2", "Dropped from the index: ", ClearVolume});
}

}  // namespace quarry::cli
