#include "cli/shares.h"

#include "cli/problem.h"
#include "common/file_util.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/util/util.h"
#include "platform/linux/share_registry.h"

namespace quarry::cli {

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
  std::vector<std::string> ids;
  for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) {
    try {
      ids.push_back(sdk::SDKShare(share).GetDBName());
    } catch (const Error&) {
      continue;  // a share that has vanished is not searched, the others are
    }
  }
  return ids;
}

}  // namespace quarry::cli
