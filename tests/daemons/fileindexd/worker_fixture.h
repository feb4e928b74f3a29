// A worker in memory.

#ifndef QUARRY_TESTS_DAEMONS_FILEINDEXD_WORKER_FIXTURE_H_
#define QUARRY_TESTS_DAEMONS_FILEINDEXD_WORKER_FIXTURE_H_

#include <memory>
#include <string>
#include <vector>

#include "daemons/fileindexd/worker.h"
#include "tests/daemons/fileindexd/share_fixture.h"
#include "tests/daemons/fileindexd/shared_parts.h"

namespace quarry::fileindexd {

// A worker of the share "s" with one folder, to be stepped by the test.
class WorkerFixture : public ShareFixture {
 protected:
  WorkerFixture() {
    host_.SetFolders({Folder("/s")});
    worker_ = MakeWorker(host_, index_, disk_, slots_);
  }

  std::string State() const { return worker_->Report()["state"].asString(); }
  std::string LastError() const { return worker_->Report()["last_error"].asString(); }

  // The commands of one step, which must be a pass that ends well.
  std::vector<std::string> CommandsOfStep() {
    index_.ForgetCommands();
    worker_->Step();
    std::vector<std::string> commands = index_.Commands();
    if (!commands.empty()) commands.pop_back();
    return commands;
  }

  // Whether a step finds nothing to do.
  bool IsAtRest() {
    index_.ForgetCommands();
    worker_->Step();
    return index_.CallCount() == 0;
  }

  HostState host_{QueuePath()};
  std::unique_ptr<Worker> worker_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_TESTS_DAEMONS_FILEINDEXD_WORKER_FIXTURE_H_
