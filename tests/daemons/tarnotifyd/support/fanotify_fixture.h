// Tests of fanotify on real directories. Where this process may not use it, or the file system of
// the temporary directory does not take part, a test sees to it that the source says so.

#ifndef QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FANOTIFY_FIXTURE_H_
#define QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FANOTIFY_FIXTURE_H_

#include <gmock/gmock.h>
#include <poll.h>

#include <algorithm>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "daemons/tarnotifyd/fanotify_source.h"
#include "tests/daemons/tarnotifyd/support/disk_model.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::notify {

class FanotifyFixture : public testing::Test {
 protected:
  FanotifyFixture() {
    std::filesystem::create_directory(inside_);
    std::filesystem::create_directory(outside_);
  }

  // Whether there is a source that watches `directories`; if not, the reason was the documented
  // one.
  bool Start(const std::vector<std::string>& directories, ChangeSink& sink) {
    if (!MakeSource()) return false;
    source_->SetDirectories(directories, {"@eaDir"}, sink);
    if (source_->Unwatchable().empty()) return true;
    EXPECT_THAT(source_->Unwatchable(), testing::IsSubsetOf(directories));
    return false;
  }

  bool MakeSource() {
    try {
      source_ = std::make_unique<FanotifySource>();
      return true;
    } catch (const Error& error) {
      EXPECT_EQ(error.code(), kErrorSystem);
      EXPECT_EQ(error.reason().rfind("Cannot use fanotify: ", 0), 0U) << error.reason();
      return false;
    }
  }

  // Reads until everything up to now is told. Others may change the file system all the time, so
  // that there is no quiet to wait for: the last change is one of our own. When it may have been
  // lost there has to be another one.
  void ReadAll(test::DiskModel& model) {
    std::string last;
    int doubts = -1;
    EXPECT_TRUE(test::WaitUntil([&] {
      if (doubts != model.Doubts()) {
        doubts = model.Doubts();
        last = inside_ + "/last" + std::to_string(++last_);
        test::WriteFile(last, "");
      }
      pollfd polled{source_->Descriptor(), POLLIN, 0};
      if (poll(&polled, 1, 10) > 0) source_->Read(model);
      const std::vector<std::string>& told = model.Told();
      return std::find(told.rbegin(), told.rend(), "create file " + last) != told.rend();
    }));
  }

  test::TempDir scratch_;
  const std::string inside_ = scratch_ / "inside";
  const std::string outside_ = scratch_ / "outside";
  std::unique_ptr<FanotifySource> source_;

 private:
  int last_ = 0;
};

}  // namespace quarry::notify

#endif  // QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FANOTIFY_FIXTURE_H_
