// Two sources that share the work.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_COMBINED_SOURCE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_COMBINED_SOURCE_H_

#include <memory>
#include <string>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnotifyd/change_source.h"
#include "daemons/tarnotifyd/fanotify_source.h"

namespace quarry::notify {

// Has whole file systems watched where they tell their changes, and directories where they do not.
class CombinedSource : public ChangeSource {
 public:
  // `directories` watches what `file_systems` cannot. Throws Error 502 on a system failure.
  CombinedSource(std::unique_ptr<FanotifySource> file_systems,
                 std::unique_ptr<ChangeSource> directories);

  int Descriptor() const override { return poll_fd_.get(); }
  void SetDirectories(const std::vector<std::string>& directories,
                      const std::vector<std::string>& ignore, ChangeSink& sink) override;
  void Read(ChangeSink& sink) override;
  void Refresh(ChangeSink& sink) override;

 private:
  void FollowUnwatchable(ChangeSink& sink);

  std::unique_ptr<FanotifySource> file_systems_;
  std::unique_ptr<ChangeSource> directories_;
  UniqueFd poll_fd_;                      // of both
  std::vector<std::string> unwatchable_;  // as the second one was told, and
  std::vector<std::string> ignore_;       // with which names
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_COMBINED_SOURCE_H_
