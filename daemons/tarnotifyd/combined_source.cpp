#include "daemons/tarnotifyd/combined_source.h"

#include <sys/epoll.h>

#include <algorithm>
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

CombinedSource::CombinedSource(std::unique_ptr<ChangeSource> first,
                               std::unique_ptr<ChangeSource> second, std::function<Paths()> left)
    : first_(std::move(first)),
      second_(std::move(second)),
      left_(std::move(left)),
      poll_fd_(epoll_create1(EPOLL_CLOEXEC)) {
  if (!poll_fd_.valid() || !Watch(poll_fd_.get(), first_->Descriptor()) ||
      !Watch(poll_fd_.get(), second_->Descriptor())) {
    daemon::ThrowSystemError("Cannot wait for changes");
  }
}

void CombinedSource::SetDirectories(const Paths& directories, const Paths& ignore,
                                    ChangeSink& sink) {
  ignore_ = ignore;
  first_->SetDirectories(directories, ignore, sink);
  Share(sink);
}

void CombinedSource::Read(ChangeSink& sink) {
  first_->Read(sink);
  second_->Read(sink);
}

void CombinedSource::Refresh(ChangeSink& sink) {
  first_->Refresh(sink);
  Share(sink);
  second_->Refresh(sink);
}

void CombinedSource::Report(SourceReport* report) const {
  first_->Report(report);
  second_->Report(report);
}

void CombinedSource::Share(ChangeSink& sink) {
  Paths left = left_();
  if (left == told_ && ignore_ == told_ignore_) return;
  for (const std::string& path : left) {
    if (!std::binary_search(told_.begin(), told_.end(), path)) {
      daemon::LogInfo("Each directory below " + path + " is watched by itself");
    }
  }
  second_->SetDirectories(left, ignore_, sink);
  told_ = std::move(left);
  told_ignore_ = ignore_;
}

}  // namespace quarry::notify
