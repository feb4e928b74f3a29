// Changes as the kernel tells them of whole file systems.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_FANOTIFY_SOURCE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_FANOTIFY_SOURCE_H_

#include <sys/types.h>

#include <list>
#include <optional>
#include <string>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnotifyd/change_source.h"
#include "daemons/tarnotifyd/marked_file_system.h"
#include "daemons/tarnotifyd/mount_table.h"

namespace quarry::notify {

// Nothing is kept for each directory: one mark covers a file system, and so new directories are
// watched from their first moment on. File systems mounted within watched directories are marked,
// too. directory_tree.h says which paths are told and why nothing is lost by them. Changes of the
// watched directories themselves are told as changes of their attributes and as doubt.
//
// A symbolic link in the place of a watched directory is not followed: there is no directory.
//
// No directory is kept open from one call to the next, so everything can be unmounted. Refresh()
// and SetDirectories() look at every watched directory, and block where its file system does.
class FanotifySource : public ChangeSource {
 public:
  // Throws Error 502, "Cannot use fanotify: ...", where the kernel or the rights are missing:
  // CAP_SYS_ADMIN and CAP_DAC_READ_SEARCH are needed.
  FanotifySource() : FanotifySource(ProbeFanotify()) {}
  // For a kernel that tells moves in this way.
  explicit FanotifySource(MoveReports reports);

  int Descriptor() const override { return epoll_.get(); }
  void SetDirectories(const std::vector<std::string>& directories,
                      const std::vector<std::string>& ignore, ChangeSink& sink) override;
  void Read(ChangeSink& sink) override;
  void Refresh(ChangeSink& sink) override;
  void Report(SourceReport* report) const override;

  // Directories, or mount points within them, whose file system does not tell its changes in this
  // way, sorted: another source has to watch them, and has to tell the doubt with which that
  // begins. Changes with SetDirectories() and Refresh(); holds until the next of these calls.
  const std::vector<std::string>& Unwatchable() const { return unwatchable_; }

 private:
  // What was found at the path of a directory.
  struct Finding {
    bool exists = false;
    dev_t device = 0;
    ino_t inode = 0;
    std::string handle;  // empty when the file system has none

    bool operator==(const Finding& other) const {
      return exists == other.exists && device == other.device && inode == other.inode &&
             handle == other.handle;
    }
  };
  struct Watch {
    std::string path;
    std::optional<Finding> finding;           // what was found last; none when that is void
    MarkedFileSystem* file_system = nullptr;  // null while it is not watched
    bool was_lost = false;                    // it was watched, and that is not told yet
  };

  std::vector<std::string> WantedPaths();
  bool IsBelowIgnored(const std::string& directory, const std::string& path) const;
  bool IsWanted(const std::string& path) const;
  void Arrange(ChangeSink& sink);
  void Check(ChangeSink& sink);
  void Check(Watch& watch, ChangeSink& sink);
  Finding Look(int directory) const;
  void Bind(Watch& watch, int directory);
  void Unbind(Watch& watch);
  MarkedFileSystem& FileSystemOf(int directory, dev_t device);
  void DropUnmounted();
  void DropUnused();
  void ListUnwatchable();

  const MoveReports reports_;
  UniqueFd epoll_;
  MountTable mounts_;
  std::vector<std::string> directories_;
  std::vector<std::string> ignore_;
  std::list<Watch> watches_;
  bool is_arranged_ = true;  // there is a watch for all that is to be watched
  std::list<MarkedFileSystem> file_systems_;
  std::vector<std::string> unwatchable_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_FANOTIFY_SOURCE_H_
