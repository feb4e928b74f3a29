// A share in memory: disk, index, folder list, and a queue file to run passes over.

#ifndef QUARRY_TESTS_DAEMONS_FILEINDEXD_SHARE_FIXTURE_H_
#define QUARRY_TESTS_DAEMONS_FILEINDEXD_SHARE_FIXTURE_H_

#include <gtest/gtest.h>

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "daemons/fileindexd/gate.h"
#include "daemons/fileindexd/pass.h"
#include "daemons/fileindexd/progress.h"
#include "daemons/fileindexd/slots.h"
#include "daemons/fileindexd/survey.h"
#include "fileindex/queue/event.h"
#include "tests/daemons/fileindexd/fake_disk.h"
#include "tests/daemons/fileindexd/fake_index.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {

inline constexpr char kRoot[] = "/v/s";

// A folder of the share "s" at /v/s that wants every kind.
FolderRule Folder(const std::string& path);
// One that wants documents only.
FolderRule DocumentFolder(const std::string& path);
FolderRule PausedFolder(const std::string& path);

// Makes a share of the running platform known: a directory that ends in its name.
void RegisterShare(const std::string& path);

class ShareFixture : public ::testing::Test {
 protected:
  ShareFixture();

  void SetFolders(const std::vector<FolderRule>& folders);

  // Appends a line to the queue.
  void Queue(unsigned int event, const std::string& path, bool is_dir = false,
             const std::string& old_path = "");
  std::string QueuePath() const { return dir_ / "queue"; }
  bool HasSnapshot() const;
  bool HasQueue() const;

  PassResult Run(bool full = false);
  // The commands of one pass, without the commit at its end, which must be there.
  std::vector<std::string> CommandsOf(bool full = false);

  // What a slow and simple look at the disk says that the index should hold, places of paused
  // folders left out.
  FakeIndex::Documents Expected() const;
  // Fails the test unless the index is as expected, places of paused folders left out.
  void ExpectInLine() const;

  FakeDisk disk_;
  FakeIndex index_{disk_};
  Gate gate_;
  Slots slots_{4};
  Progress progress_{"s"};
  SetAside aside_;
  std::set<std::string> bins_;  // recycle bins
  Survey survey_;
  std::size_t threads_ = 1;  // one after the other, so that commands have an order

 private:
  bool IsWanted(const std::string& path) const;
  bool InBin(const std::string& path) const;

  test::TempDir dir_;
  std::shared_ptr<const FolderRules> rules_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_TESTS_DAEMONS_FILEINDEXD_SHARE_FIXTURE_H_
