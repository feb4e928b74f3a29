#include "daemons/tarnotifyd/combined_source.h"

#include <sys/epoll.h>

#include <utility>

#include "daemons/common/log.h"
#include "daemons/common/system_error.h"

namespace quarry::notify {
namespace {

bool Watch(int poll_fd, int fd) {
  epoll_event event{};
  event.events = EPOLLIN;
  return epoll_ctl(poll_fd, EPOLL_CTL_ADD, fd, &event) == 0;
}

}  // namespace

CombinedSource::CombinedSource(std::unique_ptr<FanotifySource> file_systems,
                               std::unique_ptr<ChangeSource> directories)
    : file_systems_(std::move(file_systems)),
      directories_(std::move(directories)),
      poll_fd_(epoll_create1(EPOLL_CLOEXEC)) {
  if (!poll_fd_.valid() || !Watch(poll_fd_.get(), file_systems_->Descriptor()) ||
      !Watch(poll_fd_.get(), directories_->Descriptor())) {
    daemon::ThrowSystemError("Cannot wait for changes");
  }
}

void CombinedSource::SetDirectories(const std::vector<std::string>& directories,
                                    const std::vector<std::string>& ignore, ChangeSink& sink) {
  file_systems_->SetDirectories(directories, ignore, sink);
  const bool same = std::exchange(ignore_, ignore) == ignore;
  if (same || unwatchable_.empty()) return FollowUnwatchable(sink);
  unwatchable_ = file_systems_->Unwatchable();
  directories_->SetDirectories(unwatchable_, ignore_, sink);
}

void CombinedSource::Read(ChangeSink& sink) {
  file_systems_->Read(sink);
  directories_->Read(sink);
}

void CombinedSource::Refresh(ChangeSink& sink) {
  file_systems_->Refresh(sink);
  FollowUnwatchable(sink);
  directories_->Refresh(sink);
}

void CombinedSource::FollowUnwatchable(ChangeSink& sink) {
  if (file_systems_->Unwatchable() == unwatchable_) return;
  unwatchable_ = file_systems_->Unwatchable();
  for (const std::string& path : unwatchable_) {
    daemon::LogInfo("The file system of " + path + " does not tell its changes to fanotify");
  }
  directories_->SetDirectories(unwatchable_, ignore_, sink);
}

}  // namespace quarry::notify
