#include "daemons/tarnotifyd/marked_file_system.h"

#include <fcntl.h>
#include <sys/fanotify.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <fstream>
#include <optional>

#include "common/error.h"
#include "daemons/common/system_error.h"

namespace quarry::notify {
namespace {

constexpr unsigned int kGroup = FAN_CLASS_NOTIF | FAN_CLOEXEC | FAN_NONBLOCK;
constexpr std::uint64_t kChanges =
    FAN_CREATE | FAN_DELETE | FAN_ATTRIB | FAN_MODIFY | FAN_CLOSE_WRITE | FAN_ONDIR;

// Some hundred events, delivered at once, and some ten thousand, taken in hand at a time.
constexpr std::size_t kBufferSize = std::size_t{64} << 10;
constexpr std::size_t kAtATime = std::size_t{4} << 20;

UniqueFd MakeGroup(MoveReports reports) {
  const unsigned int names =
      reports == MoveReports::kRenames ? FAN_REPORT_DFID_NAME_TARGET : FAN_REPORT_DFID_NAME;
  return UniqueFd(fanotify_init(kGroup | names, O_RDONLY | O_CLOEXEC));
}

bool Mark(int group, int directory, MoveReports reports) {
  const std::uint64_t moves =
      reports == MoveReports::kRenames ? FAN_RENAME : FAN_MOVED_FROM | FAN_MOVED_TO;
  return fanotify_mark(group, FAN_MARK_ADD | FAN_MARK_FILESYSTEM, kChanges | moves, directory,
                       ".") == 0;
}

UniqueFd MakeMarkedGroup(int directory, MoveReports reports) {
  UniqueFd group = MakeGroup(reports);
  if (!group.valid()) daemon::ThrowSystemError("Cannot use fanotify");
  if (!Mark(group.get(), directory, reports)) {
    daemon::ThrowSystemError("Cannot watch the file system");
  }
  return group;
}

dev_t DeviceOf(int directory) {
  struct stat status {};
  if (fstat(directory, &status) != 0) daemon::ThrowSystemError("Cannot look at a directory");
  return status.st_dev;
}

// Whether errno speaks of rights rather than of the file system that was tried.
bool IsForbidden() {
  return errno == EPERM || errno == EACCES || errno == ENOSYS;
}

// An ordinary process gets a group, too, but can do nothing with it that is of use here.
void RequireRights(int group, MoveReports reports) {
  const UniqueFd top(open("/", O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!top.valid()) daemon::ThrowSystemError("Cannot open /");
  if (!Mark(group, top.get(), reports) && IsForbidden()) {
    daemon::ThrowSystemError("Cannot use fanotify");
  }
  MountedDirectories directories(DeviceOf(top.get()));
  directories.AddEntrance("/");
  const std::optional<DirectoryIdentity> identity = IdentifyDirectory(top.get());
  DirectoryPlace place;
  if (identity && directories.Find(identity->handle, &place) != DirectoryLookup::Answer::kFound) {
    errno = EPERM;
    daemon::ThrowSystemError("Cannot use fanotify");
  }
}

}  // namespace

MoveReports ProbeFanotify() {
  // Both came with the same kernel: events of renames, and the handle of what an entry leads to.
  MoveReports reports = MoveReports::kRenames;
  UniqueFd group = MakeGroup(reports);
  if (!group.valid() && errno == EINVAL) {
    reports = MoveReports::kHalves;
    group = MakeGroup(reports);
  }
  if (!group.valid()) daemon::ThrowSystemError("Cannot use fanotify");
  RequireRights(group.get(), reports);
  return reports;
}

MarkedFileSystem::MarkedFileSystem(int directory, MoveReports reports)
    : device_(DeviceOf(directory)),
      fd_(MakeMarkedGroup(directory, reports)),
      directories_(device_),
      tree_(directories_),
      translator_(tree_),
      buffer_(kBufferSize),
      shows_marks_(ShowsMark()) {}

bool MarkedFileSystem::IsMarked() const {
  return !shows_marks_ || ShowsMark();
}

bool MarkedFileSystem::ShowsMark() const {
  std::ifstream info("/proc/self/fdinfo/" + std::to_string(fd_.get()));
  for (std::string line; std::getline(info, line);) {
    if (line.rfind("fanotify sdev:", 0) == 0) return true;
  }
  return false;
}

void MarkedFileSystem::AddRoot(const std::string& handle, const std::string& path) {
  directories_.AddEntrance(path);
  const bool is_added = tree_.AddRoot(handle, path);
  directories_.Release();
  if (is_added) return;
  directories_.RemoveEntrance(path);
  throw Error(kErrorSystem, "Its directories cannot be found by what the kernel calls them");
}

void MarkedFileSystem::RemoveRoot(const std::string& path) {
  directories_.RemoveEntrance(path);
  tree_.RemoveRoot(path);
}

void MarkedFileSystem::Finish(ChangeSink& sink) {
  Guarded([&] { translator_.Finish(sink); });
}

void MarkedFileSystem::Read(ChangeSink& sink) {
  Guarded([&] { TellAll(sink); });
}

void MarkedFileSystem::TellAll(ChangeSink& sink) {
  std::deque<Delivery> deliveries;
  std::size_t allowance = kAtATime;
  for (Fetch(&deliveries, &allowance, sink); !deliveries.empty(); deliveries.pop_front()) {
    translator_.Translate({deliveries.front().data(), deliveries.front().size()}, sink);
    Fetch(&deliveries, &allowance, sink);
  }
}

// What an exception has cut off may have been a rename.
void MarkedFileSystem::Guarded(const std::function<void()>& action) {
  try {
    action();
  } catch (...) {
    directories_.Release();
    tree_.Forget();
    throw;
  }
  directories_.Release();
}

// Takes what the kernel has, up to `allowance`, which is what is left of it afterwards.
void MarkedFileSystem::Fetch(std::deque<Delivery>* deliveries, std::size_t* allowance,
                             ChangeSink& sink) {
  while (*allowance > 0) {
    const ssize_t got = read(fd_.get(), buffer_.data(), buffer_.size());
    if (got < 0 && errno != EAGAIN && errno != EINTR) {
      tree_.Forget();
      for (const std::string& root : tree_.Roots()) sink.OnDoubt(root);
    }
    if (got <= 0) return;
    const auto size = static_cast<std::size_t>(got);
    deliveries->emplace_back(buffer_.begin(), buffer_.begin() + got);
    *allowance -= std::min(*allowance, size);
  }
}

}  // namespace quarry::notify
