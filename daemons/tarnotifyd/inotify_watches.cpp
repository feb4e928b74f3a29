#include "daemons/tarnotifyd/inotify_watches.h"

#include <sys/inotify.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include "common/file_util.h"
#include "daemons/common/log.h"
#include "daemons/common/system_error.h"
#include "fileindex/queue/event.h"

namespace quarry::notify {
namespace {

using std::chrono::milliseconds;

constexpr std::uint32_t kEvents = IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_MODIFY |
                                  IN_CLOSE_WRITE | IN_ATTRIB | IN_ONLYDIR | IN_EXCL_UNLINK |
                                  IN_MASK_ADD;
// What happens to other directories themselves is told by the one above.
constexpr std::uint32_t kRootEvents = IN_DELETE_SELF | IN_MOVE_SELF;

constexpr milliseconds kWorkTime{20};
constexpr std::size_t kRemovedAtATime = 2048;
constexpr milliseconds kFirstRetry{1'000};
constexpr milliseconds kLongestRetry{60'000};
constexpr std::chrono::minutes kDoubtEvery{10};

constexpr char kLimitReached[] = "the limit fs.inotify.max_user_watches is reached";

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
  AddScan(root, NewJob(root, Outcome::kDoubtIfNews));
  return root;
}

void InotifyWatches::AddNew(Id parent, const std::string& name, ChangeSink& sink) {
  const Id known = tree_.Child(parent, name);
  if (known != WatchTree::kNone) return Check(known, sink);
  const Id directory = tree_.AddChild(parent, name);
  AddScan(directory, NewJob(directory, Outcome::kCreated));
  // At once: events of directories that have been renamed since are told by their right paths only
  // if what they are about is known.
  DoLastScan(sink);
}

void InotifyWatches::Check(Id directory, ChangeSink& sink) {
  CheckLater(directory);
  DoLastScan(sink);
}

void InotifyWatches::CheckLater(Id directory) {
  AddScan(directory, NewJob(directory, Outcome::kCreatedIfNews));
}

void InotifyWatches::CheckMount(Id directory) {
  AddScan(directory, NewJob(directory, Outcome::kDoubtIfNews));
}

void InotifyWatches::Remove(Id directory) {
  std::vector<int> watches;
  if (tree_.Parent(directory) == WatchTree::kNone) unwatched_.erase(tree_.Path(directory));
  tree_.Remove(directory, &watches);
  Doom(watches);
}

void InotifyWatches::Lost(Id directory) {
  tree_.SetWatch(directory, -1);
  // Of a root its owner finds it. That of another one is news whatever is at its path now.
  if (tree_.Parent(directory) != WatchTree::kNone) {
    AddScan(directory, NewJob(directory, Outcome::kCreated));
  }
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

std::uint32_t InotifyWatches::NewJob(Id top, Outcome outcome) {
  Job& job = jobs_[++last_job_];
  job.top = tree_.RefTo(top);
  job.outcome = outcome;
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
  if (is_short_) return CannotWatch(scan, ENOSPC, sink);
  UniqueFd fd = Open(scan.directory.id, true);
  if (!fd.valid()) return CannotOpen(scan, errno, sink);
  Watch(scan, std::move(fd), sink);
}

// The very directory that is listed is watched, whatever has its path by now.
void InotifyWatches::Watch(const Scan& scan, UniqueFd fd, ChangeSink& sink) {
  const Id directory = scan.directory.id;
  DirectoryId id;
  if (!Identify(fd.get(), &id)) return CannotWatch(scan, errno, sink);
  if (!MayEnter(directory, id)) return Cover(scan);
  const std::string self = "/proc/self/fd/" + std::to_string(fd.get());
  const bool is_root = tree_.Parent(directory) == WatchTree::kNone;
  const int watch =
      inotify_add_watch(inotify_.get(), self.c_str(), kEvents | (is_root ? kRootEvents : 0U));
  if (watch < 0) return CannotWatch(scan, errno, sink);
  // What is below it is known, or is just being listed.
  if (watch == tree_.Watch(directory)) return;
  const Id twin = OtherWith(directory, watch, id);
  if (twin != WatchTree::kNone) return MeetTwin(scan, twin, id, sink);
  if (!TakeNumber(directory, watch)) return Miss(scan);
  jobs_[scan.job].any_news = true;
  List(scan, std::move(fd), sink);
}

// A directory that may not be read cannot be watched either, and nothing in it be indexed.
void InotifyWatches::CannotOpen(const Scan& scan, int error, ChangeSink& sink) {
  if (IsGone(error)) return Miss(scan);
  if (error != EACCES) CannotWatch(scan, error, sink);
}

// Something is mounted over it that is not part of the tree.
void InotifyWatches::Cover(const Scan& scan) {
  if (tree_.Watch(scan.directory.id) < 0 && !tree_.HasChildren(scan.directory.id)) return;
  Strip(scan.directory.id);
  jobs_[scan.job].any_news = true;
}

// It was there when the one above it, which is watched, was listed, or told of. So there are events
// still to come that tell of its end, or of another path of it or of one above it.
void InotifyWatches::Miss(const Scan& scan) {
  missing_.push_back(scan.directory);
  Job& job = jobs_[scan.job];
  if (job.top.id == scan.directory.id && job.outcome == Outcome::kCreated) {
    job.outcome = Outcome::kCreatedIfNews;
  }
}

void InotifyWatches::LookForMissing() {
  for (const WatchTree::Ref& directory : std::exchange(missing_, {})) {
    // Of a root its owner finds it.
    if (tree_.IsAlive(directory) && tree_.Parent(directory.id) != WatchTree::kNone) {
      CheckLater(directory.id);
    }
  }
}

void InotifyWatches::CannotWatch(const Scan& scan, int error, ChangeSink& sink) {
  if (IsShortage(error)) is_short_ = true;
  if (error == ENOSPC) return Starve(scan, kLimitReached, sink);
  Starve(scan, tree_.Path(scan.directory.id) + ": " + std::strerror(error), sink);
}

void InotifyWatches::Starve(const Scan& scan, const std::string& reason, ChangeSink& sink) {
  starved_.push_back(scan.directory);
  const std::string root = tree_.Path(tree_.RootOf(scan.directory.id));
  if (unwatched_.empty()) next_doubt_ = Clock::now() + kDoubtEvery;
  const auto [shortage, is_new] = unwatched_.try_emplace(root);
  shortage->second = {reason, round_};
  if (!is_new) return;
  daemon::LogError("Not all directories below " + root + " can be watched: " + reason +
                   ". What changes in the others is found later");
  sink.OnDoubt(root);
}

bool InotifyWatches::MayEnter(Id directory, const DirectoryId& id) const {
  return !id.is_mount || tree_.Parent(directory) == WatchTree::kNone ||
         !IsMountPoint(tree_.Path(directory));
}

// Which other directory has the number, and has not moved; kNone when there is none.
InotifyWatches::Id InotifyWatches::OtherWith(Id directory, int watch, const DirectoryId& id) const {
  const Id other = tree_.FindWatch(watch);
  if (other == WatchTree::kNone || other == directory) return WatchTree::kNone;
  const DirectoryId there = Identity(other);
  return there.device == id.device && there.inode == id.inode ? other : WatchTree::kNone;
}

// It is mounted at two places, or was found where it is only by a path that is out of date. Events
// will tell of the latter, but not of what a root is below.
void InotifyWatches::MeetTwin(const Scan& scan, Id twin, const DirectoryId& id, ChangeSink& sink) {
  const Id directory = scan.directory.id;
  const bool is_root = tree_.Parent(directory) == WatchTree::kNone;
  if (!is_root && Identity(twin).mount == id.mount) return Miss(scan);
  Cover(scan);
  Starve(scan, tree_.Path(directory) + " is the same directory as " + tree_.Path(twin), sink);
}

// Notes the number that the kernel has given to the directory, and takes it from the one that had
// it. False when the directory is not known any more.
bool InotifyWatches::TakeNumber(Id directory, int watch) {
  const Id other = tree_.FindWatch(watch);
  if (other != WatchTree::kNone) {
    const WatchTree::Ref self = tree_.RefTo(directory);
    Strip(other);
    if (tree_.Parent(other) != WatchTree::kNone) CheckLater(other);
    // It was below the other one: then it will be found again with that.
    if (!tree_.IsAlive(self)) return false;
  }
  Strip(directory);
  doomed_.erase(watch);
  tree_.SetWatch(directory, watch);
  return true;
}

// What is a link on the way there was no link when it was listed.
UniqueFd InotifyWatches::Open(Id directory, bool to_read) const {
  return OpenBelow(tree_.Path(tree_.RootOf(directory)), tree_.Path(directory), to_read);
}

bool InotifyWatches::IsThere(Id parent, const std::string& name) const {
  const std::string path = tree_.Path(parent) + "/" + name;
  return OpenBelow(tree_.Path(tree_.RootOf(parent)), path, false).valid();
}

// Of what has its path now; of nothing the empty one.
DirectoryId InotifyWatches::Identity(Id directory) const {
  const UniqueFd fd = Open(directory, false);
  DirectoryId there;
  return fd.valid() && Identify(fd.get(), &there) ? there : DirectoryId();
}

// What has the directory's path is another one than it was thought to be.
void InotifyWatches::Strip(Id directory) {
  std::vector<int> watches;
  tree_.RemoveChildren(directory, &watches);
  if (tree_.Watch(directory) >= 0) watches.push_back(tree_.Watch(directory));
  tree_.SetWatch(directory, -1);
  Doom(watches);
}

void InotifyWatches::List(const Scan& scan, UniqueFd fd, ChangeSink& sink) {
  const Id directory = scan.directory.id;
  const bool is_whole = ForEachSubdirectory(std::move(fd), [&](const char* name) {
    if (ignored_.count(name) > 0 || tree_.Child(directory, name) != WatchTree::kNone) return;
    AddScan(tree_.AddChild(directory, name), scan.job);
  });
  if (is_whole) return;
  const int error = errno;
  Strip(directory);
  CannotWatch(scan, error, sink);
}

void InotifyWatches::EndScan(std::uint32_t job, ChangeSink& sink) {
  const auto found = jobs_.find(job);
  if (--found->second.left > 0) return;
  const Job done = found->second;
  jobs_.erase(found);
  if (!tree_.IsAlive(done.top)) return;
  const std::string path = tree_.Path(done.top.id);
  if (done.outcome != Outcome::kCreated && !done.any_news) return;
  if (done.outcome == Outcome::kDoubtIfNews) return sink.OnDoubt(path);
  sink.OnChange({fileindex::EVENT_CREATE, true, false, path, ""});
}

bool InotifyWatches::IsWaiting(Id directory) const {
  const auto is_it = [&](const WatchTree::Ref& ref) {
    return ref.id == directory && tree_.IsAlive(ref);
  };
  return std::any_of(starved_.begin(), starved_.end(), is_it) ||
         std::any_of(scans_.begin(), scans_.end(),
                     [&](const Scan& scan) { return is_it(scan.directory); });
}

void InotifyWatches::ReportUnwatched(std::map<std::string, std::string>* unwatched) const {
  for (const auto& [root, shortage] : unwatched_) unwatched->emplace(root, shortage.reason);
}

// Nothing is being tried: what lacks something was seen to lack it in this round.
void InotifyWatches::ForgetMended() {
  const auto mended =
      std::erase_if(unwatched_, [this](const auto& entry) { return entry.second.round != round_; });
  if (!unwatched_.empty()) return;
  pause_ = milliseconds(0);
  if (mended > 0) daemon::LogInfo("All directories are watched");
}

void InotifyWatches::Retry(Clock::time_point now, ChangeSink& sink) {
  if (scans_.empty()) ForgetMended();
  if (starved_.empty()) return;
  if (now >= next_doubt_) {
    next_doubt_ = now + kDoubtEvery;
    for (const auto& [root, shortage] : unwatched_) sink.OnDoubt(root);
  }
  if (now < next_retry_) return;
  pause_ = std::clamp(2 * pause_, kFirstRetry, kLongestRetry);
  next_retry_ = now + pause_;
  is_short_ = false;
  ++round_;
  std::unordered_map<Id, std::uint32_t> job_of_root;
  for (const WatchTree::Ref& directory : std::exchange(starved_, {})) {
    if (!tree_.IsAlive(directory)) continue;
    const Id root = tree_.RootOf(directory.id);
    const auto [job, is_new] = job_of_root.try_emplace(root, 0);
    if (is_new) job->second = NewJob(root, Outcome::kDoubtIfNews);
    AddScan(directory.id, job->second);
  }
}

}  // namespace quarry::notify
