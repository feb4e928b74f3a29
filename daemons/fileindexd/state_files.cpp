#include "daemons/fileindexd/state_files.h"

#include <sys/stat.h>

#include "common/error.h"
#include "daemons/common/log.h"
#include "daemons/fileindexd/failure.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"

namespace quarry::fileindexd {

bool FileWatch::HasChanged() {
  struct stat status {};
  std::string now = "missing";
  // State files are replaced whole, so a new text has a new inode.
  if (stat(path_.c_str(), &status) == 0) {
    now = std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino) + ":" +
          std::to_string(status.st_size) + ":" + std::to_string(status.st_mtim.tv_sec) + ":" +
          std::to_string(status.st_mtim.tv_nsec);
  }
  if (seen_ == now) return false;
  seen_ = now;
  return true;
}

long long LoadResumeTime() {
  return fileindex::StatusMgr().GetPauseInfo();
}

std::set<std::string> LoadIndexedShares() {
  std::set<std::string> shares;
  const fileindex::FolderMgr list;
  for (const auto& folder : list.GetFolders()) {
    try {
      const std::string share = folder->GetShare();
      if (!share.empty()) shares.insert(share);
    } catch (const Error& error) {
      daemon::LogWarning("Passing over an indexed folder: " + Describe(error));
    }
  }
  return shares;
}

}  // namespace quarry::fileindexd
