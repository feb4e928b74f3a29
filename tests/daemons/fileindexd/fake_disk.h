// A disk in memory, with symbolic links, mounts and unreadable places.

#ifndef QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_DISK_H_
#define QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_DISK_H_

#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "daemons/fileindexd/file_system.h"

namespace quarry::fileindexd {

// Changes behave as on a real file system: a new file has a new inode, every change moves its
// clock, a directory changes with its entries. Any thread.
class FakeDisk : public FileSystem {
 public:
  // Each makes missing directories above. A place that is there already is replaced or changed.
  void AddDir(const std::string& path);
  void WriteFile(const std::string& path);
  void AddOther(const std::string& path);
  // A directory that is the root of another file system, with whatever is added below it.
  void AddMount(const std::string& path);
  // What is there, and what lies below, cannot be told any more.
  void MakeUnreadable(const std::string& path);
  // A change of attributes alone.
  void Touch(const std::string& path);
  void Remove(const std::string& path);
  void Rename(const std::string& from, const std::string& to);

  // All places at and below `path`, in ascending order.
  std::vector<std::string> Tree(const std::string& path) const;
  bool Has(const std::string& path) const;

  Place Look(const std::string& base, const std::string& path) override;
  Place Peek(const std::string& path) override;
  PlaceKind List(const std::string& dir, std::vector<std::string>& names) override;
  Identity Identify(const std::string& dir) override;

 private:
  struct Node {
    PlaceKind kind = PlaceKind::kFile;
    unsigned long long inode = 0;
    unsigned long long size = 0;
    unsigned long long mtime = 0;
    unsigned long long ctime = 0;
  };

  Node& Put(const std::string& path, PlaceKind kind);
  void ChangeParent(const std::string& path);
  Place At(const std::string& path) const;
  bool Blocked(const std::string& base, const std::string& path, Place& place) const;

  mutable std::mutex mutex_;
  std::map<std::string, Node> nodes_;
  unsigned long long clock_ = 1000;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_DISK_H_
