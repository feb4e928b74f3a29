#include "cli/folder_lock.h"

#include <string>

#include "cli/layout.h"
#include "common/paths.h"

namespace quarry::cli {
namespace {

// A system that was never started has no directory for the lock yet.
std::string LockPath() {
  EnsureLayout();
  return RootedPath("/tmp/quarry_cfg_folder.lock");
}

}  // namespace

FolderLock::FolderLock() : lock_(LockPath(), true) {}

}  // namespace quarry::cli
