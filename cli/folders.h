// The folder list, read so that one share that has vanished does not hide the others.

#ifndef QUARRY_CLI_FOLDERS_H_
#define QUARRY_CLI_FOLDERS_H_

#include <memory>
#include <string>
#include <vector>

#include "fileindex/config/folder.h"

namespace quarry::cli {

// All indexed folders, by path. Throws Error when the list cannot be loaded.
std::vector<std::shared_ptr<fileindex::Folder>> AllFolders();

// The deepest indexed folder at or above `share_path`, or null. Asks nothing of the platform.
std::shared_ptr<fileindex::Folder> GoverningFolder(const std::string& share_path);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_FOLDERS_H_
