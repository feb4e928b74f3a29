#include "daemons/tarnotifyd/inotify_watches.h"

#include <sys/inotify.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <set>
#include <utility>

#include "common/file_util.h"
#include "daemons/common/log.h"
#include "daemons/common/system_error.h"
#include "fileindex/queue/event.h"

namespace quarry::notify {
namespace {

using std::chrono::milliseconds;

constexpr std::uint32_t kEvents = IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_MODIFY |
                                  IN_CLOSE_WRITE | IN_ATTRIB | IN_ONLYDIR | IN_EXCL_UNLINK;
// What happens to other directories themselves is told by the one above.
constexpr std::uint32_t kRootEvents = IN_DELETE_SELF | IN_MOVE_SELF;

constexpr milliseconds kWorkTime{20};
constexpr std::size_t kRemovedAtATime = 2048;
constexpr milliseconds kFirstRetry{1'000};
constexpr milliseconds kLongestRetry{60'000};
constexpr std::chrono::minutes kDoubtEvery{10};

bool IsGone(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP;
}

bool IsShortage(int error) {
  return error == ENOSPC || error == ENOMEM || error == EMFILE || error == ENFILE;
}

}  // namespace

InotifyWatches::InotifyWatches(const std::unordered_set<std::string>& ignored)
    : ignored_(ignored), inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
  if (!inotify_.valid()) daemon::ThrowSystemError("Cannot use inotify");
}

InotifyWatches::Id InotifyWatches::AddRoot(const std::string& path) {
  const Id root = tree_.AddRoot(path);
  AddScan(root, NewJob(root, true));
  return root;
}

void InotifyWatches::AddNew(Id parent, const std::string& name, ChangeSink& sink) {
  if (tree_.Child(parent, name) != WatchTree::kNone) return;
  const Id directory = tree_.AddChild(parent, name);
  AddScan(directory, NewJob(directory, false));
  // At once: events of directories that have been renamed since are told by their right paths only
  // if what they are about is known.
  DoLastScan(sink);
}

void InotifyWatches::AddAgain(Id directory) {
  AddScan(directory, NewJob(directory, false));
}

void InotifyWatches::Remove(Id directory) {
  std::vector<int> watches;
  tree_.Remove(directory, &watches);
  Doom(watches);
}

void InotifyWatches::Lost(Id directory) {
  tree_.SetWatch(directory, -1);
}

void InotifyWatches::Doom(const std::vector<int>& watches) {
  doomed_.insert(watches.begin(), watches.end());
}

void InotifyWatches::RemoveDoomed() {
  for (std::size_t i = 0; i < kRemovedAtATime && !doomed_.empty(); ++i) {
    // The kernel may have removed it already.
    inotify_rm_watch(inotify_.get(), *doomed_.begin());
    doomed_.erase(doomed_.begin());
  }
}

void InotifyWatches::Work(ChangeSink& sink) {
  const auto end = Clock::now() + kWorkTime;
  while (!scans_.empty() && Clock::now() < end) DoLastScan(sink);
  RemoveDoomed();
}

std::uint32_t InotifyWatches::NewJob(Id top, bool is_doubt) {
  Job& job = jobs_[++last_job_];
  job.top = tree_.RefTo(top);
  job.is_doubt = is_doubt;
  return last_job_;
}

void InotifyWatches::AddScan(Id directory, std::uint32_t job) {
  ++jobs_[job].left;
  scans_.push_back({tree_.RefTo(directory), job});
}

void InotifyWatches::DoLastScan(ChangeSink& sink) {
  const Scan scan = scans_.back();
  scans_.pop_back();
  DoScan(scan, sink);
  EndScan(scan.job, sink);
}

void InotifyWatches::DoScan(const Scan& scan, ChangeSink& sink) {
  if (!tree_.IsAlive(scan.directory)) return;
  // One refusal is enough: a try costs as much as a success.
  if (is_short_) return Starve(scan, ENOSPC, sink);
  UniqueFd fd = OpenDirectory(tree_.Path(scan.directory.id), true);
  if (!fd.valid()) return CannotOpen(scan, errno, sink);
  Watch(scan, std::move(fd), sink);
}

// The very directory that is listed is watched, whatever has its path by now.
void InotifyWatches::Watch(const Scan& scan, UniqueFd fd, ChangeSink& sink) {
  const Id directory = scan.directory.id;
  DirectoryId id;
  if (!Identify(fd.get(), &id) || !MayEnter(directory, id)) return;
  const std::string self = "/proc/self/fd/" + std::to_string(fd.get());
  const bool is_root = tree_.Parent(directory) == WatchTree::kNone;
  const int watch =
      inotify_add_watch(inotify_.get(), self.c_str(), kEvents | (is_root ? kRootEvents : 0U));
  if (watch < 0) return CannotWatch(scan, errno, sink);
  if (!TakeNumber(directory, watch, id)) return;
  jobs_[scan.job].any_watched = true;
  List(directory, std::move(fd), scan.job);
}

// A directory that may not be read cannot be watched either, and nothing in it be indexed.
void InotifyWatches::CannotOpen(const Scan& scan, int error, ChangeSink& sink) {
  const Id directory = scan.directory.id;
  if (IsShortage(error)) return Starve(scan, error, sink);
  if (IsGone(error) && tree_.Parent(directory) != WatchTree::kNone) Remove(directory);
}

void InotifyWatches::CannotWatch(const Scan& scan, int error, ChangeSink& sink) {
  if (IsShortage(error)) return Starve(scan, error, sink);
  daemon::LogWarning("Cannot watch " + tree_.Path(scan.directory.id) + ": " + std::strerror(error));
}

void InotifyWatches::Starve(const Scan& scan, int error, ChangeSink& sink) {
  is_short_ = true;
  starved_.push_back(scan.directory);
  if (was_short_) return;
  was_short_ = true;
  const std::string root = tree_.Path(tree_.RootOf(scan.directory.id));
  daemon::LogError("Not all directories below " + root + " can be watched: " +
                   (error == ENOSPC ? "the limit fs.inotify.max_user_watches is reached"
                                    : std::strerror(error)) +
                   ". What changes in the others is found later");
  next_doubt_ = Clock::now() + kDoubtEvery;
  sink.OnDoubt(root);
}

bool InotifyWatches::MayEnter(Id directory, const DirectoryId& id) const {
  return !id.is_mount || tree_.Parent(directory) == WatchTree::kNone ||
         !IsMountPoint(tree_.Path(directory));
}

// Notes the number that the kernel has given to the directory. False when it cannot be the
// directory's alone.
bool InotifyWatches::TakeNumber(Id directory, int watch, const DirectoryId& id) {
  const Id other = tree_.FindWatch(watch);
  if (other != WatchTree::kNone && other != directory) {
    const UniqueFd there = OpenDirectory(tree_.Path(other), false);
    DirectoryId other_id;
    // Mounted at two places: the first one will do.
    if (there.valid() && Identify(there.get(), &other_id) && other_id.device == id.device &&
        other_id.inode == id.inode) {
      return false;
    }
    const WatchTree::Ref self = tree_.RefTo(directory);
    std::vector<int> watches;
    tree_.RemoveChildren(other, &watches);
    tree_.SetWatch(other, -1);
    Doom(watches);
    if (tree_.Parent(other) != WatchTree::kNone) AddAgain(other);
    // It was below the other one: then it will be found again with that.
    if (!tree_.IsAlive(self)) return false;
  }
  doomed_.erase(watch);
  const int before = tree_.Watch(directory);
  if (before >= 0 && before != watch) doomed_.insert(before);
  tree_.SetWatch(directory, watch);
  return true;
}

void InotifyWatches::List(Id directory, UniqueFd fd, std::uint32_t job) {
  ForEachSubdirectory(std::move(fd), [&](const char* name) {
    if (ignored_.count(name) > 0 || tree_.Child(directory, name) != WatchTree::kNone) return;
    AddScan(tree_.AddChild(directory, name), job);
  });
}

void InotifyWatches::EndScan(std::uint32_t job, ChangeSink& sink) {
  const auto found = jobs_.find(job);
  if (--found->second.left > 0) return;
  const Job done = found->second;
  jobs_.erase(found);
  if (!tree_.IsAlive(done.top)) return;
  const std::string path = tree_.Path(done.top.id);
  if (!done.is_doubt) {
    sink.OnChange({fileindex::EVENT_CREATE, true, false, path, ""});
  } else if (done.any_watched) {
    sink.OnDoubt(path);
  }
}

bool InotifyWatches::IsWaiting(Id directory) const {
  const auto is_it = [&](const WatchTree::Ref& ref) {
    return ref.id == directory && tree_.IsAlive(ref);
  };
  return std::any_of(starved_.begin(), starved_.end(), is_it) ||
         std::any_of(scans_.begin(), scans_.end(),
                     [&](const Scan& scan) { return is_it(scan.directory); });
}

void InotifyWatches::DoubtStarved(ChangeSink& sink) const {
  std::set<std::string> roots;
  for (const WatchTree::Ref& directory : starved_) {
    if (tree_.IsAlive(directory)) roots.insert(tree_.Path(tree_.RootOf(directory.id)));
  }
  for (const std::string& root : roots) sink.OnDoubt(root);
}

void InotifyWatches::Retry(Clock::time_point now, ChangeSink& sink) {
  if (starved_.empty()) {
    if (was_short_ && scans_.empty()) {
      daemon::LogInfo("All directories are watched");
      was_short_ = is_short_ = false;
      pause_ = milliseconds(0);
    }
    return;
  }
  if (now >= next_doubt_) {
    next_doubt_ = now + kDoubtEvery;
    DoubtStarved(sink);
  }
  if (now < next_retry_) return;
  pause_ = std::clamp(2 * pause_, kFirstRetry, kLongestRetry);
  next_retry_ = now + pause_;
  is_short_ = false;
  std::unordered_map<Id, std::uint32_t> job_of_root;
  for (const WatchTree::Ref& directory : std::exchange(starved_, {})) {
    if (!tree_.IsAlive(directory)) continue;
    const Id root = tree_.RootOf(directory.id);
    const auto [job, is_new] = job_of_root.try_emplace(root, 0);
    if (is_new) job->second = NewJob(root, true);
    AddScan(directory.id, job->second);
  }
}

}  // namespace quarry::notify
