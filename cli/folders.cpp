#include "cli/folders.h"

#include <limits>

#include "common/file_util.h"
#include "fileindex/config/folder_mgr.h"

namespace quarry::cli {

std::vector<std::shared_ptr<fileindex::Folder>> AllFolders() {
  std::vector<std::shared_ptr<fileindex::Folder>> folders;
  unsigned int total = 0;
  fileindex::FolderMgr().List(folders, total, 0, std::numeric_limits<unsigned int>::max(), "path",
                              "asc");
  return folders;
}

std::shared_ptr<fileindex::Folder> GoverningFolder(const std::string& share_path) {
  std::shared_ptr<fileindex::Folder> deepest;
  for (const auto& folder : AllFolders()) {
    if (!StringStartWith(share_path + "/", folder->GetPath() + "/")) continue;
    if (!deepest || folder->GetPath().size() > deepest->GetPath().size()) deepest = folder;
  }
  return deepest;
}

}  // namespace quarry::cli
