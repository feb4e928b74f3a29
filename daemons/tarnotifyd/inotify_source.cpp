#include "daemons/tarnotifyd/inotify_source.h"

#include <sys/epoll.h>
#include <sys/inotify.h>
#include <sys/timerfd.h>

#include <algorithm>
#include <cerrno>
#include <set>
#include <string_view>
#include <utility>

#include "common/error.h"
#include "common/file_util.h"
#include "daemons/common/log.h"
#include "daemons/common/system_error.h"
#include "fileindex/queue/event.h"

namespace quarry::notify {
namespace {

using namespace fileindex;

constexpr int kEventsAtATime = 4096;
constexpr std::chrono::minutes kRestartPause{1};

Change MakeChange(std::uint32_t kind, const InotifyEvent& event, std::string path) {
  const bool in_progress = (event.mask & (IN_MODIFY | IN_CLOSE_WRITE)) == IN_MODIFY;
  return {kind, (event.mask & IN_ISDIR) != 0, in_progress, std::move(path), ""};
}

bool Watch(int poll_fd, int fd) {
  epoll_event event{};
  event.events = EPOLLIN;
  return epoll_ctl(poll_fd, EPOLL_CTL_ADD, fd, &event) == 0;
}

// Nothing when there is no directory that could be opened.
bool IdentifyPath(const std::string& path, DirectoryId* id) {
  const UniqueFd fd = OpenDirectory(path);
  return fd.valid() && Identify(fd.get(), id);
}

}  // namespace

InotifySource::InotifySource()
    : timer_(timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC)),
      poll_fd_(epoll_create1(EPOLL_CLOEXEC)) {
  if (!timer_.valid() || !poll_fd_.valid() || !notify::Watch(poll_fd_.get(), timer_.get())) {
    daemon::ThrowSystemError("Cannot wait for inotify");
  }
  mounted_ = mounts_.Read();
  Restart();
}

// Everything is forgotten; FollowRoots() begins anew.
void InotifySource::Restart() {
  events_.Clear();
  roots_.clear();
  watches_.reset();  // first, since instances are few
  auto watches = std::make_unique<InotifyWatches>(ignore_);
  if (!notify::Watch(poll_fd_.get(), watches->Descriptor())) {
    daemon::ThrowSystemError("Cannot wait for inotify");
  }
  watches_ = std::move(watches);
}

// What is watched is doubtful once it is watched again, and what is not there any more at once.
void InotifySource::BeginAnew(ChangeSink& sink) {
  const std::map<std::string, Root> before = roots_;
  Restart();
  FollowRoots(sink);
  for (const auto& [path, root] : before) {
    if (roots_.count(path) == 0) sink.OnDoubt(path);
  }
}

void InotifySource::ArmTimer() {
  itimerspec when{};
  const auto due = events_.NextDue();
  if (watches_ && watches_->HasWork()) {
    when.it_value.tv_nsec = 1;
  } else if (due) {
    const auto left =
        std::max(std::chrono::nanoseconds(1), std::chrono::nanoseconds(*due - Clock::now()));
    // Patience is far below a second.
    when.it_value.tv_nsec = std::min<long>(999'999'999, static_cast<long>(left.count()));
  }
  timerfd_settime(timer_.get(), 0, &when, nullptr);
}

void InotifySource::Read(ChangeSink& sink) {
  if (!watches_) return;
  events_.Fill(watches_->Descriptor(), Clock::now());
  if (!HandleEvents(sink)) {
    daemon::LogWarning("The kernel has lost events; looking at everything anew");
    BeginAnew(sink);
  }
  watches_->Work(sink);
  ArmTimer();
}

// False when the kernel has lost events.
bool InotifySource::HandleEvents(ChangeSink& sink) {
  for (int i = 0; i < kEventsAtATime; ++i) {
    const auto event = events_.Next(Clock::now());
    if (!event) {
      if (i > 0) watches_->LookForMissing();
      return true;
    }
    if ((event->mask & IN_Q_OVERFLOW) != 0) return false;
    Handle(*event, sink);
  }
  return true;
}

void InotifySource::Handle(const InotifyEvent& event, ChangeSink& sink) {
  const Id directory = watches_->tree().FindWatch(event.watch);
  // Not watched any more. The other half of a move stands for itself then.
  if (directory == WatchTree::kNone) return;
  if (event.name.empty()) return HandleSelf(directory, event, sink);
  if (ignore_.count(event.name) == 0) HandleEntry(directory, event, sink);
}

// What other directories than roots are told about themselves their parents are told too.
void InotifySource::HandleSelf(Id directory, const InotifyEvent& event, ChangeSink& sink) {
  const bool is_root = watches_->tree().Parent(directory) == WatchTree::kNone;
  const std::string path = watches_->tree().Path(directory);
  if ((event.mask & IN_IGNORED) != 0) {
    watches_->Lost(directory);
  } else if (is_root && (event.mask & IN_ATTRIB) != 0) {
    sink.OnChange({EVENT_ATTR, true, false, path, ""});
  } else if (is_root && (event.mask & (IN_DELETE_SELF | IN_MOVE_SELF)) != 0) {
    DropRoot(path);
    sink.OnChange({EVENT_DELETE, true, false, path, ""});
  }
}

void InotifySource::HandleEntry(Id directory, const InotifyEvent& event, ChangeSink& sink) {
  if ((event.mask & (IN_CREATE | IN_MOVED_TO)) != 0) {
    Appear(directory, event, sink);
  } else if ((event.mask & IN_DELETE) != 0) {
    Vanish(directory, event, sink);
  } else if ((event.mask & IN_MOVED_FROM) != 0) {
    HandleDeparture(directory, event, sink);
  } else if ((event.mask & (IN_MODIFY | IN_CLOSE_WRITE)) != 0) {
    sink.OnChange(MakeChange(EVENT_MODIFY, event, PathOf(directory, event.name)));
  } else if ((event.mask & IN_ATTRIB) != 0) {
    ChangeAttributes(directory, event, sink);
  }
}

void InotifySource::Appear(Id directory, const InotifyEvent& event, ChangeSink& sink) {
  if ((event.mask & IN_ISDIR) != 0) return watches_->AddNew(directory, event.name, sink);
  sink.OnChange(MakeChange(EVENT_CREATE, event, PathOf(directory, event.name)));
}

void InotifySource::Vanish(Id directory, const InotifyEvent& event, ChangeSink& sink) {
  sink.OnChange(MakeChange(EVENT_DELETE, event, PathOf(directory, event.name)));
  if ((event.mask & IN_ISDIR) == 0) return;
  const Id child = watches_->tree().Child(directory, event.name);
  if (child != WatchTree::kNone) watches_->Remove(child);
  // Of two directories that change places the one that comes is told first.
  if ((event.mask & IN_MOVED_FROM) != 0) AddIfThere(directory, event.name, sink);
}

// A directory may have become one that can be read.
void InotifySource::ChangeAttributes(Id directory, const InotifyEvent& event, ChangeSink& sink) {
  sink.OnChange(MakeChange(EVENT_ATTR, event, PathOf(directory, event.name)));
  if ((event.mask & IN_ISDIR) == 0) return;
  const Id child = watches_->tree().Child(directory, event.name);
  if (child != WatchTree::kNone && watches_->tree().Watch(child) < 0) watches_->Check(child, sink);
}

void InotifySource::HandleDeparture(Id directory, const InotifyEvent& event, ChangeSink& sink) {
  const auto arrival = events_.TakeArrival(event.cookie);
  const Id to = arrival ? watches_->tree().FindWatch(arrival->watch) : WatchTree::kNone;
  if (to == WatchTree::kNone || ignore_.count(arrival->name) > 0) {
    return Vanish(directory, event, sink);
  }
  Move(directory, event.name, to, *arrival, sink);
}

void InotifySource::Move(Id from, const std::string& old_name, Id to, const InotifyEvent& arrival,
                         ChangeSink& sink) {
  Change change = MakeChange(EVENT_RENAME, arrival, PathOf(to, arrival.name));
  change.path_old = PathOf(from, old_name);
  sink.OnChange(change);
  if (change.is_dir) MoveDirectory(from, old_name, to, arrival.name, sink);
}

void InotifySource::MoveDirectory(Id from, const std::string& old_name, Id to,
                                  const std::string& new_name, ChangeSink& sink) {
  WatchTree& tree = watches_->tree();
  const Id moved = tree.Child(from, old_name);
  const Id replaced = tree.Child(to, new_name);
  const WatchTree::Ref source = tree.RefTo(from);
  const bool is_known = moved != WatchTree::kNone && tree.Watch(moved) >= 0;
  if (is_known && replaced == WatchTree::kNone && !tree.IsAtOrBelow(to, moved)) {
    tree.Move(moved, to, new_name);
    watches_->Check(moved, sink);
  } else {
    // An empty directory was replaced, or two have changed places, or the disk was listed after the
    // move.
    ReplaceDirectory(moved, to, new_name, sink);
  }
  // Of two that change places the other one has come already.
  if (tree.IsAlive(source)) AddIfThere(from, old_name, sink);
}

// Forgets what was known of both and looks at the place anew.
void InotifySource::ReplaceDirectory(Id moved, Id to, const std::string& name, ChangeSink& sink) {
  WatchTree& tree = watches_->tree();
  const WatchTree::Ref target = tree.RefTo(to);
  if (moved != WatchTree::kNone) watches_->Remove(moved);
  if (!tree.IsAlive(target)) return;
  const Id replaced = tree.Child(to, name);
  if (replaced != WatchTree::kNone) watches_->Remove(replaced);
  watches_->AddNew(to, name, sink);
}

void InotifySource::AddIfThere(Id directory, const std::string& name, ChangeSink& sink) {
  if (watches_->IsThere(directory, name)) watches_->AddNew(directory, name, sink);
}

std::string InotifySource::PathOf(Id directory, const std::string& name) const {
  return watches_->tree().Path(directory) + "/" + name;
}

void InotifySource::SetDirectories(const std::vector<std::string>& directories,
                                   const std::vector<std::string>& ignore, ChangeSink& sink) {
  std::vector<std::string> sorted = directories;
  std::sort(sorted.begin(), sorted.end());
  sorted.erase(std::unique(sorted.begin(), sorted.end()), sorted.end());
  const std::vector<std::string> before = std::exchange(directories_, std::move(sorted));
  std::unordered_set<std::string> ignored(ignore.begin(), ignore.end());
  const bool same_ignored = ignored == ignore_;
  ignore_ = std::move(ignored);
  if (same_ignored && watches_) {
    DoubtCovered(before, sink);
    FollowRoots(sink);
  } else {
    BeginAnew(sink);
  }
  ArmTimer();
}

// Directories that are new to be watched, but lie in one that is watched already. Of those in one
// that is new itself the doubt about that one tells.
void InotifySource::DoubtCovered(const std::vector<std::string>& before, ChangeSink& sink) const {
  for (const std::string& path : directories_) {
    if (std::binary_search(before.begin(), before.end(), path)) continue;
    if (std::binary_search(before.begin(), before.end(), Above(path))) sink.OnDoubt(path);
  }
}

// The directory that is to be watched of which this one is a part, the nearest one; "" when it is
// to be watched by itself.
std::string InotifySource::Above(const std::string& path) const {
  std::size_t end = path.rfind('/');
  while (end != std::string::npos && end > 0) {
    const std::size_t next = path.find('/', end + 1);
    if (ignore_.count(path.substr(end + 1, next - end - 1)) > 0) return {};
    std::string above = path.substr(0, end);
    if (std::binary_search(directories_.begin(), directories_.end(), above)) return above;
    end = path.rfind('/', end - 1);
  }
  return {};
}

void InotifySource::Refresh(ChangeSink& sink) {
  if (!watches_ && !TakeInstance()) return;
  FollowRoots(sink);
  FollowMounts();
  watches_->Retry(Clock::now(), sink);
  ArmTimer();
}

// A failure puts everything in doubt, so there is not one every second.
bool InotifySource::TakeInstance() {
  const auto now = Clock::now();
  if (now < next_restart_) return false;
  next_restart_ = now + kRestartPause;
  Restart();
  return true;
}

void InotifySource::Report(SourceReport* report) const {
  if (report->kind.empty()) report->kind = "inotify";
  if (watches_) {
    report->directories += watches_->tree().Watches();
    return watches_->ReportUnwatched(&report->unwatched);
  }
  for (const std::string& path : directories_) {
    report->unwatched.emplace(path, "the system gives no instance of inotify");
  }
}

void InotifySource::FollowRoots(ChangeSink& sink) {
  for (auto root = roots_.begin(); root != roots_.end();) {
    const std::string path = (root++)->first;
    if (!std::binary_search(directories_.begin(), directories_.end(), path)) DropRoot(path);
  }
  for (const std::string& path : directories_) FollowRoot(path, sink);
}

// The directory may have come, gone, or be another one than it was: its disk, or one above it, was
// mounted or unmounted.
void InotifySource::FollowRoot(const std::string& path, ChangeSink& sink) {
  DirectoryId now;
  const bool exists = IdentifyPath(path, &now);
  if (!exists && !IsGone(errno)) return;  // for want of descriptors, for instance
  const bool is_wanted = exists && (Above(path).empty() || (now.is_mount && IsMountPoint(path)));
  const auto root = roots_.find(path);
  const bool is_known = root != roots_.end();
  if (is_known) {
    if (is_wanted && IsAsWatched(root->second, now)) return;
    DropRoot(path);
    if (!exists) sink.OnChange({EVENT_DELETE, true, false, path, ""});
  }
  if (is_wanted) roots_[path] = {watches_->tree().RefTo(watches_->AddRoot(path)), now};
  // A part of another one, from now on or until now.
  if (is_known != is_wanted) FollowMount(path);
}

bool InotifySource::IsAsWatched(const Root& root, const DirectoryId& now) const {
  const Id directory = root.directory.id;
  return root.id == now &&
         (watches_->tree().Watch(directory) >= 0 || watches_->IsWaiting(directory));
}

// Of what was there and what is there now, since the same path may have another mount by now.
void InotifySource::FollowMounts() {
  if (mounts_.HasChanged()) mounts_changed_ = true;  // which it says only once
  if (!mounts_changed_) return;
  std::set<std::string> paths;
  for (const Mount& mount : mounted_) paths.insert(mount.path);
  mounted_ = mounts_.Read();
  for (const Mount& mount : mounted_) paths.insert(mount.path);
  mounts_changed_ = false;
  for (const std::string& path : paths) FollowMount(path);
}

// Roots are looked at all the time; this is about what is below them.
void InotifySource::FollowMount(const std::string& path) {
  for (const auto& [top, root] : roots_) {
    const Id directory = watches_->tree().Descendant(root.directory.id, path);
    if (directory != root.directory.id && directory != WatchTree::kNone) {
      watches_->CheckMount(directory);
    }
  }
}

void InotifySource::DropRoot(const std::string& path) {
  const auto root = roots_.find(path);
  watches_->Remove(root->second.directory.id);
  roots_.erase(root);
}

}  // namespace quarry::notify
