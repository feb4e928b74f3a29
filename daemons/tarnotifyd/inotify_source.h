// Changes from inotify: works for every user, needs a watch for each directory.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_SOURCE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_SOURCE_H_

#include <cstddef>
#include <map>
#include <memory>
#include <string>
#include <unordered_set>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnotifyd/change_source.h"
#include "daemons/tarnotifyd/directory_scan.h"
#include "daemons/tarnotifyd/inotify_events.h"
#include "daemons/tarnotifyd/inotify_watches.h"
#include "daemons/tarnotifyd/mount_table.h"

namespace quarry::notify {

// A directory that appears is told as created once all that was in it is watched, and stands for
// everything in it; what appears there later is told itself. Nothing is told of ignored names. When
// the kernel has lost events everything is watched anew, and told as doubtful; so is a directory on
// which something is mounted or unmounted.
class InotifySource : public ChangeSource {
 public:
  // Throws Error 502 when the system gives no instance of inotify.
  InotifySource();

  int Descriptor() const override { return poll_fd_.get(); }
  void SetDirectories(const std::vector<std::string>& directories,
                      const std::vector<std::string>& ignore, ChangeSink& sink) override;
  void Read(ChangeSink& sink) override;
  void Refresh(ChangeSink& sink) override;
  void Report(SourceReport* report) const override;

  // How many directories are known.
  std::size_t Directories() const { return watches_ ? watches_->tree().size() : 0; }

 private:
  using Id = WatchTree::Id;

  struct Root {
    WatchTree::Ref directory;
    DirectoryId id;
  };

  void Restart();
  void BeginAnew(ChangeSink& sink);
  bool TakeInstance();
  void ArmTimer();

  bool HandleEvents(ChangeSink& sink);
  void Handle(const InotifyEvent& event, ChangeSink& sink);
  void HandleSelf(Id directory, const InotifyEvent& event, ChangeSink& sink);
  void HandleEntry(Id directory, const InotifyEvent& event, ChangeSink& sink);
  void HandleDeparture(Id directory, const InotifyEvent& event, ChangeSink& sink);
  void Appear(Id directory, const InotifyEvent& event, ChangeSink& sink);
  void Vanish(Id directory, const InotifyEvent& event, ChangeSink& sink);
  void ChangeAttributes(Id directory, const InotifyEvent& event, ChangeSink& sink);
  void Move(Id from, const std::string& old_name, Id to, const InotifyEvent& arrival,
            ChangeSink& sink);
  void MoveDirectory(Id from, const std::string& old_name, Id to, const std::string& new_name,
                     ChangeSink& sink);
  void ReplaceDirectory(Id moved, Id to, const std::string& name, ChangeSink& sink);
  void AddIfThere(Id directory, const std::string& name, ChangeSink& sink);
  std::string PathOf(Id directory, const std::string& name) const;

  std::string Above(const std::string& path) const;
  void FollowRoots(ChangeSink& sink);
  void FollowRoot(const std::string& path, ChangeSink& sink);
  bool IsAsWatched(const Root& root, const DirectoryId& now) const;
  void DropRoot(const std::string& path);
  void FollowMounts();
  void FollowMount(const std::string& path);
  void DoubtCovered(const std::vector<std::string>& before, ChangeSink& sink) const;

  UniqueFd timer_;    // readable when something is left to do without an event
  UniqueFd poll_fd_;  // of the timer and of the events
  InotifyEvents events_;
  std::unordered_set<std::string> ignore_;
  std::unique_ptr<InotifyWatches> watches_;  // none while the system gives no instance
  std::vector<std::string> directories_;     // that are to be watched, sorted
  std::map<std::string, Root> roots_;        // that are watched by themselves, by path
  MountTable mounts_;
  std::vector<Mount> mounted_;   // when it was looked last
  bool mounts_changed_ = false;  // since then
  Clock::time_point next_restart_{};
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_SOURCE_H_
