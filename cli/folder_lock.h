// Keeping the folder list to oneself.

#ifndef QUARRY_CLI_FOLDER_LOCK_H_
#define QUARRY_CLI_FOLDER_LOCK_H_

#include "common/lock_file.h"

namespace quarry::cli {

// Held around the library's operations that change folders but take no lock themselves, and around
// what is looked at before them. Never around FolderAdd, FolderSet or FolderDelete, which take it.
class FolderLock {
 public:
  // Blocks for up to a minute. Throws Error 506 when somebody else keeps the lock.
  FolderLock();

 private:
  LockFile lock_;
};

}  // namespace quarry::cli

#endif  // QUARRY_CLI_FOLDER_LOCK_H_
