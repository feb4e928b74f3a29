#include "cli/shares.h"

#include "cli/problem.h"
#include "cli/share_plan.h"
#include "cli/state_check.h"
#include "common/file_util.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/util/util.h"
#include "platform/linux/share_registry.h"

namespace quarry::cli {
namespace {

// What stands for a place in a share, but the share is none of those that can be used.
[[noreturn]] void RefuseUnknownShare(const std::string& name, const std::string& argument) {
  for (const platform::ShareRecord& share : platform::ReadShares()) {
    if (share.name == name) RequireArrived(share);
  }
  if (fileindex::FolderMgr().IsShareIndexed(name)) throw Problem(HowToRegain({name}) + ".");
  throw Problem("There is no share named \"" + name + "\", and no directory \"" + argument +
                "\". \"quarry share list\" names the shares there are.");
}

}  // namespace

void AddShare(const Place& place) {
  platform::ShareRecord record;
  record.name = place.share;
  record.path = place.share_path;
  try {
    platform::AddShare(record);
  } catch (const Error& error) {
    throw Problem("Cannot add the share \"" + place.share + "\": " + error.reason());
  }
}

void RemoveShare(const Place& place) {
  platform::RemoveShare(place.share);
}

std::string SharePathOf(const std::string& argument) {
  const std::vector<KnownShare> shares = KnownShares();
  if (!argument.empty() && argument.front() == '/') {
    const std::string name = fileindex::GetShareNameByPath(argument);
    for (const KnownShare& share : shares) {
      if (share.name == name) return argument;
    }
    if (!IsDirExist(argument, true)) RefuseUnknownShare(name, argument);
  }
  const std::string directory = ResolveDirectory(argument);
  const Place place = PlanPlace(directory, shares);
  if (place.new_share) {
    throw Problem("\"" + directory + "\" lies in no share. Add one first: quarry share add " +
                  directory);
  }
  return place.folder;
}

std::vector<std::string> IndexedShares() {
  platform::ReadShares();  // when it fails, no share would be found below
  std::vector<std::string> ids;
  for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) {
    try {
      ids.push_back(sdk::SDKShare(share).GetDBName());
    } catch (const Error&) {
      continue;  // a share that has vanished is not searched, the others are
    }
  }
  const std::vector<std::string> vanished = VanishedShares();
  if (ids.empty() && !vanished.empty()) throw Problem(HowToRegain(vanished) + ".");
  return ids;
}

}  // namespace quarry::cli
