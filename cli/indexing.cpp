#include "cli/indexing.h"

#include <json/json.h>

#include <algorithm>
#include <functional>
#include <memory>

#include "cli/folder_lock.h"
#include "cli/problem.h"
#include "cli/share_plan.h"
#include "cli/system.h"
#include "common/file_util.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/util/util.h"

namespace quarry::cli {
namespace {

using fileindex::Folder;
using FolderPtr = std::shared_ptr<Folder>;

std::vector<FolderPtr> FoldersOf(const std::string& share) {
  std::vector<FolderPtr> folders;
  const fileindex::FolderMgr list;
  for (const FolderPtr& folder : list.GetFolders()) {
    if (folder->GetShare() == share) folders.push_back(folder);
  }
  return folders;
}

// The mount point as the library wants it, without a "/" at its end.
std::string MountPoint(const std::string& argument) {
  std::string path = argument;
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  if (path.empty() || path.front() != '/') {
    throw Problem("\"" + argument + "\" is no mount point. Name the volume's absolute path.");
  }
  if (path == "/") {
    throw Problem("\"/\" is no volume of its own. To pause all indexing: quarry pause");
  }
  return path;
}

std::set<std::string> SharesWith(const std::function<bool(const Folder&)>& wanted) {
  std::set<std::string> shares;
  const fileindex::FolderMgr list;
  for (const FolderPtr& folder : list.GetFolders()) {
    if (wanted(*folder)) shares.insert(folder->GetShare());
  }
  return shares;
}

std::set<std::string> SharesOn(const std::string& mount_point) {
  std::set<std::string> shares = SharesWith([&](const Folder& folder) {
    return StringStartWith(folder.GetFullPath() + "/", mount_point + "/");
  });
  if (shares.empty()) throw Problem("Nothing on the volume \"" + mount_point + "\" is indexed.");
  return shares;
}

// Where the share that is to be cleared lives, or lived.
std::string PathToClear(const std::string& name, const std::string& path,
                        const std::vector<FolderPtr>& folders) {
  for (const platform::ShareRecord& share : platform::ReadShares()) {
    if (share.name != name) continue;
    if (!std::all_of(folders.begin(), folders.end(), [](auto& f) { return f->IsPaused(); })) {
      throw Problem("The share \"" + name +
                    "\" is not paused. Pause it first: quarry share pause " + name);
    }
    if (!path.empty() && path != share.path) {
      throw Problem("The share \"" + name + "\" lives at \"" + share.path + "\", not at \"" + path +
                    "\". Leave the path out.");
    }
    return share.path;
  }
  if (!path.empty()) return path;
  throw Problem("The share \"" + name +
                "\" is not known any more. Say where it lived: quarry share clear " + name +
                " /FULL/PATH");
}

// A place that no folder governs and that holds none has nothing to look at.
void RequireFolderAround(const std::string& path) {
  const auto folders = FoldersOf(fileindex::GetShareNameByPath(path));
  const bool found = std::any_of(folders.begin(), folders.end(), [&](const FolderPtr& folder) {
    return StringStartWith(path + "/", folder->GetPath() + "/") ||
           StringStartWith(folder->GetPath() + "/", path + "/");
  });
  if (!found) {
    throw Problem("\"" + path + "\" lies in no indexed folder. Index it with: quarry folder add " +
                  path);
  }
}

}  // namespace

void RequireIndexed(const std::string& name) {
  const auto shares = platform::ReadShares();
  for (const platform::ShareRecord& share : shares) {
    if (share.name == name) RequireArrived(share);
  }
  if (fileindex::FolderMgr().IsShareIndexed(name)) return;
  RequireShare(shares, name);
  throw Problem("Nothing of the share \"" + name +
                "\" is indexed. Index it with: quarry folder add /" + name);
}

void PauseShare(const std::string& name) {
  const FolderLock lock;
  RequireIndexed(name);
  RequireRunningSystem();
  fileindex::SharePause(name);
}

void ResumeShare(const std::string& name) {
  const FolderLock lock;
  RequireIndexed(name);
  RequireRunningSystem();
  fileindex::ShareResume(name);
}

void ClearShare(const std::string& name, const std::string& path) {
  const FolderLock lock;
  RequireIndexed(name);
  const std::string share_path = PathToClear(name, path, FoldersOf(name));
  RequireRunningSystem();
  fileindex::ShareClearPaused(name, share_path);
}

std::set<std::string> PauseVolume(const std::string& argument) {
  const std::string mount_point = MountPoint(argument);
  const FolderLock lock;
  std::set<std::string> shares = SharesOn(mount_point);
  RequireRunningSystem();
  fileindex::VolumePause(mount_point);
  return shares;
}

std::set<std::string> ResumeVolume(const std::string& argument) {
  const std::string mount_point = MountPoint(argument);
  const FolderLock lock;
  std::set<std::string> shares = SharesOn(mount_point);
  RequireRunningSystem();
  fileindex::VolumeResume(mount_point);
  return shares;
}

std::set<std::string> ClearVolume(const std::string& argument) {
  const std::string mount_point = MountPoint(argument);
  const FolderLock lock;
  std::set<std::string> shares = SharesWith([&](const Folder& folder) {
    return folder.IsPaused() && folder.GetVolumeToBeClean() == mount_point;
  });
  if (shares.empty()) {
    throw Problem("No folder was paused for the volume \"" + mount_point +
                  "\". Pause it first: quarry volume pause " + mount_point);
  }
  RequireRunningSystem();
  // The volume's own operation only forgets the folders. It comes last: it alone says that all is
  // done.
  for (const platform::ShareRecord& share : platform::ReadShares()) {
    if (shares.count(share.name) > 0) fileindex::ShareClearPaused(share.name, share.path);
  }
  fileindex::VolumeClearPaused(mount_point);
  return shares;
}

void ReindexFolders(const std::vector<std::string>& paths) {
  const FolderLock lock;
  Json::Value list(Json::arrayValue);
  for (const std::string& path : paths) {
    RequireFolderAround(path);
    list.append(path);
  }
  RequireRunningSystem();
  fileindex::FolderReindex(list);
}

}  // namespace quarry::cli
