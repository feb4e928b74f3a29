// What the change monitor is to watch.

#include <algorithm>
#include <map>
#include <set>

#include "cli/doctor/checks.h"
#include "cli/doctor/known_places.h"
#include "cli/doctor/state_text.h"
#include "cli/folder_lock.h"
#include "cli/system.h"
#include "common/error.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/index_mgr.h"

namespace quarry::cli {
namespace {

using fileindex::FolderMgr;

struct Share {
  std::string queue;
  std::set<std::string> places;
  Json::Value folders{Json::arrayValue};
  bool watched = false;  // some folder is not paused
};

// The shares whose folders have places; the others are troubles of their own.
std::map<std::string, Share> IndexedShares() {
  std::map<std::string, Share> shares;
  const FolderMgr list;
  for (const auto& folder : list.GetFolders()) {
    try {
      Share& share = shares[folder->GetShare()];
      share.queue = sdk::SDKShare(folder->GetShare()).GetQueuePath();
      share.places.insert(folder->GetFullPath());
      share.folders.append(folder->GetData());
      share.watched = share.watched || !folder->IsPaused();
    } catch (const Error&) {
      shares.erase(folder->GetShare());
    }
  }
  return shares;
}

bool IsRegistered(const Share& share, const std::vector<Registration>& registrations) {
  return std::any_of(registrations.begin(), registrations.end(), [&](const Registration& known) {
    const std::set<std::string> places(known.places.begin(), known.places.end());
    return known.whole && known.queue == share.queue && places == share.places;
  });
}

void CheckFile(Examination& examination, const Registration& registration) {
  if (registration.whole) return;
  examination.Mend("The change monitor's file " + registration.file + " is damaged", "set aside",
                   [&] { return "set aside as " + SetAside(registration.file); });
}

// Setting a share's folders as they are registers them, and queues nothing in this mode.
void CheckWatched(Examination& examination, const std::string& name, const Share& share) {
  examination.Mend("The change monitor does not know what to watch of the share " + name,
                   "registered anew", [&] {
                     RequireRunningSystem();
                     fileindex::FolderSet(share.folders, true);
                     return "";
                   });
}

}  // namespace

void CheckRegistrations(Examination& examination) {
  std::vector<Registration> registrations;
  std::map<std::string, Share> shares;
  {
    const FolderLock lock;
    registrations = Registrations();
    shares = IndexedShares();
  }
  for (const Registration& registration : registrations) CheckFile(examination, registration);
  for (const auto& [name, share] : shares) {
    if (share.watched && !IsRegistered(share, registrations))
      CheckWatched(examination, name, share);
  }
}

}  // namespace quarry::cli
