// A source of changes that tests make up.

#ifndef QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FAKE_SOURCE_H_
#define QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FAKE_SOURCE_H_

#include <sys/eventfd.h>

#include <algorithm>
#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnotifyd/change_source.h"

namespace quarry::test {

// Tells what the test gives it.
class FakeSource : public notify::ChangeSource {
 public:
  using Names = std::vector<std::string>;

  FakeSource() : event_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

  int Descriptor() const override { return event_.get(); }
  void SetDirectories(const Names& directories, const Names& ignore,
                      notify::ChangeSink& sink) override {
    for (const std::string& directory : directories) {
      if (std::find(directories_.begin(), directories_.end(), directory) == directories_.end()) {
        sink.OnDoubt(directory);
      }
    }
    directories_ = directories;
    ignore_ = ignore;
  }
  void Read(notify::ChangeSink& sink) override {
    eventfd_t count = 0;
    eventfd_read(event_.get(), &count);
    const auto tell = std::exchange(tell_, {});
    if (tell) tell(sink);
  }
  void Refresh(notify::ChangeSink&) override { ++refreshed_; }
  void Report(notify::SourceReport* report) const override {
    report->kind = "fake";
    report->directories += directories_.size();
    report->unwatched.insert(unwatched_.begin(), unwatched_.end());
  }

  void Tell(const std::function<void(notify::ChangeSink&)>& tell) {
    tell_ = tell;
    eventfd_write(event_.get(), 1);
  }

  Names directories_;
  Names ignore_;
  std::map<std::string, std::string> unwatched_;
  int refreshed_ = 0;

 private:
  UniqueFd event_;
  std::function<void(notify::ChangeSink&)> tell_;
};

}  // namespace quarry::test

#endif  // QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FAKE_SOURCE_H_
