// Two sources that share the work.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_COMBINED_SOURCE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_COMBINED_SOURCE_H_

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnotifyd/change_source.h"

namespace quarry::notify {

// One watches what it can, whole file systems for instance, and the other one the rest.
class CombinedSource : public ChangeSource {
 public:
  using Paths = std::vector<std::string>;

  // `left` says what `first` leaves to `second`, sorted; it is asked after SetDirectories() and
  // Refresh() of the first. Throws Error 502 on a system failure.
  CombinedSource(std::unique_ptr<ChangeSource> first, std::unique_ptr<ChangeSource> second,
                 std::function<Paths()> left);

  int Descriptor() const override { return poll_fd_.get(); }
  void SetDirectories(const std::vector<std::string>& directories,
                      const std::vector<std::string>& ignore, ChangeSink& sink) override;
  void Read(ChangeSink& sink) override;
  void Refresh(ChangeSink& sink) override;
  void Report(SourceReport* report) const override;

 private:
  void Share(ChangeSink& sink);

  std::unique_ptr<ChangeSource> first_;
  std::unique_ptr<ChangeSource> second_;
  std::function<Paths()> left_;
  UniqueFd poll_fd_;  // of both
  Paths ignore_;
  Paths told_;         // what the second one watches, and
  Paths told_ignore_;  // with which names
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_COMBINED_SOURCE_H_
