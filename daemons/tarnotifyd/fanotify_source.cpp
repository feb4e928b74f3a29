#include "daemons/tarnotifyd/fanotify_source.h"

#include <sys/epoll.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <set>
#include <string_view>
#include <utility>

#include "common/error.h"
#include "daemons/common/log.h"
#include "daemons/common/system_error.h"
#include "daemons/tarnotifyd/directory_scan.h"

namespace quarry::notify {
namespace {

// File systems that are read in one go.
constexpr int kReadAtOnce = 16;

bool IsBelow(const std::string& path, const std::string& directory) {
  if (directory == "/") return path.size() > 1;
  return path.size() > directory.size() && path[directory.size()] == '/' &&
         path.compare(0, directory.size(), directory) == 0;
}

}  // namespace

FanotifySource::FanotifySource(MoveReports reports)
    : reports_(reports), epoll_(epoll_create1(EPOLL_CLOEXEC)) {
  if (!epoll_.valid()) daemon::ThrowSystemError("Cannot wait for changes");
}

void FanotifySource::SetDirectories(const std::vector<std::string>& directories,
                                    const std::vector<std::string>& ignore, ChangeSink& sink) {
  directories_ = directories;
  ignore_ = ignore;
  for (MarkedFileSystem& file_system : file_systems_) file_system.tree().SetIgnored(ignore_);
  is_arranged_ = false;
  Arrange(sink);
}

void FanotifySource::Read(ChangeSink& sink) {
  std::array<epoll_event, kReadAtOnce> ready;
  const int count = epoll_wait(epoll_.get(), ready.data(), kReadAtOnce, 0);
  for (int i = 0; i < count; ++i) {
    static_cast<MarkedFileSystem*>(ready[static_cast<std::size_t>(i)].data.ptr)->Read(sink);
  }
}

void FanotifySource::Refresh(ChangeSink& sink) {
  for (MarkedFileSystem& file_system : file_systems_) file_system.Finish(sink);
  if (mounts_.HasChanged()) is_arranged_ = false;  // which it says only once
  if (!is_arranged_) return Arrange(sink);
  Check(sink);
}

void FanotifySource::Report(SourceReport* report) const {
  report->kind = "fanotify";
  report->file_systems += file_systems_.size();
}

// Brings the watches in line with what is to be watched.
void FanotifySource::Arrange(ChangeSink& sink) {
  // What a mount has covered, or shows now, has another place.
  for (MarkedFileSystem& file_system : file_systems_) file_system.tree().Forget();
  const std::vector<std::string> wanted = WantedPaths();
  std::set<std::string> missing(wanted.begin(), wanted.end());
  for (auto watch = watches_.begin(); watch != watches_.end();) {
    if (missing.erase(watch->path) > 0) {
      ++watch;
      continue;
    }
    Unbind(*watch);
    // Nothing is mounted there any more: what it covered is to be seen again.
    if (IsWanted(watch->path)) sink.OnDoubt(watch->path);
    watch = watches_.erase(watch);
  }
  for (const std::string& path : missing) {
    watches_.emplace_back();
    watches_.back().path = path;
  }
  is_arranged_ = true;
  Check(sink);
}

std::vector<std::string> FanotifySource::WantedPaths() {
  std::vector<std::string> paths = directories_;
  for (const Mount& mount : mounts_.Read()) {
    if (!IsKernelsOwn(mount.type) && IsWanted(mount.path)) paths.push_back(mount.path);
  }
  return paths;
}

// Whether a place below a watched directory is to be watched.
bool FanotifySource::IsWanted(const std::string& path) const {
  return std::any_of(directories_.begin(), directories_.end(), [&](const std::string& directory) {
    return IsBelow(path, directory) && !IsBelowIgnored(directory, path);
  });
}

bool FanotifySource::IsBelowIgnored(const std::string& directory, const std::string& path) const {
  std::string_view rest(path);
  rest.remove_prefix(directory == "/" ? 0 : directory.size());
  while (!rest.empty()) {
    rest.remove_prefix(1);
    const std::string_view name = rest.substr(0, rest.find('/'));
    if (std::find(ignore_.begin(), ignore_.end(), name) != ignore_.end()) return true;
    rest.remove_prefix(name.size());
  }
  return false;
}

void FanotifySource::Check(ChangeSink& sink) {
  DropUnmounted();
  for (Watch& watch : watches_) Check(watch, sink);
  DropUnused();
  ListUnwatchable();
}

void FanotifySource::Check(Watch& watch, ChangeSink& sink) {
  const UniqueFd fd = OpenDirectory(watch.path);
  const Finding finding = Look(fd.get());
  if (watch.finding == finding) return;
  Unbind(watch);
  watch.finding = finding;
  if (finding.exists) Bind(watch, fd.get());
  if (watch.was_lost || watch.file_system != nullptr) sink.OnDoubt(watch.path);
  watch.was_lost = false;
}

FanotifySource::Finding FanotifySource::Look(int directory) const {
  struct stat status {};
  if (directory < 0 || fstat(directory, &status) != 0) return Finding{};
  const std::optional<DirectoryIdentity> identity = IdentifyDirectory(directory);
  return {true, status.st_dev, status.st_ino, identity ? identity->handle : std::string()};
}

void FanotifySource::Bind(Watch& watch, int directory) {
  try {
    if (watch.finding->handle.empty()) {
      throw Error(kErrorSystem, "Its file system does not number its directories");
    }
    MarkedFileSystem& file_system = FileSystemOf(directory, watch.finding->device);
    file_system.AddRoot(watch.finding->handle, watch.path);
    watch.file_system = &file_system;
  } catch (const Error& error) {
    daemon::LogWarning("Cannot watch " + watch.path + " as a whole: " + error.reason());
  }
}

void FanotifySource::Unbind(Watch& watch) {
  watch.finding.reset();
  if (watch.file_system == nullptr) return;
  watch.file_system->RemoveRoot(watch.path);
  watch.file_system = nullptr;
  watch.was_lost = true;
}

MarkedFileSystem& FanotifySource::FileSystemOf(int directory, dev_t device) {
  for (MarkedFileSystem& file_system : file_systems_) {
    if (file_system.device() == device) return file_system;
  }
  MarkedFileSystem& added = file_systems_.emplace_back(directory, reports_);
  added.tree().SetIgnored(ignore_);
  epoll_event event{};
  event.events = EPOLLIN;
  event.data.ptr = &added;
  if (epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, added.Descriptor(), &event) != 0) {
    file_systems_.pop_back();
    daemon::ThrowSystemError("Cannot wait for changes");
  }
  return added;
}

// An unmounted file system that is back has its old number, but not its mark.
void FanotifySource::DropUnmounted() {
  for (Watch& watch : watches_) {
    if (watch.file_system != nullptr && !watch.file_system->IsMarked()) Unbind(watch);
  }
  DropUnused();
}

void FanotifySource::DropUnused() {
  file_systems_.remove_if([](const MarkedFileSystem& each) { return each.IsUnused(); });
}

void FanotifySource::ListUnwatchable() {
  unwatchable_.clear();
  for (const Watch& watch : watches_) {
    if (watch.finding && watch.finding->exists && watch.file_system == nullptr)
      unwatchable_.push_back(watch.path);
  }
  std::sort(unwatchable_.begin(), unwatchable_.end());
}

}  // namespace quarry::notify
