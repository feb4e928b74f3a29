// Handles of directories: what a file system calls a directory, wherever it is.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_HANDLE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_HANDLE_H_

#include <sys/types.h>

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnotifyd/directory_tree.h"

namespace quarry::notify {

// A directory as it is found under some path.
struct DirectoryIdentity {
  std::string handle;  // its type (4 bytes) and its bytes; unique within the file system, for ever
  int mount = 0;       // which mount it was reached through
};

// Of the directory that `fd`, which may be of O_PATH, is of. Empty, with errno set, when the file
// system has no handles.
std::optional<DirectoryIdentity> IdentifyDirectory(int fd);

// Finds the directories of one file system. Needs CAP_DAC_READ_SEARCH. One thread.
class MountedDirectories : public DirectoryLookup {
 public:
  // `device` is the file system's st_dev.
  explicit MountedDirectories(dev_t device) : device_(device) {}

  // A directory of the file system. What lies below it must be reachable through one of them; a
  // mount may show a part of a file system only. One that is of another file system by now is not
  // used: its directories may have the same handles.
  void AddEntrance(const std::string& path);
  void RemoveEntrance(const std::string& path);

  Answer Find(std::string_view handle, DirectoryPlace* place) override;
  Answer FindFile(std::string_view handle, DirectoryPlace* place) override;

  // To be called after a number of Find()s: nobody can unmount what is kept open.
  void Release() { open_.clear(); }

 private:
  // A directory that is open for looking things up, and its mount; what is found through it is on
  // the same one.
  struct Entrance {
    UniqueFd fd;
    int mount = 0;
  };

  bool OpenEntrances();
  bool OpenEntrance(const std::string& path);

  const dev_t device_;
  std::vector<std::string> entrances_;
  std::vector<Entrance> open_;  // one of each mount
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_HANDLE_H_
