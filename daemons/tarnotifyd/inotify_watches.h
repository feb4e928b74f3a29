// A watch on every directory below some roots.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_WATCHES_H_
#define QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_WATCHES_H_

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnotifyd/change_fold.h"
#include "daemons/tarnotifyd/change_source.h"
#include "daemons/tarnotifyd/directory_scan.h"
#include "daemons/tarnotifyd/watch_tree.h"

namespace quarry::notify {

// Watches directories and finds those below. A directory is watched first and listed then, so
// nothing in it is overlooked. Whatever can take long is done by Work(), a little at a time.
//
// The listing may be ahead of the events: it may find a directory, or another one of the name,
// before the event is read that tells of it. The kernel gives a watched directory one number,
// whatever path it is reached by. A number that is known at two places shows that one of them is
// out of date; that one is then looked at again.
//
// Symbolic links are not followed, and other file systems not entered unless the platform says that
// they are part of the tree. A directory that is seen at two places, because it is mounted at both,
// is watched at one of them only. One thread.
class InotifyWatches {
 public:
  using Id = WatchTree::Id;

  // Names in `ignored` are never watched. Throws Error 502 when the system gives no instance of
  // inotify.
  explicit InotifyWatches(const std::unordered_set<std::string>& ignored);

  // Has the events.
  int Descriptor() const { return inotify_.get(); }
  WatchTree& tree() { return tree_; }

  // Watches a directory and all below it. When that is done it is told as doubtful, unless nothing
  // could be watched.
  Id AddRoot(const std::string& path);
  // The same for a directory that has appeared below another one; it is told as created when that
  // is done, also when it cannot be watched. One that is known already is checked.
  void AddNew(Id parent, const std::string& name, ChangeSink& sink);
  // Looks whether the known directory is the one that now has its path, as it is unless the disk
  // was listed before an event was read. Another one, or one that was not watched, is told as
  // created when it is watched.
  void Check(Id directory, ChangeSink& sink);
  // Whether there is a directory of that name on the disk.
  bool IsThere(Id parent, const std::string& name) const;
  // Ends the watching of a directory and all below it.
  void Remove(Id directory);
  // Something was mounted or unmounted at the known directory, perhaps. If so it is told as
  // doubtful once what is there now is watched.
  void CheckMount(Id directory);
  // The kernel has ended the watch by itself.
  void Lost(Id directory);

  // All events that there were have been handled: what was not found at its path may be found now.
  void LookForMissing();

  // Whether Work() has something to do.
  bool HasWork() const { return !scans_.empty() || !doomed_.empty(); }
  // Does some of it: some milliseconds' worth.
  void Work(ChangeSink& sink);

  // Whether the directory itself is still to be watched.
  bool IsWaiting(Id directory) const;

  // Tries again what could not be watched; places that stay unwatched are told as doubtful now and
  // then. To be called every second or so.
  void Retry(Clock::time_point now, ChangeSink& sink);

  // Adds the roots below which something cannot be watched, and why.
  void ReportUnwatched(std::map<std::string, std::string>* unwatched) const;

 private:
  // A directory to watch, whose children are found by listing it.
  struct Scan {
    WatchTree::Ref directory;
    std::uint32_t job = 0;
  };
  // What is told of the top directory when a number of scans is done.
  enum class Outcome {
    kCreated,
    kCreatedIfNews,
    kDoubtIfNews,
  };
  struct Job {
    WatchTree::Ref top;
    Outcome outcome = Outcome::kCreated;
    bool any_news = false;  // something was watched that was not before, or is no more
    std::size_t left = 0;
  };

  std::uint32_t NewJob(Id top, Outcome outcome);
  void CheckLater(Id directory);
  void AddScan(Id directory, std::uint32_t job);
  void DoLastScan(ChangeSink& sink);
  void DoScan(const Scan& scan, ChangeSink& sink);
  void Watch(const Scan& scan, UniqueFd fd, ChangeSink& sink);
  void EndScan(std::uint32_t job, ChangeSink& sink);
  void CannotOpen(const Scan& scan, int error, ChangeSink& sink);
  void Miss(const Scan& scan);
  void Cover(const Scan& scan);
  void MeetTwin(const Scan& scan, Id twin, const DirectoryId& id, ChangeSink& sink);
  void CannotWatch(const Scan& scan, int error, ChangeSink& sink);
  void Starve(const Scan& scan, const std::string& reason, ChangeSink& sink);
  bool MayEnter(Id directory, const DirectoryId& id) const;
  Id OtherWith(Id directory, int watch, const DirectoryId& id) const;
  bool TakeNumber(Id directory, int watch);
  UniqueFd Open(Id directory, bool to_read) const;
  DirectoryId Identity(Id directory) const;
  void Strip(Id directory);
  void List(const Scan& scan, UniqueFd fd, ChangeSink& sink);
  void Doom(const std::vector<int>& watches);
  void RemoveDoomed();
  void ForgetMended();

  const std::unordered_set<std::string>& ignored_;
  UniqueFd inotify_;
  WatchTree tree_;
  std::vector<Scan> scans_;  // the last one is next
  std::unordered_map<std::uint32_t, Job> jobs_;
  std::uint32_t last_job_ = 0;
  // Each removal is an event, of which the kernel keeps only so many.
  std::unordered_set<int> doomed_;

  std::vector<WatchTree::Ref> missing_;  // there was nothing at the paths of these
  std::vector<WatchTree::Ref> starved_;  // these cannot be watched for now
  // Roots below which there is such a one, why, and in which round of trying that was seen.
  struct Shortage {
    std::string reason;
    std::uint64_t round = 0;
  };
  std::map<std::string, Shortage> unwatched_;
  std::uint64_t round_ = 0;
  bool is_short_ = false;  // of watches, since the last Retry()
  std::chrono::milliseconds pause_{0};
  Clock::time_point next_retry_{};
  Clock::time_point next_doubt_{};
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_WATCHES_H_
